#pragma once

#include <functional>
#include <memory>
#include <string>

struct sqlite3;

namespace orva::db {

class Connection;
class DatabaseFiles;
class DatabaseVfs;

/// A connection to one SQLite database file. Used by one thread at a time. Statements and
/// transactions on it end before it is closed, opened again or destroyed.
///
/// Failures of this layer are thrown as std::string: the caller's file and line, SQLite's
/// message and extended code, and the SQL.
class DB {
public:
  DB();
  DB(const DB&) = delete;
  DB& operator=(const DB&) = delete;
  /// Closes the connection.
  virtual ~DB();

  /// A text that identifies the database; empty here.
  virtual std::string GetPrefix() const;

  /// Publishes a status; does nothing here.
  virtual void UpdateStatus(const std::string& key, const std::string& value) const;

  /// Opens the file at `path` for reading and writing and creates it when there is none. A
  /// connection that is already open is closed first. The file is untrusted: links are not
  /// followed, anything other than a regular file is refused, its triggers, views and checks do
  /// not run, and a statement that works out of proportion to the file's size fails. Throws
  /// std::string.
  void Open(const std::string& path);

  /// Closes the connection; harmless when closed.
  void Close();

  /// Path of the open file; empty while closed.
  const std::string& GetPath() const noexcept { return path_; }

  /// The open connection, for Statement and Transaction; still owned by this object. While closed
  /// throws std::string with the caller's `file` and `line` and the statement `sql`.
  Connection& OpenConnection(const char* sql, const char* file, unsigned int line) const;

  /// Bytes that were read so far from the open database and its write-ahead log, each part counted
  /// once.
  long long BytesRead() const noexcept;

  /// Row id of the last row inserted.
  long long LastInsertId() const noexcept;

  /// Whether a transaction is open on the connection.
  bool IsInTransaction() const noexcept;

  /// Makes sure that the values in `table` are those that were stored there: refuses generated
  /// columns and, where the connection can write, computed defaults, indexes on expressions or on
  /// part of the rows, and too many indexes. In an untrusted database these may be so expensive
  /// that inserting a row takes minutes. A missing table is accepted. Throws std::string.
  void RejectComputedColumns(const std::string& table) const;

protected:
  /// What a connection may do with its file.
  enum class Access { ReadWrite, ReadOnly };

  /// Makes the database file at `path`, where there is none: `build` fills it through this
  /// object, which is open meanwhile and closed afterwards. After a crash at any moment there is
  /// either no file at `path` or the whole database. Throws std::string, or what `build` throws.
  void Create(const std::string& path, const std::function<void()>& build);

  /// Open for derived classes: `busyTimeout` is in milliseconds; `immutable` promises that
  /// the file does not change: SQLite then neither locks it nor checks it for changes. Only
  /// ReadWrite creates.
  void Open(std::string path, Access access, int busyTimeout, bool immutable);

  /// Has every transaction on the open connection call `check` before it commits. What that throws
  /// keeps the transaction from committing.
  void CheckBeforeCommit(std::function<void()> check) const;

  /// The files of the open database.
  const DatabaseFiles& Files() const noexcept;

  /// The open connection, null while closed; still owned by this object.
  sqlite3* Handle() const noexcept { return handle_; }

private:
  std::unique_ptr<DatabaseVfs> vfs_; ///< null while closed
  sqlite3* handle_ = nullptr;        ///< owned; released by Close
  std::string path_;
  std::unique_ptr<Connection> connection_; ///< what belongs to the open handle; null while closed
};

} // namespace orva::db

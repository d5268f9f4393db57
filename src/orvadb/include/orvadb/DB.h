#pragma once

#include <functional>
#include <memory>
#include <string>

struct sqlite3;

namespace orva::db {

class Connection;

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

  /// A text that stands for the database; empty here.
  virtual std::string GetPrefix() const;

  /// Told of a status to publish; does nothing here.
  virtual void UpdateStatus(const std::string& key, const std::string& value) const;

  /// Opens the file at `path` for reading and writing and creates it when there is none. A
  /// connection that is already open is closed first. The file may be a stranger's: links are
  /// not followed, anything other than a regular file is refused, its triggers, views and checks
  /// do not run, and a statement that works out of proportion to its size fails. Throws
  /// std::string.
  void Open(const std::string& path);

  /// Closes the connection; harmless when closed.
  void Close();

  /// Path of the open file; empty while closed.
  const std::string& GetPath() const noexcept { return path_; }

  /// Bytes of the open database with its log; its holes count for little. Statements may work as
  /// much as that is worth from now on: a file that was waited for may have grown since it was
  /// opened. Throws std::string.
  long long MeasureFile() const;

  /// Makes sure that the values in `table` are those that were stored there: refuses generated
  /// columns and, where the connection can write, computed defaults, indices on expressions or on
  /// part of the rows, and very many indices, which a stranger may have made so dear that a row
  /// takes minutes. A table that is not there has none. Throws std::string.
  void RejectComputedColumns(const std::string& table) const;

protected:
  /// What a connection may do with its file.
  enum class Access { ReadWrite, ReadOnly };

  /// Makes the database file at `path`, where there is none: `build` fills it through this
  /// object, which is open meanwhile and closed afterwards. At every instant, whatever stops,
  /// there is either nothing at `path` or all of it. Throws std::string, or what `build` throws.
  void Create(const std::string& path, const std::function<void()>& build);

  /// Open for derived classes: `busyTimeout` is in milliseconds; `immutable` promises that
  /// nobody writes the file, which then is neither locked nor watched. Only ReadWrite creates.
  void Open(std::string path, Access access, int busyTimeout, bool immutable);

  /// Number of the transaction that runs on the open connection, for what is known only as long
  /// as it lasts; 0 while there is none, and never the same for two.
  unsigned long long RunningTransaction() const noexcept;

  /// Makes an index in the running transaction, by `create`, and has it removed before the commit,
  /// by `drop`, so that no other connection ever sees it. Both texts are literals. Throws
  /// std::string with the caller's `file` and `line`.
  void CreateTransientIndex(const char* create, const char* drop, const char* file,
                            unsigned int line) const;

  /// Row id of the last row inserted.
  long long LastInsertId() const noexcept;

  /// The open connection, null while closed; still owned by this object.
  sqlite3* Handle() const noexcept { return handle_; }

private:
  friend class Statement;
  friend class Transaction;

  sqlite3* handle_ = nullptr; ///< owned; released by Close
  std::string path_;
  std::unique_ptr<Connection> connection_; ///< what belongs to the open handle; null while closed
};

} // namespace orva::db

#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

struct sqlite3;
struct sqlite3_stmt;

namespace orva::db {

class DatabaseVfs;
class MemoryTable;
class Rows;
class WorkLimit;

/// Finalises a compiled statement.
struct StatementFinalizer {
  void operator()(sqlite3_stmt* statement) const noexcept;
};

/// What a DB keeps for as long as its handle is open: the compiled statements and the running
/// transaction. Belongs to the DB; used on its thread. Failures are thrown as std::string with the
/// caller's `file` and `line`.
///
/// A statement in use is not in the cache: a second one with the same text is compiled. When its
/// use ends, it is reset, its bindings are cleared, it holds no lock, and it returns to the cache.
///
/// A statement from the cache behaves as one that is compiled for its use. SQLite compiles with the
/// schema in memory. That changes with the connection's own changes and rollbacks, and when SQLite
/// loads it again because another program has changed the file. A statement that was compiled
/// before such a change is not used again.
class Connection {
public:
  using Compiled = std::unique_ptr<sqlite3_stmt, StatementFinalizer>;

  /// The place of a text in the cache.
  struct Kept {
    Compiled statement;            ///< null while in use
    unsigned long long schema = 0; ///< value of schema_ when it was compiled
    bool mayChangeSchema = false;
  };

  /// Returns the statement to the cache. If another one with the same text was returned earlier, it
  /// is replaced.
  struct CheckIn {
    Kept* place = nullptr; ///< belongs to the connection and lives as long
    unsigned long long schema = 0;
    void operator()(sqlite3_stmt* statement) const noexcept;
  };
  using CheckedOut = std::unique_ptr<sqlite3_stmt, CheckIn>;

  /// Belongs to `handle`, which it does not own and which was opened through `vfs`. `busyTimeout`
  /// is how long, in milliseconds, statements outside of transactions wait for other connections.
  Connection(sqlite3* handle, int busyTimeout, const DatabaseVfs& vfs);
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;
  ~Connection();

  bool IsReadOnly() const noexcept;

  /// Hands out the compiled form of `sql`; compiles it if the cache has none free. Throws
  /// also when SQLite has rolled back the running transaction.
  CheckedOut CheckOut(const char* sql, const char* file, unsigned int line);

  /// The same for a statement that reads `rows` as the table temp.input. Until it is returned, no
  /// other one is handed out.
  CheckedOut CheckOut(const char* sql, Rows& rows, const char* file, unsigned int line);

  /// Runs a statement to the next row or its end and returns SQLite's result code. After a failure
  /// the running transaction cannot be committed; if it only reads, its statements fail without
  /// reading any more.
  int Step(const CheckedOut& statement, const char* file, unsigned int line);

  /// Has every transaction call `check` before it commits. What that throws keeps the transaction
  /// from committing.
  void CheckBeforeCommit(std::function<void()> check) { checkBeforeCommit_ = std::move(check); }

  /// Begins a transaction, as a writer where the connection can write. Its statements wait
  /// `busyTimeout` milliseconds for other connections.
  void BeginTransaction(unsigned int busyTimeout, const char* file, unsigned int line);

  /// Whether the running transaction only reads and a step of it has failed.
  bool HasFailedToRead() const noexcept {
    return !failedStep_.empty() && inTransaction_ && IsReadOnly();
  }

  /// Commits the running transaction, which otherwise keeps running.
  void CommitTransaction(const char* file, unsigned int line);

  /// Rolls back the running transaction.
  void RollBackTransaction() noexcept;

private:
  /// Looks a text up without making a string of it.
  struct TextHash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const noexcept {
      return std::hash<std::string_view>{}(text);
    }
  };

  CheckedOut CheckOut(const char* sql, unsigned flags, const char* file, unsigned int line);
  Compiled Compile(const char* sql, unsigned flags, const char* file, unsigned int line);
  void Execute(const CheckedOut& statement, const char* file, unsigned int line);
  void EndTransaction() noexcept;

  sqlite3* handle_;
  int busyTimeout_;
  std::unique_ptr<WorkLimit> workLimit_;
  std::unique_ptr<MemoryTable> memoryTable_; ///< null until it is first used
  std::function<void()> checkBeforeCommit_;  ///< may be empty
  /// By SQL text; there are few, because values are never part of a text.
  std::unordered_map<std::string, Kept, TextHash, std::equal_to<>> statements_;
  unsigned long long schema_ = 0; ///< counts the possible changes of the schema in memory

  bool inTransaction_ = false;
  std::string failedStep_; ///< message of the transaction's first failure; may be empty
};

} // namespace orva::db

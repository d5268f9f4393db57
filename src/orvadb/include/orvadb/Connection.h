#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

struct sqlite3;
struct sqlite3_stmt;

namespace orva::db {

class WorkLimit;

/// Finalises a compiled statement.
struct StatementFinalizer {
  void operator()(sqlite3_stmt* statement) const noexcept;
};

/// What a DB keeps beside its handle for as long as that is open: its compiled statements, and
/// what its running transaction has to remember. Belongs to the DB; used on its thread.
///
/// A statement in use is checked out, so that a second one with the same text is compiled anew;
/// used ones come back reset, without bindings and without a lock.
class Connection {
public:
  using Compiled = std::unique_ptr<sqlite3_stmt, StatementFinalizer>;

  /// Ends a use: puts the statement back into its place, instead of another that came first.
  struct CheckIn {
    Compiled* place = nullptr; ///< belongs to the connection and lives as long
    void operator()(sqlite3_stmt* statement) const noexcept;
  };
  using CheckedOut = std::unique_ptr<sqlite3_stmt, CheckIn>;

  /// Belongs to `handle`, which it does not own, on a database of `bytes` bytes.
  Connection(sqlite3* handle, int busyTimeout, long long bytes);
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;
  ~Connection();

  /// Hands out the compiled form of `sql`; compiles it when none is kept or it is in use. Throws
  /// std::string with `file` and `line`.
  CheckedOut CheckOut(const char* sql, const char* file, unsigned line);

  /// Busy time-out of the connection in milliseconds, while no transaction has its own.
  int BusyTimeout() const noexcept { return busyTimeout_; }

  /// The database turned out to have `bytes` bytes.
  void SetFileSize(long long bytes) noexcept;

  /// First failed step since the running transaction began, as a message; empty when none.
  std::string failedStep;

  /// Number of the running transaction; 0 while there is none. A number stands for one
  /// transaction only.
  unsigned long long transaction = 0;

  /// Statements that the running transaction executes before it commits.
  std::vector<const char*> beforeCommit;

  /// The number for a transaction that begins.
  unsigned long long NextTransaction() noexcept { return ++transactions_; }

private:
  /// Lets a text be looked up without making a string of it.
  struct TextHash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const noexcept {
      return std::hash<std::string_view>{}(text);
    }
  };

  Compiled Compile(const char* sql, const char* file, unsigned line) const;

  sqlite3* handle_;
  int busyTimeout_;
  std::unique_ptr<WorkLimit> workLimit_;
  unsigned long long transactions_ = 0;
  /// By text, which every caller writes in full, so that they are few; null while in use.
  std::unordered_map<std::string, Compiled, TextHash, std::equal_to<>> statements_;
};

/// The message of the last failure on `handle`: "file:line: SQLite's message (extended code
/// N) in sql". A null handle is one that there was no memory for.
std::string ErrorMessage(sqlite3* handle, const char* sql, const char* file, unsigned line);

} // namespace orva::db

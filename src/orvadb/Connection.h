#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

struct sqlite3;
struct sqlite3_stmt;

namespace orva::db {

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
  /// Keyed by the text that SQLite keeps with the statement.
  using Statements = std::unordered_map<std::string_view, Compiled>;

  /// Statements kept at the most; the daemon has about thirty texts.
  static constexpr std::size_t MAXIMUM_STATEMENTS = 64;

  Connection(sqlite3* handle, int busyTimeout) noexcept
      : handle_(handle), busyTimeout_(busyTimeout) {}
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;
  ~Connection() = default;

  /// Hands out the compiled form of `sql`; compiles it when none is kept. Throws std::string
  /// with `file` and `line`.
  Statements::node_type CheckOut(const char* sql, const char* file, unsigned line);

  /// Takes a statement back.
  void CheckIn(Statements::node_type statement) noexcept;

  /// Busy time-out of the connection in milliseconds, while no transaction has its own.
  int BusyTimeout() const noexcept { return busyTimeout_; }

  /// First failed step since the running transaction began, as a message; empty when none.
  std::string failedStep;

private:
  sqlite3* handle_;
  int busyTimeout_;
  Statements idle_;
};

/// The message of a failure on `handle`: "file:line: SQLite's message (extended code), in sql".
std::string ErrorMessage(sqlite3* handle, const char* sql, const char* file, unsigned line);

} // namespace orva::db

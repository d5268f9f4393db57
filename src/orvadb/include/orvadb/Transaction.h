#pragma once

namespace orva::db {

class Connection;
class DB;

/// A transaction as a scope: what was not committed when it ends is rolled back. On the
/// connection's thread; one at a time on a connection. Where the connection can only read, it
/// is one consistent view of the database, from the first read to the end.
class Transaction {
public:
  /// Begins on `db`, which stays open, and is not opened again, until the transaction is destroyed.
  /// Begins at once as a writer where the connection can write. `busyTimeout` is how long, in
  /// milliseconds, the transaction's statements wait for other connections. Throws std::string with
  /// the caller's `file` and `line`.
  Transaction(const DB& db, unsigned int busyTimeout, const char* file = __builtin_FILE(),
              unsigned int line = __builtin_LINE());
  Transaction(const Transaction&) = delete;
  Transaction& operator=(const Transaction&) = delete;
  /// Rolls back unless committed.
  ~Transaction();

  /// Makes the changes permanent. Throws std::string, and has changed nothing, when that fails or
  /// when a step of a statement has failed since the beginning: what was read or written may
  /// then be incomplete.
  void Commit(const char* file = __builtin_FILE(), unsigned int line = __builtin_LINE());

private:
  Connection& connection_;
  bool open_ = true;
};

} // namespace orva::db

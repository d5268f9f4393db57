#pragma once

struct sqlite3;

namespace orva::db {

/// Interrupts a statement when it works more than a database of its size can need: when the file
/// was crafted so that a few pages make endless rows. Installs itself in a connection, and lives
/// as long. On the connection's thread.
class WorkLimit {
public:
  /// For the connection `handle` to a database of `bytes` bytes.
  WorkLimit(sqlite3* handle, long long bytes) noexcept;
  WorkLimit(const WorkLimit&) = delete;
  WorkLimit& operator=(const WorkLimit&) = delete;
  ~WorkLimit();

  void SetFileSize(long long bytes) noexcept { bytes_ = bytes; }

  /// A statement begins.
  void Restart() noexcept;

private:
  static int IsExceeded(void* self) noexcept;

  sqlite3* handle_;
  long long bytes_;
  long long work_ = 0; ///< of the statement so far
};

} // namespace orva::db

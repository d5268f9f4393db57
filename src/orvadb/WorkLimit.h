#pragma once

struct sqlite3;

namespace orva::db {

/// Interrupts a statement that works more than a database of its size can need: in a crafted file a
/// few pages may make endless rows. Installs itself in a connection for as long as it lives. On the
/// connection's thread.
class WorkLimit {
public:
  /// For the connection `handle` to a database of `bytes` bytes.
  WorkLimit(sqlite3* handle, long long bytes) noexcept;
  WorkLimit(const WorkLimit&) = delete;
  WorkLimit& operator=(const WorkLimit&) = delete;
  ~WorkLimit();

  void SetFileSize(long long bytes) noexcept { bytes_ = bytes; }

  /// A statement begins: counts its work from zero.
  void Restart() noexcept;

private:
  static int IsExceeded(void* self) noexcept;

  sqlite3* handle_;
  long long bytes_;
  long long work_ = 0; ///< of the current statement so far
};

} // namespace orva::db

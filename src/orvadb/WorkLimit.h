#pragma once

struct sqlite3;

namespace orva::db {

/// Interrupts a statement that works more than the content can need that was read from the
/// database's files: in a crafted file a few pages may make endless rows. What the file system says
/// about the files can only lower the limit. Installs itself in a connection for as long as it
/// lives. On the connection's thread.
class WorkLimit {
public:
  /// For the connection `handle`.
  explicit WorkLimit(sqlite3* handle) noexcept;
  WorkLimit(const WorkLimit&) = delete;
  WorkLimit& operator=(const WorkLimit&) = delete;
  ~WorkLimit();

  /// A statement begins: counts its work from zero.
  void Restart() noexcept;

  /// Bytes that the connection has read from the files, at most those that there are.
  long long BytesRead() noexcept;

private:
  static int IsExceeded(void* self) noexcept;

  void CountPages() noexcept;
  bool TakesTooLong() noexcept;

  sqlite3* handle_;
  long long work_ = 0;      ///< of the current statement so far
  long long pagesRead_ = 0; ///< by all statements
  /// Processor time of the thread when the statement had done the least work that is limited, in
  /// seconds; negative before.
  long long begin_ = -1;
};

} // namespace orva::db

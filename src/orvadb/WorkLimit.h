#pragma once

struct sqlite3;

namespace orva::db {

class DatabaseVfs;

/// Interrupts a statement that works more than the content can need that was read from the
/// database's files: in a crafted file a few pages may make endless rows. What the file system says
/// about the files does not matter. Installs itself in a connection for as long as it lives. On the
/// connection's thread.
class WorkLimit {
public:
  /// For the connection `handle`, which was opened through `vfs`.
  WorkLimit(sqlite3* handle, const DatabaseVfs& vfs) noexcept;
  WorkLimit(const WorkLimit&) = delete;
  WorkLimit& operator=(const WorkLimit&) = delete;
  ~WorkLimit();

  /// A statement begins: counts the work from zero, also for statements that are still in use.
  void Restart() noexcept;

  /// The statement was given one more row of ours: allows it the work for that.
  void AllowForRow() noexcept { ++givenRows_; }

private:
  static int IsExceeded(void* self) noexcept;

  void CountPages() noexcept;
  bool TakesTooLong() noexcept;

  sqlite3* handle_;
  const DatabaseVfs& vfs_;
  long long work_ = 0;       ///< of the current statement so far
  long long givenRows_ = 0;  ///< to the current statement
  unsigned cachedPages_ = 0; ///< requests for pages that the cache had, by all statements
  unsigned readPages_ = 0;   ///< the same for pages that it had not
  /// Processor time of the thread when the statement exceeded LEAST_LIMIT, in seconds; -1 before.
  long long begin_ = -1;
  long long lastLook_ = -1; ///< second in which that was looked at last
};

} // namespace orva::db

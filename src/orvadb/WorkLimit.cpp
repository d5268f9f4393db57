#include "WorkLimit.h"

#include "DatabaseVfs.h"

#include <sqlite3.h>

#include <ctime>

namespace orva::db {

namespace {

// Work is counted in steps of SQLite's virtual machine; a page of the cache counts as some of them,
// a page of the file as more. The limits are ten times what our statements need.
constexpr int STEPS_PER_CHECK = 1'000;
constexpr long long CACHED_PAGE_COST = 20;
constexpr long long FILE_PAGE_COST = 200;
constexpr long long LEAST_LIMIT = 10'000'000;
constexpr long long LIMIT_PER_BYTE = 20;
/// Changed rows may not be in the file yet. Those of a running statement are not counted as
/// changed, but as given.
constexpr long long LIMIT_PER_CHANGED_ROW = 2'000;

/// Processor time of a statement that only reads. On a million files it needs about one second.
constexpr long long MOST_SECONDS = 60;

/// A count of SQLite's, from the beginning of the connection.
unsigned CountOf(sqlite3* handle, int counter) noexcept {
  int current = 0;
  int highest = 0;
  sqlite3_db_status(handle, counter, &current, &highest, 0);
  return static_cast<unsigned>(current); // counts beyond the range of int wrap around
}

long long Seconds(clockid_t clock) noexcept {
  timespec now{};
  clock_gettime(clock, &now);
  return now.tv_sec;
}

} // namespace

WorkLimit::WorkLimit(sqlite3* handle, const DatabaseVfs& vfs) noexcept
    : handle_(handle), vfs_(vfs) {
  sqlite3_progress_handler(handle_, STEPS_PER_CHECK, &IsExceeded, this);
}

WorkLimit::~WorkLimit() {
  sqlite3_progress_handler(handle_, 0, nullptr, nullptr);
}

void WorkLimit::Restart() noexcept {
  work_ = 0;
  givenRows_ = 0;
  begin_ = -1;
  lastLook_ = -1;
}

void WorkLimit::CountPages() noexcept {
  const unsigned cached = CountOf(handle_, SQLITE_DBSTATUS_CACHE_HIT);
  const unsigned read = CountOf(handle_, SQLITE_DBSTATUS_CACHE_MISS);
  work_ += (cached - cachedPages_) * CACHED_PAGE_COST + (read - readPages_) * FILE_PAGE_COST;
  cachedPages_ = cached;
  readPages_ = read;
}

bool WorkLimit::TakesTooLong() noexcept {
  // The processor time is a system call, this clock is none.
  const long long second = Seconds(CLOCK_MONOTONIC_COARSE);
  if (second == lastLook_) {
    return false;
  }
  lastLook_ = second;
  const long long now = Seconds(CLOCK_THREAD_CPUTIME_ID);
  if (begin_ == -1) {
    begin_ = now;
  }
  // Statements that write change as many rows as there are.
  return now - begin_ > MOST_SECONDS && sqlite3_db_readonly(handle_, "main") == 1;
}

int WorkLimit::IsExceeded(void* self) noexcept {
  WorkLimit& limit = *static_cast<WorkLimit*>(self);
  limit.work_ += STEPS_PER_CHECK;
  limit.CountPages();
  if (limit.work_ <= LEAST_LIMIT) {
    return 0;
  }
  const bool exceeded =
      limit.work_ >
      LEAST_LIMIT + limit.vfs_.BytesRead() * LIMIT_PER_BYTE +
          (sqlite3_total_changes64(limit.handle_) + limit.givenRows_) * LIMIT_PER_CHANGED_ROW;
  return exceeded || limit.TakesTooLong() ? 1 : 0;
}

} // namespace orva::db

#include "WorkLimit.h"

#include <sqlite3.h>

#include <initializer_list>

namespace orva::db {

namespace {

// Work is counted in steps of SQLite's virtual machine; a page fetched counts as some of them. The
// limits are ten times what our statements need.
constexpr int STEPS_PER_CHECK = 1'000;
constexpr long long PAGE_COST = 20;
constexpr long long LEAST_LIMIT = 10'000'000;
constexpr long long LIMIT_PER_BYTE = 20;
/// Changed rows may not be in the file yet.
constexpr long long LIMIT_PER_CHANGED_ROW = 2'000;

/// Pages fetched since the last call.
long long TakeFetches(sqlite3* handle) noexcept {
  long long fetches = 0;
  for (const int counter : {SQLITE_DBSTATUS_CACHE_HIT, SQLITE_DBSTATUS_CACHE_MISS}) {
    int current = 0;
    int highest = 0;
    sqlite3_db_status(handle, counter, &current, &highest, 1);
    fetches += current;
  }
  return fetches;
}

} // namespace

WorkLimit::WorkLimit(sqlite3* handle, long long bytes) noexcept : handle_(handle), bytes_(bytes) {
  sqlite3_progress_handler(handle_, STEPS_PER_CHECK, &IsExceeded, this);
}

WorkLimit::~WorkLimit() {
  sqlite3_progress_handler(handle_, 0, nullptr, nullptr);
}

void WorkLimit::Restart() noexcept {
  work_ = 0;
}

int WorkLimit::IsExceeded(void* self) noexcept {
  WorkLimit& limit = *static_cast<WorkLimit*>(self);
  limit.work_ += STEPS_PER_CHECK + TakeFetches(limit.handle_) * PAGE_COST;
  if (limit.work_ <= LEAST_LIMIT) {
    return 0;
  }
  return limit.work_ > LEAST_LIMIT + limit.bytes_ * LIMIT_PER_BYTE +
                           sqlite3_total_changes64(limit.handle_) * LIMIT_PER_CHANGED_ROW
             ? 1
             : 0;
}

} // namespace orva::db

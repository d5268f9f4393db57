#include "WorkLimit.h"

#include <sqlite3.h>

#include <algorithm>
#include <array>
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
/// Changed rows may not be in the file yet.
constexpr long long LIMIT_PER_CHANGED_ROW = 2'000;

/// Seconds of processor time. A statement on a million files needs about one.
constexpr long long LONGEST = 60;

int TakeCount(sqlite3* handle, int counter) noexcept {
  int current = 0;
  int highest = 0;
  sqlite3_db_status(handle, counter, &current, &highest, 1);
  return current;
}

/// A file that SQLite has open; null when there is none.
sqlite3_file* FileOf(sqlite3* handle, int which) noexcept {
  sqlite3_file* file = nullptr;
  sqlite3_file_control(handle, "main", which, &file);
  return file != nullptr && file->pMethods != nullptr ? file : nullptr;
}

long long SizeOf(sqlite3_file* file) noexcept {
  sqlite3_int64 size = 0;
  return file != nullptr && file->pMethods->xFileSize(file, &size) == SQLITE_OK ? size : 0;
}

/// The page size in a database's header, where 1 stands for the largest.
long long PageSize(sqlite3_file* file) noexcept {
  constexpr sqlite3_int64 offset = 16;
  constexpr unsigned largest = 65'536;
  std::array<unsigned char, 2> bytes{};
  if (file == nullptr ||
      file->pMethods->xRead(file, bytes.data(), bytes.size(), offset) != SQLITE_OK) {
    return 0;
  }
  const unsigned size = bytes[0] * 256U + bytes[1];
  return size == 1 ? largest : size;
}

long long ProcessorSeconds() noexcept {
  timespec now{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
  return now.tv_sec;
}

} // namespace

WorkLimit::WorkLimit(sqlite3* handle) noexcept : handle_(handle) {
  sqlite3_progress_handler(handle_, STEPS_PER_CHECK, &IsExceeded, this);
}

WorkLimit::~WorkLimit() {
  sqlite3_progress_handler(handle_, 0, nullptr, nullptr);
}

void WorkLimit::Restart() noexcept {
  work_ = 0;
  begin_ = -1;
}

long long WorkLimit::BytesRead() noexcept {
  CountPages();
  // Pages that did not fit into the cache were read several times.
  sqlite3_file* const database = FileOf(handle_, SQLITE_FCNTL_FILE_POINTER);
  return std::min(pagesRead_ * PageSize(database),
                  SizeOf(database) + SizeOf(FileOf(handle_, SQLITE_FCNTL_JOURNAL_POINTER)));
}

void WorkLimit::CountPages() noexcept {
  const int read = TakeCount(handle_, SQLITE_DBSTATUS_CACHE_MISS);
  pagesRead_ += read;
  work_ += TakeCount(handle_, SQLITE_DBSTATUS_CACHE_HIT) * CACHED_PAGE_COST + read * FILE_PAGE_COST;
}

bool WorkLimit::TakesTooLong() noexcept {
  const long long now = ProcessorSeconds();
  if (begin_ == -1) {
    begin_ = now;
  }
  return now - begin_ > LONGEST;
}

int WorkLimit::IsExceeded(void* self) noexcept {
  WorkLimit& limit = *static_cast<WorkLimit*>(self);
  limit.work_ += STEPS_PER_CHECK;
  limit.CountPages();
  if (limit.work_ <= LEAST_LIMIT) {
    return 0;
  }
  const bool exceeded =
      limit.work_ > LEAST_LIMIT + limit.BytesRead() * LIMIT_PER_BYTE +
                        sqlite3_total_changes64(limit.handle_) * LIMIT_PER_CHANGED_ROW;
  return exceeded || limit.TakesTooLong() ? 1 : 0;
}

} // namespace orva::db

#include "ReadCounter.h"

namespace orva::db {

namespace {

/// Shorter reads are not of pages.
constexpr int LEAST_PAGE = 512;

/// Pages after these do not count. Bounds the memory, to 32 MiB.
constexpr long long MOST_PAGES = 1LL << 28U;

} // namespace

void ReadCounter::Count(long long offset, int bytes) {
  const long long page = bytes < LEAST_PAGE ? MOST_PAGES : offset / bytes;
  if (page >= MOST_PAGES) {
    return;
  }
  const auto index = static_cast<std::size_t>(page);
  if (index >= read_.size()) {
    read_.resize(index + 1);
  }
  if (!read_[index]) {
    read_[index] = true;
    bytes_ += bytes;
  }
}

} // namespace orva::db

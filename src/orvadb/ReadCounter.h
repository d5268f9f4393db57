#pragma once

#include <cstddef>
#include <vector>

namespace orva::db {

/// Counts the content that was read from a file, each part once: a page that the cache has dropped
/// is read again. On the thread of the connection.
class ReadCounter {
public:
  /// `bytes` were read at `offset`.
  void Count(long long offset, int bytes);

  long long Bytes() const noexcept { return bytes_; }

private:
  std::vector<bool> read_; ///< by the number of the page
  long long bytes_ = 0;
};

} // namespace orva::db

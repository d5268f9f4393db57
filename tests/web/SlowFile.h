#pragma once

#include <string>

namespace orva::test {

/// A slow disk: while the object lives, each read of the file at `path` by SQLite takes a
/// millisecond. Counts the reads while one connection holds its lock. One thread.
class SlowFile {
public:
  explicit SlowFile(const std::string& path);
  SlowFile(const SlowFile&) = delete;
  SlowFile& operator=(const SlowFile&) = delete;
  ~SlowFile();

  int Reads() const noexcept;
  /// The largest number of reads between a lock and its release.
  int MostReadsLocked() const noexcept;
};

} // namespace orva::test

#pragma once

#include <sys/types.h>

#include <string>

namespace orva::test {

/// The growth of a process's memory: the peak of its resident set since this object was made.
/// Failures are thrown as std::runtime_error.
class PeakMemory {
public:
  /// Resets the peak of the process `pid` to what it uses now.
  explicit PeakMemory(pid_t pid);

  /// KiB over the use at the beginning; 0 when the process never used more.
  long Growth() const;

private:
  std::string directory_; ///< "/proc/PID/"
  long begin_;
};

/// The peak of the process `pid` in KiB. Throws std::runtime_error.
long PeakOf(pid_t pid);

} // namespace orva::test

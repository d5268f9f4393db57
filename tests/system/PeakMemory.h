#pragma once

#include <sys/types.h>

#include <string>

namespace orva::test {

/// How much more memory a process has used since this was made, at the most: its resident set, as
/// the kernel keeps the peak of it. Failures are thrown as std::runtime_error.
class PeakMemory {
public:
  /// Begins with what the process `pid` uses now.
  explicit PeakMemory(pid_t pid);

  /// KiB; 0 when it never used more.
  long Growth() const;

private:
  std::string directory_; ///< "/proc/PID/"
  long begin_;
};

/// KiB that the process `pid` has used at the most. Throws std::runtime_error.
long PeakOf(pid_t pid);

} // namespace orva::test

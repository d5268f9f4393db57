#pragma once

#include <string>
#include <vector>

namespace orva::test {

/// What the daemon's listener would do with two mount points: "merge", "remerge", "remove",
/// "init" (opens the merged database of the master) or "locate" (publishes it).
struct Operation {
  std::string name;
  std::string master;
  std::string volume{};
};

/// Operations done one after the other by a process of their own, under watch, so that one that
/// never ends, eats the memory or crashes is a failure of the test and nothing more.
struct Attempt {
  /// Why the process was ended from outside, or how else it ended badly; empty when it ended by
  /// itself with all operations done.
  std::string trouble;
  /// What left each operation that was done: empty, or the exception's type and beginning.
  std::vector<std::string> thrown;
  double seconds = 0;
  long long peakMemory = 0; ///< bytes resident at most

  /// Runs the operations. Throws std::system_error when there can be no such process.
  static Attempt Run(const std::vector<Operation>& operations);
};

} // namespace orva::test

#pragma once

#include "Deadline.h"

#include <chrono>
#include <string>
#include <vector>

namespace orva::test {

/// What the daemon does with two mount points: "merge", "remerge", "remove", "init" (opens the
/// merged database of the master) or "locate" (publishes it).
struct Operation {
  std::string name;
  std::string master;
  std::string volume{};
};

/// Operations that a watched process of their own does one after the other. If one of them never
/// ends, uses too much memory or crashes, only the test fails.
struct Attempt {
  /// Why the process was killed, or its exit status other than 0; empty when it did all operations.
  std::string trouble;
  /// For each operation the type and the beginning of the exception that it threw; empty for none.
  std::vector<std::string> thrown;
  double seconds = 0;
  double processorSeconds = 0; ///< of this process and the system for it
  long long peakMemory = 0;    ///< bytes of resident memory

  /// Runs the operations, with `environment` ("NAME=value") added to the test's. Kills the process
  /// after `deadline`. Throws std::system_error when the process cannot be started.
  static Attempt Run(const std::vector<Operation>& operations,
                     const std::vector<std::string>& environment = {},
                     std::chrono::seconds deadline = DEADLINE);
};

} // namespace orva::test

#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace orva::test {

/// The resources that a process uses at one time.
struct Vitals {
  std::vector<std::string> descriptors; ///< the target of each, sorted
  long heap = 0;                        ///< bytes in use, as the heap probe wrote last
  long resident = 0;                    ///< bytes of memory
  long stacks = 0; ///< thread stacks of the default size, also of threads that have ended
};

/// The resources of the process. Throws std::runtime_error when there is none.
Vitals VitalsOf(pid_t process);

/// Waits until the process has `count` threads; false after the deadline.
bool AwaitThreads(pid_t process, std::size_t count);

/// The file that the heap probe writes.
inline const std::string HEAP_FILE = "/tmp/heap";

} // namespace orva::test

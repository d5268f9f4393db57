#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace orva::test {

/// What a process holds at a moment.
struct Vitals {
  std::vector<std::string> descriptors; ///< what each is open on, in order
  long heap = 0;                        ///< bytes in use, as the heap probe has told last
  long resident = 0;                    ///< bytes of memory
  long stacks = 0; ///< stacks of the size that the daemon gives its threads, also of ended ones
};

/// The vitals of the process. Throws std::runtime_error when there is none.
Vitals VitalsOf(pid_t process);

/// Waits until the process has that many threads; false after the deadline.
bool AwaitThreads(pid_t process, std::size_t count);

/// The file that the heap probe tells.
inline const std::string HEAP_FILE = "/tmp/heap";

} // namespace orva::test

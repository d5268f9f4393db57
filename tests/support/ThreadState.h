#pragma once

#include "system/Deadline.h"

#include <chrono>
#include <fstream>
#include <string>
#include <thread>

#include <sys/types.h>

namespace orva::test {

/// Waits until the thread `id` (as gettid gives it) of this process sleeps in a system call; false
/// after the deadline, or when the thread has ended.
inline bool AwaitSleeping(pid_t id) {
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  while (std::chrono::steady_clock::now() < end) {
    std::ifstream file("/proc/self/task/" + std::to_string(id) + "/stat");
    std::string status;
    if (!std::getline(file, status)) {
      return false;
    }
    // "id (name) state ..."
    const auto name = status.rfind(") ");
    if (name != std::string::npos && status.compare(name + 2, 1, "S") == 0) {
      return true;
    }
    std::this_thread::yield();
  }
  return false;
}

} // namespace orva::test

#pragma once

#include "system/Deadline.h"

#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include <sys/types.h>

namespace orva::test {

/// Waits until the thread `id` (as gettid returns it) of this process sleeps in a system call;
/// false after the deadline, or when the thread has ended.
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

/// Waits until a thread of the process `pid` is in the system call `number` (sys/syscall.h); false
/// after the deadline.
inline bool AwaitSystemCall(pid_t pid, long number) {
  const std::filesystem::path tasks = "/proc/" + std::to_string(pid) + "/task";
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  while (std::chrono::steady_clock::now() < end) {
    for (const auto& task : std::filesystem::directory_iterator(tasks)) {
      // "number arguments...", or "running"
      long current = -1;
      if (std::ifstream(task.path() / "syscall") >> current && current == number) {
        return true;
      }
    }
    std::this_thread::yield();
  }
  return false;
}

} // namespace orva::test

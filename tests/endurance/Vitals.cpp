#include "Vitals.h"

#include "Deadline.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <system_error>
#include <thread>

namespace orva::test {

namespace {

namespace fs = std::filesystem;

std::string Directory(pid_t process) {
  return "/proc/" + std::to_string(process);
}

std::vector<std::string> Descriptors(pid_t process) {
  std::vector<std::string> targets;
  for (const auto& entry : fs::directory_iterator(Directory(process) + "/fd")) {
    std::error_code gone;
    const std::string target = fs::read_symlink(entry, gone).string();
    // The heap probe may have its file open.
    if (!gone && !target.starts_with(HEAP_FILE)) {
      // "socket:[123]": the number changes with each connection.
      targets.push_back(target.substr(0, target.find(":[")));
    }
  }
  std::sort(targets.begin(), targets.end());
  return targets;
}

long Resident(pid_t process) {
  std::ifstream file(Directory(process) + "/status");
  for (std::string word; file >> word;) {
    if (word == "VmRSS:") {
      long kibibytes = 0;
      file >> kibibytes;
      return kibibytes * 1024;
    }
  }
  return 0;
}

/// Counts lines such as "7f0000000000-7f0000800000 rw-p ..." of 8 MiB.
long Stacks(pid_t process) {
  constexpr unsigned long stackSize = 8UL << 20U;
  std::ifstream file(Directory(process) + "/maps");
  long count = 0;
  for (std::string line; std::getline(file, line);) {
    unsigned long begin = 0;
    unsigned long end = 0;
    const char* const last = line.data() + line.size();
    const auto* const separator = std::from_chars(line.data(), last, begin, 16).ptr;
    std::from_chars(separator + 1, last, end, 16);
    count += end - begin == stackSize && line.find(" rw-p ") != std::string::npos ? 1 : 0;
  }
  return count;
}

} // namespace

Vitals VitalsOf(pid_t process) {
  Vitals vitals{.descriptors = Descriptors(process),
                .resident = Resident(process),
                .stacks = Stacks(process)};
  std::ifstream(HEAP_FILE) >> vitals.heap;
  return vitals;
}

bool AwaitThreads(pid_t process, std::size_t count) {
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  while (std::chrono::steady_clock::now() < end) {
    const fs::directory_iterator threads(Directory(process) + "/task");
    if (static_cast<std::size_t>(std::distance(begin(threads), fs::directory_iterator())) ==
        count) {
      return true;
    }
    std::this_thread::yield();
  }
  return false;
}

} // namespace orva::test

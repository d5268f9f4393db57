#include "PeakMemory.h"

#include <algorithm>
#include <fstream>
#include <stdexcept>

namespace orva::test {

namespace {

/// A field in KiB of a file such as /proc/PID/status.
long ReadKibibytes(const std::string& path, const std::string& field) {
  std::ifstream file(path);
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with(field + ":")) {
      return std::stol(line.substr(field.size() + 1));
    }
  }
  throw std::runtime_error("no " + field + " in " + path);
}

} // namespace

PeakMemory::PeakMemory(pid_t pid)
    : directory_("/proc/" + std::to_string(pid) + "/"),
      begin_(ReadKibibytes(directory_ + "status", "VmRSS")) {
  std::ofstream reset(directory_ + "clear_refs");
  if (!(reset << "5" << std::flush)) { // resets the peak
    throw std::runtime_error("cannot reset the peak of " + directory_);
  }
}

long PeakMemory::Growth() const {
  return std::max(0L, ReadKibibytes(directory_ + "status", "VmHWM") - begin_);
}

long PeakOf(pid_t pid) {
  return ReadKibibytes("/proc/" + std::to_string(pid) + "/status", "VmHWM");
}

} // namespace orva::test

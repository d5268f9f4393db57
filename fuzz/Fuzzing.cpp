#include "Fuzzing.h"

#include "orvautil/FormatString.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdlib>
#include <iostream>
#include <utility>

namespace orva::fuzz {

namespace {

std::vector<LogLine> log;
std::vector<LogLine> taken; ///< by the last TakeLog, for the report of a finding

void Print(const std::vector<LogLine>& lines) {
  for (const LogLine& line : lines) {
    std::cerr << "logged: " << line.text << '\n';
  }
}

} // namespace

std::vector<LogLine> TakeLog() {
  taken = std::exchange(log, {});
  return taken;
}

void ResetStandardOutput() {
  static const int memory = dup2(memfd_create("stdout", 0), STDOUT_FILENO);
  Require(memory == STDOUT_FILENO && ftruncate(memory, 0) == 0 && lseek(memory, 0, SEEK_SET) == 0,
          "standard output is in memory");
}

void Require(bool holds, const char* what) {
  if (!holds) {
    Print(taken);
    Print(log);
    std::cerr << "It does not hold that " << what << std::endl;
    std::abort();
  }
}

} // namespace orva::fuzz

extern "C" void syslog(int priority, const char* format, ...) {
  std::va_list arguments;
  va_start(arguments, format);
  orva::fuzz::log.push_back({priority, orva::util::FormatStringV(format, arguments)});
  va_end(arguments);
}

#include "Attempt.h"

#include "support/Program.h"
#include "support/Programs.h"

#include <sys/resource.h>

#include <algorithm>
#include <csignal>
#include <fstream>
#include <sstream>

namespace orva::test {

namespace {

using Clock = std::chrono::steady_clock;

/// A process that uses more memory is killed before the machine runs out of it.
constexpr long long MEMORY_CEILING = 6LL << 30U;

/// How often the memory is measured.
constexpr std::chrono::milliseconds INTERVAL{20};

Program::Arguments Command(const std::vector<Operation>& operations) {
  Program::Arguments command{ProgramPath("hostile_attempt")};
  for (const Operation& operation : operations) {
    command.insert(command.end(), {operation.name, operation.master, operation.volume});
  }
  return command;
}

long long PeakMemory(pid_t pid) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  for (std::string word; status >> word;) {
    if (word == "VmHWM:") {
      long long kilobytes = 0;
      status >> kilobytes;
      return kilobytes * 1024;
    }
  }
  return 0;
}

/// Of the processes that have ended.
double ProcessorSecondsOfChildren() {
  rusage usage{};
  getrusage(RUSAGE_CHILDREN, &usage);
  double seconds = 0;
  for (const timeval& time : {usage.ru_utime, usage.ru_stime}) {
    seconds += static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
  }
  return seconds;
}

/// Waits for the end of the process, and kills it when it takes too much. Returns why.
std::string Watch(const Program& program, Clock::time_point end, long long& peakMemory) {
  while (!program.AwaitEnd(INTERVAL)) {
    peakMemory = std::max(peakMemory, PeakMemory(program.Pid()));
    const bool late = Clock::now() > end;
    if (late || peakMemory > MEMORY_CEILING) {
      program.Signal(SIGKILL);
      return late ? "it has not ended" : "it uses too much memory";
    }
  }
  return {};
}

} // namespace

Attempt Attempt::Run(const std::vector<Operation>& operations,
                     const std::vector<std::string>& environment, std::chrono::seconds deadline) {
  Attempt attempt;
  const Clock::time_point start = Clock::now();
  const double processorStart = ProcessorSecondsOfChildren();
  Program program(Command(operations),
                  {.errors = Program::Errors::Inherited, .environment = environment});
  attempt.trouble = Watch(program, start + deadline, attempt.peakMemory);
  const int status = program.WaitForEnd();
  attempt.seconds = std::chrono::duration<double>(Clock::now() - start).count();
  attempt.processorSeconds = ProcessorSecondsOfChildren() - processorStart;
  if (attempt.trouble.empty() && status != 0) {
    attempt.trouble = "exit status " + std::to_string(status);
  }

  // One line each, and the memory as the last one.
  std::string report;
  std::string none;
  program.ReadToEnd(report, none);
  std::istringstream lines(report);
  for (std::string line; std::getline(lines, line);) {
    if (line.starts_with("peak ")) {
      attempt.peakMemory = std::stoll(line.substr(5));
    } else {
      attempt.thrown.push_back(line);
    }
  }
  return attempt;
}

} // namespace orva::test

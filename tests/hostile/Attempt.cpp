#include "Attempt.h"

#include "Deadline.h"

#include "support/Programs.h"

#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <fstream>
#include <sstream>
#include <system_error>

namespace orva::test {

namespace {

using Clock = std::chrono::steady_clock;

/// Above this the process is ended before it takes the machine down.
constexpr long long MEMORY_CEILING = 6LL << 30U;

/// How often the watch looks at the memory, in milliseconds.
constexpr int LOOK_INTERVAL = 20;

void Check(int code, const std::string& what) {
  if (code != 0) {
    throw std::system_error(code, std::generic_category(), what);
  }
}

class Descriptor {
public:
  explicit Descriptor(int descriptor) : descriptor_(descriptor) {}
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  ~Descriptor() { Close(); }

  int Get() const { return descriptor_; }
  void Close() {
    if (descriptor_ != -1) {
      close(descriptor_);
      descriptor_ = -1;
    }
  }

private:
  int descriptor_;
};

/// The process, reporting into the writing end of a pipe; its lines go nowhere.
pid_t Spawn(const std::vector<Operation>& operations, int report) {
  const std::string program = ProgramPath("hostile_attempt");
  std::vector<std::string> arguments{program};
  for (const Operation& operation : operations) {
    arguments.insert(arguments.end(), {operation.name, operation.master, operation.volume});
  }
  std::vector<char*> pointers;
  for (std::string& argument : arguments) {
    pointers.push_back(argument.data());
  }
  pointers.push_back(nullptr);

  posix_spawn_file_actions_t actions;
  Check(posix_spawn_file_actions_init(&actions), "posix_spawn_file_actions_init");
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_adddup2(&actions, report, STDIN_FILENO);
  pid_t pid = -1;
  const int code = posix_spawn(&pid, program.c_str(), &actions, nullptr, pointers.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  Check(code, program);
  return pid;
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

/// Waits for the end of the process, and brings it about when it takes too much. Returns why.
std::string Watch(pid_t pid, const Descriptor& pidfd, Clock::time_point start,
                  long long& peakMemory) {
  pollfd end{pidfd.Get(), POLLIN, 0};
  while (poll(&end, 1, LOOK_INTERVAL) != 1) {
    peakMemory = std::max(peakMemory, PeakMemory(pid));
    const bool late = Clock::now() - start > DEADLINE;
    if (late || peakMemory > MEMORY_CEILING) {
      kill(pid, SIGKILL);
      return late ? "it has not ended" : "it takes all the memory";
    }
  }
  return {};
}

std::string Trouble(int status) {
  if (WIFSIGNALED(status)) {
    return util::FormatString("end by signal %d", WTERMSIG(status));
  }
  return WEXITSTATUS(status) == 0 ? "" : util::FormatString("exit status %d", WEXITSTATUS(status));
}

std::string ReadAll(int descriptor) {
  std::string text;
  std::array<char, 4096> piece;
  for (ssize_t size = 0; (size = read(descriptor, piece.data(), piece.size())) > 0;) {
    text.append(piece.data(), static_cast<std::size_t>(size));
  }
  return text;
}

} // namespace

Attempt Attempt::Run(const std::vector<Operation>& operations) {
  std::array<int, 2> ends{};
  Check(pipe2(ends.data(), O_CLOEXEC) == 0 ? 0 : errno, "pipe2");
  const Descriptor reading(ends[0]);
  Descriptor writing(ends[1]);

  Attempt attempt;
  const Clock::time_point start = Clock::now();
  const pid_t pid = Spawn(operations, writing.Get());
  writing.Close();
  const Descriptor pidfd(static_cast<int>(syscall(SYS_pidfd_open, pid, 0)));
  attempt.trouble = Watch(pid, pidfd, start, attempt.peakMemory);
  int status = 0;
  waitpid(pid, &status, 0);
  attempt.seconds = std::chrono::duration<double>(Clock::now() - start).count();
  if (attempt.trouble.empty()) {
    attempt.trouble = Trouble(status);
  }

  // One line each, and the memory as the last one.
  std::istringstream report(ReadAll(reading.Get()));
  for (std::string line; std::getline(report, line);) {
    if (line.starts_with("peak ")) {
      attempt.peakMemory = std::stoll(line.substr(5));
    } else {
      attempt.thrown.push_back(line);
    }
  }
  return attempt;
}

} // namespace orva::test

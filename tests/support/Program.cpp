#include "Program.h"

#include "system/Deadline.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace orva::test {

namespace {

using Clock = std::chrono::steady_clock;

/// Both ends of a pipe, of which the program gets the second one.
struct Pipe {
  Pipe() {
    if (pipe2(ends.data(), O_CLOEXEC) != 0) {
      throw std::system_error(errno, std::generic_category(), "pipe2");
    }
  }
  Pipe(const Pipe&) = delete;
  Pipe& operator=(const Pipe&) = delete;
  ~Pipe() {
    close(ends[0]);
    close(ends[1]);
  }
  int TakeReadingEnd() { return std::exchange(ends[0], -1); }

  std::array<int, 2> ends{};
};

/// Waits for one of `descriptors` to be readable; false when the deadline has passed.
template <std::size_t size>
bool AwaitReadable(std::array<pollfd, size>& descriptors, Clock::time_point deadline) {
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
  return poll(descriptors.data(), descriptors.size(),
              static_cast<int>(std::max<long>(left.count(), 0))) > 0;
}

bool AwaitReadable(int descriptor, Clock::time_point deadline) {
  std::array<pollfd, 1> one{pollfd{descriptor, POLLIN, 0}};
  return AwaitReadable(one, deadline);
}

} // namespace

Program::Program(Arguments arguments, const Streams& streams) {
  Pipe output;
  Pipe error;
  std::vector<char*> pointers;
  for (std::string& argument : arguments) {
    pointers.push_back(argument.data());
  }
  pointers.push_back(nullptr);

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, streams.input.c_str(), O_RDONLY, 0);
  if (streams.output.empty()) {
    posix_spawn_file_actions_adddup2(&actions, output.ends[1], STDOUT_FILENO);
  } else {
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, streams.output.c_str(),
                                     O_WRONLY | O_NOCTTY, 0);
  }
  posix_spawn_file_actions_adddup2(&actions, streams.errorApart ? error.ends[1] : STDOUT_FILENO,
                                   STDERR_FILENO);
  const int code =
      posix_spawn(&pid_, pointers.front(), &actions, nullptr, pointers.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  if (code != 0) {
    throw std::system_error(code, std::generic_category(), arguments.front());
  }
  output_ = streams.output.empty() ? output.TakeReadingEnd() : -1;
  error_ = streams.errorApart ? error.TakeReadingEnd() : -1;
}

Program::~Program() {
  if (pid_ != -1) {
    kill(pid_, SIGKILL);
    waitpid(pid_, nullptr, 0);
  }
  CloseOutput();
  close(error_);
}

void Program::Signal(int signal) const {
  kill(pid_, signal);
}

void Program::CloseOutput() {
  close(std::exchange(output_, -1));
}

std::string Program::ReadLine() {
  const auto deadline = Clock::now() + DEADLINE;
  std::array<char, 4096> chunk{};
  for (;;) {
    const auto end = rest_.find('\n');
    if (end != std::string::npos) {
      std::string line = rest_.substr(0, end);
      rest_.erase(0, end + 1);
      return line;
    }
    if (!AwaitReadable(output_, deadline)) {
      return "(deadline)";
    }
    const ssize_t size = read(output_, chunk.data(), chunk.size());
    if (size <= 0) {
      return rest_.empty() ? "(end)" : std::exchange(rest_, {});
    }
    rest_.append(chunk.data(), static_cast<std::size_t>(size));
  }
}

std::string Program::ReadLineWith(const std::string& text) {
  std::string line = ReadLine();
  while (line.find(text) == std::string::npos && line != "(end)" && line != "(deadline)") {
    line = ReadLine();
  }
  return line;
}

void Program::ReadToEnd(std::string& output, std::string& error) {
  output += std::exchange(rest_, {});
  const auto deadline = Clock::now() + DEADLINE;
  const std::array<std::string*, 2> texts{&output, &error};
  // poll passes over what is -1.
  std::array<pollfd, 2> ends{pollfd{output_, POLLIN, 0}, pollfd{error_, POLLIN, 0}};
  std::array<char, 65536> chunk{};
  while (ends[0].fd != -1 || ends[1].fd != -1) {
    if (!AwaitReadable(ends, deadline)) {
      throw std::runtime_error("the program has not come to its end");
    }
    for (std::size_t i = 0; i < ends.size(); ++i) {
      if (ends[i].revents != 0) {
        const ssize_t size = read(ends[i].fd, chunk.data(), chunk.size());
        texts[i]->append(chunk.data(), static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
        ends[i].fd = size > 0 ? ends[i].fd : -1;
      }
    }
  }
}

int Program::WaitForEnd() {
  const int handle = static_cast<int>(syscall(SYS_pidfd_open, pid_, 0));
  const bool hasEnded = AwaitReadable(handle, Clock::now() + DEADLINE);
  close(handle);
  int status = -1;
  if (!hasEnded || waitpid(pid_, &status, 0) != pid_) {
    return -1;
  }
  pid_ = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

Outcome Run(Program::Arguments arguments, const std::string& output) {
  Program program(std::move(arguments), {.output = output, .errorApart = true});
  Outcome outcome;
  program.ReadToEnd(outcome.output, outcome.error);
  outcome.status = program.WaitForEnd();
  return outcome;
}

} // namespace orva::test

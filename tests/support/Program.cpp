#include "Program.h"

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

struct Pipe {
  util::FileDescriptor reader;
  util::FileDescriptor writer;
};

Pipe MakePipe() {
  std::array<int, 2> ends{};
  if (pipe2(ends.data(), O_CLOEXEC) != 0) {
    throw std::system_error(errno, std::generic_category(), "pipe2");
  }
  return {util::FileDescriptor(ends[0]), util::FileDescriptor(ends[1])};
}

/// The texts as the null-terminated array that exec takes.
std::vector<char*> Pointers(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  pointers.reserve(texts.size() + 1);
  for (std::string& text : texts) {
    pointers.push_back(text.data());
  }
  pointers.push_back(nullptr);
  return pointers;
}

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

Program::Program(Arguments arguments, const Options& options) {
  if (options.held) {
    arguments.insert(arguments.begin(), {"/bin/sh", "-c", R"(kill -STOP $$; exec "$0" "$@")"});
  }
  // Of two values of one name the first counts.
  Arguments environment = options.environment;
  for (char** variable = environ; *variable != nullptr; ++variable) {
    environment.emplace_back(*variable);
  }
  const bool errorsApart = options.errors == Errors::Apart;
  Pipe input = options.input.empty() ? MakePipe() : Pipe();
  Pipe output = options.output.empty() ? MakePipe() : Pipe();
  Pipe error = errorsApart ? MakePipe() : Pipe();

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  if (options.input.empty()) {
    posix_spawn_file_actions_adddup2(&actions, input.reader.Get(), STDIN_FILENO);
  } else {
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, options.input.c_str(), O_RDONLY, 0);
  }
  if (options.output.empty()) {
    posix_spawn_file_actions_adddup2(&actions, output.writer.Get(), STDOUT_FILENO);
  } else {
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, options.output.c_str(),
                                     O_WRONLY | O_CREAT | O_TRUNC | O_NOCTTY, 0644);
  }
  if (options.errors != Errors::Inherited) {
    posix_spawn_file_actions_adddup2(&actions, errorsApart ? error.writer.Get() : STDOUT_FILENO,
                                     STDERR_FILENO);
  }
  if (!options.directory.empty()) {
    posix_spawn_file_actions_addchdir_np(&actions, options.directory.c_str());
  }
  // Descriptors that the test has inherited from its own caller.
  posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
  const int code = posix_spawnp(&pid_, arguments.front().c_str(), &actions, nullptr,
                                Pointers(arguments).data(), Pointers(environment).data());
  posix_spawn_file_actions_destroy(&actions);
  if (code != 0) {
    throw std::system_error(code, std::generic_category(), arguments.front());
  }
  if (options.held) {
    waitpid(pid_, nullptr, WUNTRACED);
  }
  handle_.Reset(static_cast<int>(syscall(SYS_pidfd_open, pid_, 0)));
  input_ = std::move(input.writer);
  output_ = std::move(output.reader);
  error_ = std::move(error.reader);
}

Program::~Program() {
  if (pid_ != -1) {
    kill(pid_, SIGKILL);
    waitpid(pid_, nullptr, 0);
  }
}

void Program::Signal(int signal) const {
  kill(pid_, signal);
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
    if (!AwaitReadable(output_.Get(), deadline)) {
      return "(deadline)";
    }
    const ssize_t size = read(output_.Get(), chunk.data(), chunk.size());
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
  // poll ignores an entry of -1.
  std::array<pollfd, 2> ends{pollfd{output_.Get(), POLLIN, 0}, pollfd{error_.Get(), POLLIN, 0}};
  std::array<char, 65536> chunk{};
  while (ends[0].fd != -1 || ends[1].fd != -1) {
    if (!AwaitReadable(ends, deadline)) {
      throw std::runtime_error("the program has not closed its output");
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

bool Program::AwaitEnd(std::chrono::milliseconds time) const {
  return AwaitReadable(handle_.Get(), Clock::now() + time);
}

int Program::WaitForEnd(std::chrono::milliseconds time) {
  if (!AwaitEnd(time)) {
    throw std::runtime_error("the program has not ended");
  }
  int status = 0;
  if (waitpid(pid_, &status, 0) != pid_) {
    throw std::system_error(errno, std::generic_category(), "waitpid");
  }
  pid_ = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

Outcome Run(Program::Arguments arguments, const std::string& output) {
  Program program(std::move(arguments), {.output = output, .errors = Program::Errors::Apart});
  Outcome outcome;
  program.ReadToEnd(outcome.output, outcome.error);
  outcome.status = program.WaitForEnd();
  return outcome;
}

} // namespace orva::test

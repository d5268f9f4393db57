#include "DaemonProcess.h"

#include "Deadline.h"
#include "support/Programs.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <fstream>
#include <ostream>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace orva::test {

namespace {

void Check(int code, const std::string& what) {
  if (code != 0) {
    throw std::system_error(code, std::generic_category(), what);
  }
}

std::vector<char*> Pointers(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  pointers.reserve(texts.size() + 1);
  for (std::string& text : texts) {
    pointers.push_back(text.data());
  }
  pointers.push_back(nullptr);
  return pointers;
}

} // namespace

DaemonProcess::DaemonProcess(std::string directory, std::string output,
                             const std::vector<std::string>& environment, bool held)
    : directory_(std::move(directory)), output_(std::move(output)) {
  mkdir(directory_.c_str(), 0755);
  // The caller's come first: of two values of one name the first counts.
  std::vector<std::string> variables = environment;
  for (char** variable = environ; *variable != nullptr; ++variable) {
    variables.emplace_back(*variable);
  }
  const std::string daemon = ProgramPath("zophotodbmerger");
  std::vector<std::string> arguments{daemon};
  if (held) {
    arguments = {"/bin/sh", "-c", "kill -STOP $$; exec \"$0\"", daemon};
  }
  if (const char* launcher = std::getenv("ORVA_TEST_LAUNCHER")) {
    arguments.insert(arguments.begin(), launcher);
  }

  posix_spawn_file_actions_t actions;
  Check(posix_spawn_file_actions_init(&actions), "posix_spawn_file_actions_init");
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output_.c_str(),
                                   O_WRONLY | O_CREAT | O_TRUNC, 0644);
  posix_spawn_file_actions_addchdir_np(&actions, directory_.c_str());
  const int code = posix_spawn(&pid_, arguments[0].c_str(), &actions, nullptr,
                               Pointers(arguments).data(), Pointers(variables).data());
  posix_spawn_file_actions_destroy(&actions);
  Check(code, daemon);
  if (held) {
    waitpid(pid_, nullptr, WUNTRACED);
  }
  pidfd_ = static_cast<int>(syscall(SYS_pidfd_open, pid_, 0));
}

DaemonProcess::~DaemonProcess() {
  if (pid_ != -1) {
    kill(pid_, SIGKILL);
    waitpid(pid_, nullptr, 0);
  }
  close(pidfd_);
}

DaemonProcess::End DaemonProcess::AwaitEnd() {
  pollfd end{pidfd_, POLLIN, 0};
  const auto deadline = std::chrono::milliseconds(DEADLINE).count();
  if (poll(&end, 1, static_cast<int>(deadline)) != 1) {
    throw std::runtime_error("the daemon has not ended");
  }
  int status = 0;
  if (waitpid(pid_, &status, 0) != pid_) {
    throw std::system_error(errno, std::generic_category(), "waitpid");
  }
  pid_ = -1;
  return WIFEXITED(status) ? Exited(WEXITSTATUS(status)) : Killed(WTERMSIG(status));
}

std::vector<std::string> DaemonProcess::StandardOutput() const {
  std::ifstream file(output_);
  std::vector<std::string> lines;
  for (std::string line; std::getline(file, line);) {
    lines.push_back(line);
  }
  return lines;
}

std::ostream& operator<<(std::ostream& stream, const DaemonProcess::End& end) {
  return stream << (end.exited ? "exit with status " : "end by signal ") << end.value;
}

} // namespace orva::test

#pragma once

#include "support/Program.h"

#include <string>
#include <vector>

namespace orva::test {

/// The daemon as a process of its own, with a new working directory and its standard output in a
/// file.
class DaemonProcess {
public:
  /// Starts the daemon in `directory`, which is created; `environment` ("NAME=value") is added to
  /// the test's own. `output` is the file for its standard output. With `held` the process waits
  /// for SIGCONT before it becomes the daemon. If the test's environment names a program as
  /// ORVA_TEST_LAUNCHER, that program starts the daemon. Throws std::system_error.
  DaemonProcess(std::string directory, std::string output,
                const std::vector<std::string>& environment = {}, bool held = false);

  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;

  /// Kills a daemon that still runs, and fails the test: its exit status was not checked, which
  /// would tell whether a sanitizer has found a leak.
  ~DaemonProcess();

  /// Waits for the daemon's end, and returns its status as Program does. Throws std::runtime_error
  /// after the deadline.
  int AwaitEnd() { return program_.WaitForEnd(); }

  /// The process, while it runs; -1 after its end.
  pid_t Pid() const { return program_.Pid(); }

  /// False once AwaitEnd has returned.
  bool IsRunning() const { return Pid() != -1; }

  /// What the daemon has written to its standard output, line by line.
  std::vector<std::string> StandardOutput() const;

  /// The daemon's working directory.
  const std::string& Directory() const { return directory_; }

private:
  std::string directory_;
  std::string output_; ///< path of the file for standard output
  Program program_;
};

/// The status of a program that has exited with `status`.
constexpr int Exited(int status) {
  return status;
}
/// The status of a program that `signal` has ended.
constexpr int Killed(int signal) {
  return 128 + signal;
}

} // namespace orva::test

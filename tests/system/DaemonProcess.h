#pragma once

#include <sys/types.h>

#include <iosfwd>
#include <string>
#include <vector>

namespace orva::test {

/// The daemon as a process of its own, with a fresh working directory and its standard output
/// in a file. Killed when the object ends while it still runs.
class DaemonProcess {
public:
  /// Starts the daemon in `directory`, which is made; `environment` ("NAME=value") comes on top
  /// of the test's own. `output` is the file for its standard output. With `held` the process
  /// waits for SIGCONT before it becomes the daemon. Where the test's environment names a program
  /// as ORVA_TEST_LAUNCHER, that one becomes the daemon. Throws std::system_error.
  DaemonProcess(std::string directory, std::string output,
                const std::vector<std::string>& environment = {}, bool held = false);
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;
  ~DaemonProcess();

  /// How a process has ended: by exit with a status, or by a signal.
  struct End {
    bool exited;
    int value; ///< the exit status or the signal's number

    bool operator==(const End&) const = default;
  };

  /// Waits for the daemon's end. Throws std::runtime_error after the deadline.
  End AwaitEnd();

  /// The process, while it runs; -1 after its end.
  pid_t Pid() const { return pid_; }

  /// False once AwaitEnd has returned.
  bool IsRunning() const { return pid_ != -1; }

  /// What the daemon has written to its standard output, line by line.
  std::vector<std::string> StandardOutput() const;

  /// The daemon's working directory.
  const std::string& Directory() const { return directory_; }

private:
  std::string directory_;
  std::string output_; ///< path of the file behind standard output
  pid_t pid_ = -1;     ///< -1 when it has been waited for
  int pidfd_ = -1;     ///< owned
};

/// An exit with `status`.
constexpr DaemonProcess::End Exited(int status) {
  return {true, status};
}
/// An end by `signal`.
constexpr DaemonProcess::End Killed(int signal) {
  return {false, signal};
}
std::ostream& operator<<(std::ostream& stream, const DaemonProcess::End& end);

} // namespace orva::test

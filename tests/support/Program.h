#pragma once

#include "system/Deadline.h"

#include "orvautil/FileDescriptor.h"

#include <sys/types.h>

#include <chrono>
#include <string>
#include <utility>
#include <vector>

namespace orva::test {

/// A program as a process of its own. Killed when the object ends while it still runs. Failures are
/// thrown as std::runtime_error or std::system_error.
class Program {
public:
  using Arguments = std::vector<std::string>;

  /// Where standard error goes.
  enum class Errors {
    WithOutput, ///< where standard output goes
    Apart,      ///< a pipe of its own
    Inherited,  ///< where the test's goes
  };

  struct Options {
    std::string input = "/dev/null"; ///< file for standard input; empty for a pipe
    std::string output{};            ///< file for standard output; empty for a pipe
    Errors errors = Errors::WithOutput;
    std::string directory{}; ///< working directory; empty for the test's
    Arguments environment{}; ///< "NAME=value", in addition to the test's environment
    bool held = false;       ///< wait for SIGCONT before the program starts
  };

  /// Starts `arguments`, the first of which is the program's path, or its name on PATH.
  explicit Program(Arguments arguments) : Program(std::move(arguments), Options()) {}
  Program(Arguments arguments, const Options& options);
  Program(const Program&) = delete;
  Program& operator=(const Program&) = delete;
  ~Program();

  /// The process, while it runs; -1 after WaitForEnd.
  pid_t Pid() const { return pid_; }

  void Signal(int signal) const;

  /// Closes the writing end of standard input's pipe.
  void CloseInput() { input_.Reset(); }
  /// Closes the reading end of standard output's pipe.
  void CloseOutput() { output_.Reset(); }

  /// The next line of standard output; "(end)" at the end, "(deadline)" when none comes.
  std::string ReadLine();

  /// Reads lines up to the first that contains `text`, which it returns, or the last one.
  std::string ReadLineWith(const std::string& text);

  /// Reads the rest of both outputs at the same time, each to its end.
  void ReadToEnd(std::string& output, std::string& error);

  /// Waits for the end; false when it has not come within `time`.
  bool AwaitEnd(std::chrono::milliseconds time) const;

  /// Waits for the end. Returns the exit status as a shell does: 128 and the signal's number after
  /// a signal. Throws std::runtime_error when the end has not come within `time`.
  int WaitForEnd(std::chrono::milliseconds time = DEADLINE);

private:
  pid_t pid_ = -1;
  util::FileDescriptor handle_; ///< of the process
  // Our ends of the pipes, as far as there are any.
  util::FileDescriptor input_;
  util::FileDescriptor output_;
  util::FileDescriptor error_;
  std::string rest_; ///< read from standard output, but not yet a whole line
};

/// The result of a program.
struct Outcome {
  int status = -1; ///< as WaitForEnd returns it
  std::string output;
  std::string error;
};

/// Runs a program to its end. `output` as in Program::Options.
Outcome Run(Program::Arguments arguments, const std::string& output = "");

} // namespace orva::test

#pragma once

#include <sys/types.h>

#include <string>
#include <utility>
#include <vector>

namespace orva::test {

/// A program as a process of its own, its standard output and standard error in pipes. Killed when
/// the object ends while it still runs. Failures are thrown as std::runtime_error or
/// std::system_error.
class Program {
public:
  using Arguments = std::vector<std::string>;

  /// Where the program reads and writes.
  struct Streams {
    std::string input = "/dev/null"; ///< path of what is behind standard input
    std::string output{};            ///< of what is behind standard output instead of a pipe
    bool errorApart = false;         ///< standard error has a pipe of its own, not output's
  };

  /// Starts `arguments`, the first of which is the program's path.
  explicit Program(Arguments arguments) : Program(std::move(arguments), Streams()) {}
  Program(Arguments arguments, const Streams& streams);
  Program(const Program&) = delete;
  Program& operator=(const Program&) = delete;
  ~Program();

  /// The process, while it runs; -1 after its end.
  pid_t Pid() const { return pid_; }

  void Signal(int signal) const;

  /// Nobody reads standard output any more.
  void CloseOutput();

  /// The next line of standard output; "(end)" at the end, "(deadline)" when none comes.
  std::string ReadLine();

  /// Reads lines up to the first that contains `text`, which it returns, or the last one.
  std::string ReadLineWith(const std::string& text);

  /// Reads what is left of both outputs, at once, each to its end.
  void ReadToEnd(std::string& output, std::string& error);

  /// Waits for the end. Returns the exit status, 128 and the signal's number after one, as a shell
  /// has it, or -1 after the deadline.
  int WaitForEnd();

private:
  pid_t pid_ = -1;
  int output_ = -1;  ///< owned; -1 when closed, or no pipe
  int error_ = -1;   ///< owned; -1 when it goes to output's pipe
  std::string rest_; ///< read of standard output, and no line yet
};

/// What a program came to.
struct Outcome {
  int status = -1; ///< as WaitForEnd returns it
  std::string output;
  std::string error;
};

/// Runs a program to its end. `output` as in Program::Streams.
Outcome Run(Program::Arguments arguments, const std::string& output = "");

} // namespace orva::test

#pragma once

#include <functional>
#include <stdexcept>
#include <string>

namespace orva::commandline {

/// The command line is wrong; what() says what is.
class UsageError : public std::runtime_error {
public:
  /// `command` is the program and, if known, its command: "orva-notify send". Parse adds it to
  /// errors that are thrown without one.
  explicit UsageError(const std::string& message, std::string command = "");

  const std::string& Command() const noexcept { return command_; }

private:
  std::string command_;
};

/// `text` with an escape for each control character, so that it cannot control the terminal.
std::string EscapeControls(const std::string& text);

/// The exit status of a wrong command line.
inline constexpr int EXIT_USAGE = 2;

/// Prints on standard error what is wrong, after `escape`, and which help to read.
void Report(const UsageError& error,
            const std::function<std::string(const std::string&)>& escape = EscapeControls);

} // namespace orva::commandline

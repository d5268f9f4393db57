#pragma once

#include <stdexcept>
#include <string>

namespace orva::zophotos {

/// What the program's exit status says; zophotos(1) promises the numbers.
enum class ExitStatus : int {
  Success = 0,
  Negative = 1,   ///< check found damage; ls, tree or find found nothing
  Usage = 2,      ///< the command line was wrong
  NoDatabase = 3, ///< there is no merged database now
  Locked = 4,     ///< it cannot be read at this moment; trying again later helps
  Failed = 5,     ///< anything else
};

/// Ends the command with a message for the user and an exit status. Who prints the message
/// escapes it.
class Failure : public std::runtime_error {
public:
  Failure(ExitStatus status, const std::string& message)
      : std::runtime_error(message), status_(status) {}

  ExitStatus Status() const noexcept { return status_; }

private:
  ExitStatus status_;
};

} // namespace orva::zophotos

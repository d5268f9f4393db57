#pragma once

#include <stdexcept>
#include <string>

namespace orva::zophotos {

/// Exit statuses. zophotos(1) documents the numbers.
enum class ExitStatus : int {
  Success = 0,
  Negative = 1,   ///< check found damage; ls, tree or find found nothing
  Usage = 2,      ///< wrong command line
  NoDatabase = 3, ///< there is no merged database at the moment
  Locked = 4,     ///< it cannot be read at the moment; try again later
  Failed = 5,     ///< any other error
};

/// Ends the command with a message for the user and an exit status. The message is not escaped yet.
class Failure : public std::runtime_error {
public:
  Failure(ExitStatus status, const std::string& message)
      : std::runtime_error(message), status_(status) {}

  ExitStatus Status() const noexcept { return status_; }

private:
  ExitStatus status_;
};

} // namespace orva::zophotos

#pragma once

#include "orva-notify/Notification.h"

#include <chrono>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace orva::notify {

/// What the user asked for.
struct CommandLine {
  enum class Action { Help, Serve, Send, Drop };

  Action action = Action::Help;
  bool watch = false;            ///< Serve: announce mounts and unmounts too
  std::optional<Event> event;    ///< Send: nothing when the message comes from rawFile
  std::string mountPoint;        ///< Send: of the event
  std::string rawFile;           ///< Send: file with the message, "-" for standard input
  unsigned clients = 0;          ///< Send, Drop: how many clients must be connected
  std::chrono::seconds wait{10}; ///< Send, Drop: how long the service may take
};

/// A command line that means nothing; what() says why.
class UsageError : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};

/// Reads the arguments, without the program's name. Throws UsageError.
CommandLine ParseCommandLine(const std::vector<std::string>& arguments);

/// The text of --help.
extern const char* const HELP;

} // namespace orva::notify

#pragma once

#include "orva-notify/Notification.h"

#include <chrono>
#include <optional>
#include <string>
#include <vector>

namespace orva::notify {

/// What the user asked for.
struct CommandLine {
  enum class Action { Serve, Send, Drop };

  Action action = Action::Serve;
  bool watch = false;                   ///< Serve: announce mounts and unmounts too
  std::vector<std::string> directories; ///< Serve: plain directories that are volumes
  std::optional<Event> event;           ///< Send: nothing when the message comes from rawFile
  std::string mountPoint;               ///< Send: of the event
  std::string rawFile;                  ///< Send: file with the message, "-" for standard input
  bool handled = false;                 ///< Send: wait until the clients have handled the message
  unsigned clients = 0;                 ///< Send, Drop: how many clients must be connected
  std::chrono::seconds wait{10};        ///< Send, Drop: how long the service may take
};

/// Reads the arguments that follow the program's name. Returns nothing when they ask for help or
/// the version, which are then on standard output. Throws commandline::UsageError.
std::optional<CommandLine> ParseCommandLine(const std::vector<std::string>& arguments);

} // namespace orva::notify

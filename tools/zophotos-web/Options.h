#pragma once

#include <optional>
#include <string>
#include <vector>

namespace orva::web {

/// The command line.
struct Options {
  std::optional<std::string> listen; ///< ADDRESS:PORT; nothing for the socket of the environment
  bool allowsEverybody = false;
  std::vector<std::string> hosts; ///< more names of this server
  std::string cache;              ///< directory; empty for the standard one
};

/// Parses the arguments that follow the program's name. Returns nothing when they ask for help or
/// the version, which are then on standard output. Throws commandline::UsageError.
std::optional<Options> ParseOptions(std::vector<std::string> arguments);

} // namespace orva::web

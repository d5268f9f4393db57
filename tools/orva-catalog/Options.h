#pragma once

#include "Generator.h"

#include <optional>
#include <string>
#include <vector>

namespace orva::catalog {

enum class Command { Index, Generate, Restamp };

/// What the command line asks for.
struct Options {
  Command command = Command::Index;
  std::string mountPoint; ///< as given
  GeneratorPlan plan;     ///< for Generate
};

/// Reads the arguments that follow the program's name. Returns nothing when they ask for help or
/// the version, which are then on standard output. Throws commandline::UsageError.
std::optional<Options> ParseOptions(const std::vector<std::string>& arguments);

} // namespace orva::catalog

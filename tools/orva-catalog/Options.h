#pragma once

#include "Generator.h"

#include <stdexcept>
#include <string>
#include <vector>

namespace orva::catalog {

/// The command line asks for something that there is not.
class UsageError : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};

enum class Command { Help, Index, Generate, Restamp };

/// What the command line asks for.
struct Options {
  Command command = Command::Help;
  std::string mountPoint; ///< as given; empty for Help
  GeneratorPlan plan;     ///< for Generate
};

/// The text that --help prints.
extern const char* const HELP;

/// Reads the arguments behind the program's name. Throws UsageError.
Options ParseOptions(const std::vector<std::string>& arguments);

} // namespace orva::catalog

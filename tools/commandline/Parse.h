#pragma once

#include "commandline/UsageError.h"

#include <CLI/CLI.hpp>

#include <string>
#include <vector>

// What our programs add to CLI11, so that their command lines are alike.
namespace orva::commandline {

/// For Option::transform: takes a decimal number from `minimum` to `maximum`, nothing else. CLI11
/// alone would read 010 as 8 and take 0x10 and " 1", too.
CLI::Validator Decimal(long long minimum, long long maximum);

/// For Option::check: takes one of `words`.
CLI::Validator OneOf(std::vector<std::string> words);

/// For Option::check: refuses an empty value.
CLI::Validator NotEmpty();

/// Gives `app` what all programs with commands have: --version, and options that may be before or
/// after a command and whose last value counts. Parse adds the command help. To be called before
/// commands and options are added.
void SetUp(CLI::App& app);

/// Has `app` read the arguments that follow the program's name. Returns false when they ask for
/// help or the version, which are then on standard output. The app needs a command, unless
/// `needsCommand` is false. Throws UsageError.
bool Parse(CLI::App& app, std::vector<std::string> arguments, bool needsCommand = true);

/// The message that `app` has no command `word`.
std::string UnknownCommand(const CLI::App& app, const std::string& word);

} // namespace orva::commandline

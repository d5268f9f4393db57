#pragma once

#include "commandline/UsageError.h"

#include <CLI/CLI.hpp>

#include <algorithm>
#include <charconv>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

// What our programs add to CLI11.
namespace orva::commandline {

/// For Option::transform: takes a decimal number from `minimum` to `maximum`, nothing else. CLI11
/// alone would read 010 as 8 and take 0x10 and " 1", too.
inline CLI::Validator Decimal(long long minimum, long long maximum) {
  return {[minimum, maximum](std::string& text) {
            long long number = 0;
            const char* const end = text.data() + text.size();
            const auto [stop, error] = std::from_chars(text.data(), end, number);
            if (error != std::errc() || stop != end || number < minimum || number > maximum) {
              return "takes a number from " + std::to_string(minimum) + " to " +
                     std::to_string(maximum) + ", not '" + text + "'";
            }
            text = std::to_string(number);
            return std::string();
          },
          ""};
}

/// For Option::check: refuses an empty value.
inline CLI::Validator NotEmpty() {
  return {[](const std::string& text) {
            return text.empty() ? std::string("must not be empty") : std::string();
          },
          ""};
}

/// Has `app` read the arguments that follow the program's name. Returns false when they ask for
/// help or the version, which are then on standard output. An app with subcommands has
/// require_subcommand(0, 1), since CLI11 would not name an unknown one otherwise. It still needs
/// one, unless `needsCommand` is false. Throws UsageError.
inline bool Parse(CLI::App& app, std::vector<std::string> arguments, bool needsCommand = true) {
  // For "--name=" CLI11 would take the next argument as the value.
  const auto end = std::ranges::find(arguments, "--");
  const auto empty = std::find_if(arguments.begin(), end, [](const std::string& argument) {
    return argument.starts_with("--") && argument.find('=') == argument.size() - 1;
  });
  if (empty != end) {
    throw UsageError(*empty + " has no value");
  }
  try {
    std::ranges::reverse(arguments); // as CLI11 takes them
    app.parse(std::move(arguments));
    if (needsCommand && app.get_require_subcommand_max() == 1 && app.get_subcommands().empty()) {
      throw UsageError("a command is required");
    }
  } catch (const CLI::Success& request) {
    app.exit(request);
    return false;
  } catch (const CLI::ExtrasError&) {
    // CLI11 would name all that follows, too, in reverse.
    throw UsageError("unexpected argument '" + app.remaining(true).front() + "'");
  } catch (const CLI::ParseError& error) {
    throw UsageError(error.what());
  }
  return true;
}

} // namespace orva::commandline

#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <vector>

namespace orva::bench {

/// What is measured.
struct Options {
  std::vector<long long> sizes{10'000, 100'000, 1'000'000}; ///< files of a catalog, ascending
  std::vector<std::string> shapes{"unique",    "camera",  "flat",       "deep",
                                  "restamped", "folders", "same-names", "covers"};
  int pairs = 5;
  std::chrono::seconds limit{120};  ///< a merge is given up after this time
  std::chrono::seconds budget{120}; ///< after this time a measurement makes no further pairs
  std::string output = "build/bench";
};

/// Reads the arguments that follow the program's name. Returns nothing when they ask for help or
/// the version, which are then on standard output. Throws commandline::UsageError.
std::optional<Options> ParseOptions(const std::vector<std::string>& arguments);

} // namespace orva::bench

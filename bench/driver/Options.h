#pragma once

#include <chrono>
#include <stdexcept>
#include <string>
#include <vector>

namespace orva::bench {

/// What is measured.
struct Options {
  std::vector<long long> sizes{10'000, 100'000, 1'000'000}; ///< files of a catalog, ascending
  std::vector<std::string> shapes{"unique", "camera", "flat", "deep", "restamped", "folders"};
  int pairs = 5;
  std::chrono::seconds limit{120};  ///< after which a merge is given up
  std::chrono::seconds budget{120}; ///< after which one measurement makes no further pairs
  std::string output = "build/bench";
  bool help = false;
};

extern const char* const HELP;

/// Throws std::invalid_argument with a message for the user.
Options ParseOptions(const std::vector<std::string>& arguments);

} // namespace orva::bench

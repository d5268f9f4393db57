#pragma once

#include <string>

namespace orva::commandline {

/// "1 file", "2 files".
inline std::string Count(long long number, const std::string& noun) {
  return std::to_string(number) + ' ' + noun + (number == 1 ? "" : "s");
}

} // namespace orva::commandline

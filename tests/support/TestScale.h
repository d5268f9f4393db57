#pragma once

#include <cstdlib>
#include <fstream>
#include <string>

namespace orva::test {

/// Whether `scripts/test --extended` runs the tests: in their long form, which takes minutes.
inline bool IsExtended() {
  return std::getenv("ORVA_TEST_EXTENDED") != nullptr;
}

/// How much of something a test does: `brief` in the ordinary run, `extended` in the long one.
template <typename Number>
Number TestScale(Number brief, Number extended) {
  return IsExtended() ? extended : brief;
}

/// Leaves a figure for the reliability document in the file that `scripts/test` names, one line
/// "name: value" each.
inline void ReportFigure(const std::string& name, const std::string& value) {
  const char* const path = std::getenv("ORVA_TEST_FIGURES");
  if (path != nullptr) {
    std::ofstream(path, std::ios::app) << name + ": " + value + "\n";
  }
}

} // namespace orva::test

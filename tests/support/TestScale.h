#pragma once

#include <cstdlib>
#include <fstream>
#include <string>

namespace orva::test {

/// Whether the tests run in their long form, which takes minutes (`scripts/test --extended`).
inline bool IsExtended() {
  return std::getenv("ORVA_TEST_EXTENDED") != nullptr;
}

/// The number of repetitions, bytes and so on: `brief` in the short form, `extended` in the long
/// one.
template <typename Number>
Number TestScale(Number brief, Number extended) {
  return IsExtended() ? extended : brief;
}

/// Appends the line "name: value" to the file that `scripts/test` names. The reliability page has
/// these figures.
inline void ReportFigure(const std::string& name, const std::string& value) {
  const char* const path = std::getenv("ORVA_TEST_FIGURES");
  if (path != nullptr) {
    std::ofstream(path, std::ios::app) << name + ": " + value + "\n";
  }
}

} // namespace orva::test

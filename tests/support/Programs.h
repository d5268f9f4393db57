#pragma once

#include <string>

namespace orva::test {

/// The directory of the programs under test: the one that the environment names as
/// ORVA_TEST_PROGRAMS (the `bin` of a build directory), otherwise the directory of the test program
/// itself. Throws std::runtime_error.
const std::string& ProgramDirectory();

/// The path of the program or preloaded library `name` in that directory. Throws std::runtime_error
/// when there is no such file.
std::string ProgramPath(const std::string& name);

/// The sanitizer that the programs under test were built with. A sanitized program uses more memory
/// and time, and keeps freed memory.
enum class Sanitizer { None, Address, Thread };
Sanitizer ProgramSanitizer();

inline bool AreProgramsSanitized() {
  return ProgramSanitizer() != Sanitizer::None;
}

} // namespace orva::test

#include "Programs.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

namespace orva::test {

const std::string& ProgramDirectory() {
  static const std::string directory = [] {
    const char* const named = std::getenv("ORVA_TEST_PROGRAMS");
    return named != nullptr
               ? std::string(named)
               : std::filesystem::read_symlink("/proc/self/exe").parent_path().string();
  }();
  return directory;
}

std::string ProgramPath(const std::string& name) {
  std::string path = ProgramDirectory() + "/" + name;
  if (!std::filesystem::exists(path)) {
    throw std::runtime_error("there is no program under test at " + path);
  }
  return path;
}

Sanitizer ProgramSanitizer() {
  static const Sanitizer sanitizer = [] {
    std::ifstream file(ProgramPath("zophotodbmerger"), std::ios::binary);
    const std::string content(std::istreambuf_iterator<char>(file), {});
    // The names of the runtime libraries that the program is linked to.
    if (content.find("libasan.so") != std::string::npos) {
      return Sanitizer::Address;
    }
    return content.find("libtsan.so") != std::string::npos ? Sanitizer::Thread : Sanitizer::None;
  }();
  return sanitizer;
}

} // namespace orva::test

#include "Locator.h"

#include "Failure.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <string_view>
#include <system_error>

namespace orva::zophotos {

namespace {

constexpr const char* LOCATOR = "/tmp/zophotodbmerger.conf";
constexpr std::string_view KEY = "zophotos_db_path=";

[[noreturn]] void ThrowNoDatabase(const std::string& reason) {
  throw Failure(ExitStatus::NoDatabase, "no merged database: " + reason);
}

} // namespace

std::string FindDatabase() {
  // Any user can create something in /tmp. Opening a FIFO would block.
  std::error_code error;
  const auto type = std::filesystem::status(LOCATOR, error).type();
  if (type == std::filesystem::file_type::not_found) {
    ThrowNoDatabase(std::string(LOCATOR) + " does not exist; the daemon creates it when it starts");
  }
  if (type != std::filesystem::file_type::regular) {
    ThrowNoDatabase(std::string(LOCATOR) +
                    " is not a regular file, so the daemon does not write to it");
  }
  std::ifstream file(LOCATOR);
  if (!file) {
    ThrowNoDatabase(std::string(LOCATOR) + " cannot be read");
  }
  // No path is longer, so a huge file is not read to its end.
  std::string line(8192, '\0');
  file.read(line.data(), static_cast<std::streamsize>(line.size()));
  line.resize(static_cast<std::size_t>(file.gcount()));
  line.resize(std::min(line.size(), line.find('\n')));
  if (!line.starts_with(KEY)) {
    ThrowNoDatabase(std::string(LOCATOR) + " does not begin with " + std::string(KEY));
  }
  line.erase(0, KEY.size());
  if (line.empty()) {
    ThrowNoDatabase(std::string(LOCATOR) + " names no database at the moment");
  }
  if (line.find('\0') != std::string::npos) {
    ThrowNoDatabase(std::string(LOCATOR) + " has a NUL byte in its first line");
  }
  return line;
}

} // namespace orva::zophotos

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
  // Anybody can make something there, and a FIFO would be waited for.
  std::error_code error;
  const auto type = std::filesystem::status(LOCATOR, error).type();
  if (type == std::filesystem::file_type::not_found) {
    ThrowNoDatabase(std::string("there is no file ") + LOCATOR +
                    ", which the daemon writes when it starts");
  }
  if (type != std::filesystem::file_type::regular) {
    ThrowNoDatabase(std::string(LOCATOR) +
                    " is not a regular file, so that the daemon does not write it");
  }
  std::ifstream file(LOCATOR);
  if (!file) {
    ThrowNoDatabase(std::string(LOCATOR) + " cannot be read");
  }
  // Whoever wrote it: no path is longer.
  std::string line(8192, '\0');
  file.read(line.data(), static_cast<std::streamsize>(line.size()));
  line.resize(static_cast<std::size_t>(file.gcount()));
  line.resize(std::min(line.size(), line.find('\n')));
  if (!line.starts_with(KEY)) {
    ThrowNoDatabase(std::string(LOCATOR) + " has no " + std::string(KEY) + " in its first line");
  }
  line.erase(0, KEY.size());
  if (line.empty()) {
    ThrowNoDatabase(std::string(LOCATOR) + " names none at this moment");
  }
  if (line.find('\0') != std::string::npos) {
    ThrowNoDatabase(std::string(LOCATOR) + " has a NUL in its first line, which no path has");
  }
  return line;
}

} // namespace orva::zophotos

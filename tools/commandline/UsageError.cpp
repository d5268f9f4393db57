#include "commandline/UsageError.h"

#include <array>
#include <cstdio>
#include <iostream>
#include <utility>

namespace orva::commandline {

UsageError::UsageError(const std::string& message, std::string command)
    : std::runtime_error(message), command_(std::move(command)) {}

std::string EscapeControls(const std::string& text) {
  std::string escaped;
  for (const char character : text) {
    const auto byte = static_cast<unsigned char>(character);
    if (byte >= 0x20 && byte != 0x7F) {
      escaped += character;
      continue;
    }
    std::array<char, 5> code{};
    std::snprintf(code.data(), code.size(), "\\x%02x", byte);
    escaped += code.data();
  }
  return escaped;
}

void Report(const UsageError& error, const std::function<std::string(const std::string&)>& escape) {
  const std::string& command = error.Command();
  std::cerr << command.substr(0, command.find(' ')) << ": " << escape(error.what()) << "\nTry '"
            << command << " --help'.\n";
}

} // namespace orva::commandline

#include "service/Log.h"

#include "orvautil/FormatString.h"

#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <iostream>

namespace orva::service {
namespace {

void Log(int level, const std::string& text) {
  syslog(LOG_LOCAL1 | level, "%s", text.c_str());
  static const bool isTerminal = isatty(STDERR_FILENO) == 1;
  if (isTerminal) {
    // At once, because threads write in between.
    std::cerr << std::string(program_invocation_short_name) + ": " + text + '\n';
  }
}

} // namespace

void LogInfo(const std::string& text) {
  Log(LOG_INFO, text);
}

void LogError(const std::string& text) {
  Log(LOG_ERR, text);
}

std::string Printable(std::string_view bytes) {
  constexpr std::string_view MORE = "...";
  std::string text;
  std::size_t shortened = 0; // the length that leaves room for MORE
  for (const char byte : bytes) {
    if (byte >= ' ' && byte <= '~' && byte != '\\') {
      text += byte;
    } else {
      text += util::FormatString("\\x%02x", static_cast<unsigned char>(byte));
    }
    if (text.size() > LONGEST_PRINTABLE) {
      text.resize(shortened);
      text += MORE;
      break;
    }
    if (text.size() <= LONGEST_PRINTABLE - MORE.size()) {
      shortened = text.size();
    }
  }
  return text;
}

} // namespace orva::service

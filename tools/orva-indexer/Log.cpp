#include "Log.h"

#include "orvautil/FormatString.h"

#include <syslog.h>
#include <unistd.h>

#include <iostream>

namespace orva::indexer {
namespace {

void Log(int level, const std::string& text) {
  syslog(LOG_LOCAL1 | level, "%s", text.c_str());
  if (isatty(STDERR_FILENO) == 1) {
    std::cerr << "orva-indexer: " << text << std::endl;
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
  std::string text;
  for (const char byte : bytes) {
    if (byte >= ' ' && byte <= '~' && byte != '\\') {
      text += byte;
    } else {
      text += util::FormatString("\\x%02x", static_cast<unsigned char>(byte));
    }
  }
  return text;
}

} // namespace orva::indexer

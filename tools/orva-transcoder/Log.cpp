#include "Log.h"

#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <iostream>

namespace orva::transcoder {

void Log(int priority, const std::string& line) {
  syslog(LOG_LOCAL1 | priority, "%s", line.c_str());
  static const bool isTerminal = isatty(STDERR_FILENO) == 1;
  if (isTerminal) {
    std::cerr << "orva-transcoder: " + line + '\n';
  }
}

std::string Printable(std::string_view text) {
  constexpr std::size_t LONGEST = 200;
  std::string line(text.substr(0, LONGEST));
  std::ranges::replace_if(
      line, [](unsigned char c) { return c < 0x20 || c >= 0x7F; }, '.');
  return text.size() > LONGEST ? line + "..." : line;
}

} // namespace orva::transcoder

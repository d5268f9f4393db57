#include "KnownLines.h"

#include <syslog.h>

#include <algorithm>
#include <fstream>
#include <regex>
#include <stdexcept>
#include <string_view>

namespace orva::test {

namespace {

bool Gives(std::string_view format, std::string_view text);

/// Whether `text` is a number made of `digits`, followed by what `rest` gives.
bool GivesAfterNumber(std::string_view rest, std::string_view text, std::string_view digits) {
  const std::size_t length = std::min(text.find_first_not_of(digits), text.size());
  return length > 0 && Gives(rest, text.substr(length));
}

/// Whether printf can make `text` from `format`.
bool Gives(std::string_view format, std::string_view text) {
  if (format.empty()) {
    return text.empty();
  }
  if (format.starts_with("%lf")) {
    return GivesAfterNumber(format.substr(3), text, "0123456789.");
  }
  if (format.starts_with("%d")) {
    return GivesAfterNumber(format.substr(2), text, "0123456789");
  }
  if (format.starts_with("%s")) {
    for (std::size_t length = 0; length <= text.size(); ++length) {
      if (Gives(format.substr(2), text.substr(length))) {
        return true;
      }
    }
    return false;
  }
  return text.starts_with(format.front()) && Gives(format.substr(1), text.substr(1));
}

} // namespace

KnownLines::KnownLines(const std::string& page) {
  static const std::regex ROW(R"(\| `([^`]*)` \| (info|error) \| .*)");
  std::ifstream file(page);
  bool inSection = false;
  for (std::string line; std::getline(file, line);) {
    std::smatch cells;
    if (line.starts_with("## ")) {
      inSection = line == "## The system log";
    } else if (inSection && line.starts_with("| `")) {
      if (!std::regex_match(line, cells, ROW)) {
        throw std::runtime_error("not a row of a format and its level: " + line);
      }
      // As the page says: the first two lines have the default facility.
      const int facility = formats_.size() < 2 ? LOG_USER : LOG_LOCAL1;
      const int level = cells[2] == "error" ? LOG_ERR : LOG_INFO;
      formats_.push_back(
          {facility | level, std::regex_replace(cells[1].str(), std::regex(R"(\\n)"), "\n")});
    }
  }
  if (formats_.empty()) {
    throw std::runtime_error("no log lines in " + page);
  }
}

bool KnownLines::Contains(const LogLine& line) const {
  return std::any_of(formats_.begin(), formats_.end(), [&](const Format& format) {
    return format.priority == line.priority && Gives(format.text, line.text);
  });
}

} // namespace orva::test

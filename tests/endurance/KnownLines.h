#pragma once

#include "Syslog.h"

#include <string>
#include <vector>

namespace orva::test {

/// The lines that the operations page says the daemon writes to the system log.
class KnownLines {
public:
  /// Reads the tables of the section "The system log" of the page. A row is "| `format` | level |"
  /// and so on. Throws std::runtime_error.
  explicit KnownLines(const std::string& page);

  /// Whether a row has a format that gives this line's text, and its level.
  bool Contains(const LogLine& line) const;

private:
  struct Format {
    int priority;
    std::string text; ///< as for printf
  };

  std::vector<Format> formats_;
};

} // namespace orva::test

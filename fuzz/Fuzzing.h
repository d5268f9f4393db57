#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

// What the fuzz targets share. A target runs in a private root (scripts/fuzz). Linking this
// replaces the system's syslog: lines are formatted, so that the sanitizers see their arguments,
// and kept for the target.

/// The two functions of a target; the fuzzer calls them by these names.
extern "C" int LLVMFuzzerInitialize(int* count, char*** arguments);
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace orva::fuzz {

struct LogLine {
  int priority;
  std::string text;

  bool operator==(const LogLine&) const = default;
};

/// What was logged since the last call; by one thread at a time.
std::vector<LogLine> TakeLog();

/// Makes standard output a file in memory, and empties that when called again.
void ResetStandardOutput();

/// Unless `holds`, ends the process, which makes the input a finding. `what` says what should hold.
void Require(bool holds, const char* what);

} // namespace orva::fuzz

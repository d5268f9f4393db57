#pragma once

#include <string>
#include <string_view>

// The indexer's log: the system log, and standard error when that is a terminal. Only on the
// program's thread.
namespace orva::indexer {

void LogInfo(const std::string& text);
void LogError(const std::string& text);

/// `bytes` on one line: control characters, backslashes and bytes above 7F are escaped.
std::string Printable(std::string_view bytes);

} // namespace orva::indexer

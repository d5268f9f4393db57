#pragma once

#include <cstddef>
#include <string>
#include <string_view>

// The log of the indexer and the transcoder: the system log, and standard error when that is a
// terminal. Any thread.
namespace orva::service {

void LogInfo(const std::string& text);
void LogError(const std::string& text);

/// How many characters Printable returns at most.
inline constexpr std::size_t LONGEST_PRINTABLE = 1000;

/// `bytes`, which are untrusted, on one line: control characters, backslashes and bytes above 7E
/// are escaped as "\x0a". A longer text is shortened, between two escapes, and ends in "...".
std::string Printable(std::string_view bytes);

} // namespace orva::service

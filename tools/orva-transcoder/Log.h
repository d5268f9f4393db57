#pragma once

#include <string>
#include <string_view>

namespace orva::transcoder {

/// Writes a line to the system log and, on a terminal, to standard error. `priority` as in
/// syslog(3). Any thread.
void Log(int priority, const std::string& line);

/// `text`, which is untrusted, as one line: shortened, with a dot for each byte that is not
/// printable ASCII.
std::string Printable(std::string_view text);

} // namespace orva::transcoder

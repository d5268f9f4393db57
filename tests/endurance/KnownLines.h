#pragma once

#include "Syslog.h"

namespace orva::test {

/// Whether the daemon has a format that makes this line of the system log.
bool IsKnown(const LogLine& line);

} // namespace orva::test

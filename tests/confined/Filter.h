#pragma once

#include "Unit.h"

#include <string>

namespace orva::test {

/// Has the kernel refuse the system calls that the unit forbids, for good: what is not on its list
/// ends the process, and the restrictions that look at arguments answer with an error, as systemd
/// has it. `groups` is the file with what `systemd-analyze syscall-filter` prints. Throws
/// std::runtime_error.
void FilterSystemCalls(const Unit& unit, const std::string& groups);

} // namespace orva::test

#pragma once

#include "Unit.h"

#include <string>

namespace orva::test {

/// Gives the process a root in which only those places can be written and seen that the unit
/// leaves, and its namespaces. What is mounted outside later is mounted there as well; to that end
/// the mounts outside become shared, as they are on a host. `kept` can be seen in any case. Throws
/// std::system_error.
void ConfineRoot(const Unit& unit, const std::string& kept);

} // namespace orva::test

#pragma once

#include <chrono>

namespace orva::test {

/// How long a test waits for an event that must happen. Only a broken daemon makes a test wait this
/// long; no test depends on the time that an event takes.
constexpr std::chrono::seconds DEADLINE{60};

} // namespace orva::test

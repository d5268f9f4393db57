#pragma once

#include <chrono>

namespace orva::test {

/// How long a test waits for what must happen. No test depends on how long it takes: only a
/// broken daemon makes one wait this long.
constexpr std::chrono::seconds DEADLINE{60};

} // namespace orva::test

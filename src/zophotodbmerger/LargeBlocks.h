#pragma once

#include <memory_resource>

namespace orva::dbmerger {

/// Memory for lists of millions of rows. Asks the system for huge pages: the first use of each page
/// takes time. Any thread.
std::pmr::memory_resource* LargeBlocks() noexcept;

} // namespace orva::dbmerger

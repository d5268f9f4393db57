#pragma once

#include <memory_resource>

namespace orva::dbmerger {

/// Memory for lists of millions of rows: asks the system for huge pages, which saves most of the
/// time that first uses of pages take. Any thread.
std::pmr::memory_resource* LargeBlocks() noexcept;

} // namespace orva::dbmerger

#pragma once

#include "CraftedDatabase.h"

#include <cstdint>
#include <map>
#include <string>

namespace orva::test {

/// A rollback journal as a crashed program leaves it: its rollback writes `pages` (by number) to
/// the database, resizes that to `pageCount` pages, and then deletes the file `superJournal`, if
/// given.
Bytes CraftedJournal(std::uint32_t pageSize, std::uint32_t pageCount,
                     const std::map<std::uint32_t, Bytes>& pages,
                     const std::string& superJournal = "");

/// A write-ahead log of one transaction with valid checksums: `pages` by number, after which the
/// database has `pageCount` pages.
Bytes CraftedWal(std::uint32_t pageSize, std::uint32_t pageCount,
                 const std::map<std::uint32_t, Bytes>& pages);

} // namespace orva::test

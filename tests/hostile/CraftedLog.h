#pragma once

#include "CraftedDatabase.h"

#include <cstdint>
#include <map>
#include <string>

namespace orva::test {

/// A rollback journal that SQLite takes for that of a crashed program: playing it back puts
/// `pages` (by number) into the database and cuts or stretches that to `pageCount` pages. With a
/// `superJournal` it names a file that is removed after that.
Bytes CraftedJournal(std::uint32_t pageSize, std::uint32_t pageCount,
                     const std::map<std::uint32_t, Bytes>& pages,
                     const std::string& superJournal = "");

/// A write-ahead log with one transaction, with right checksums: `pages` by number, after which
/// the database has `pageCount` pages.
Bytes CraftedWal(std::uint32_t pageSize, std::uint32_t pageCount,
                 const std::map<std::uint32_t, Bytes>& pages);

} // namespace orva::test

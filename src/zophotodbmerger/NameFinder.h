#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace orva::dbmerger {

class PhotoDB;

/// A file of the merged database.
struct FoundFile {
  std::uint32_t name = 0; ///< which of the names
  bool isOwn = false;     ///< on the volume that is merged
  long long id = 0;
  long long folderId = 0;
};

/// Finds the files with one of `names` in the folders with these ids. Two searches take turns, row
/// by row: one through the folders and one through the files of each name, whatever their folder.
/// The first to finish has the answer, so the cost is at most twice that of the better one. `names`
/// are sorted and different. For a database with the own schema. Throws std::string.
std::vector<FoundFile> FindNames(const PhotoDB& photos, const std::string& volume,
                                 std::span<const std::string_view> names,
                                 std::span<const long long> folderIds);

} // namespace orva::dbmerger

#pragma once

#include "File.h"
#include "Folder.h"

#include "orvautil/OwnerVector.h"

#include <cstdint>
#include <string>
#include <vector>

namespace orva::db {
class File;
class Folder;
} // namespace orva::db

namespace orva::dbmerger {

/// The folder that DiffFolder compares, and what it finds. Refers to the caller's values; owns the
/// records found.
struct FolderDiffProcessor {
  const std::int64_t& parent;   ///< id of the folder compared: the parent of new folders
  const std::string& extraText; ///< has no effect
  const std::string& volume;    ///< mount point that new records carry

  util::OwnerVector<Folder> added{};   ///< only in the catalog: new records
  util::OwnerVector<Folder> removed{}; ///< only in the merged database: copies
  util::OwnerVector<Folder> changed{}; ///< for callers; DiffFolder leaves it empty
  util::OwnerVector<Folder> common{};  ///< in both: copies of the merged record
};

/// The same for DiffFile.
struct FileDiffProcessor {
  const std::int64_t& parent;   ///< id of the folder compared: the folder of new files
  const std::string& extraText; ///< has no effect
  const std::string& volume;    ///< mount point that new records carry

  util::OwnerVector<File> added{};   ///< only in the catalog: new records
  util::OwnerVector<File> removed{}; ///< only in the merged database: copies
};

/// Compares the subfolders that the merged database has for a folder with those that the catalog
/// has, and appends the difference to `result`. `merged` must be sorted by `folder_name`,
/// `catalog` by `name`, byte by byte. Any thread; throws only std::bad_alloc.
void DiffFolder(const std::vector<Folder*>& merged, const std::vector<db::Folder*>& catalog,
                FolderDiffProcessor& result);

/// The same for the files of a folder, both lists sorted by `name`. A file on both sides gives no
/// result, whatever its dates.
void DiffFile(const std::vector<File*>& merged, const std::vector<db::File*>& catalog,
              FileDiffProcessor& result);

} // namespace orva::dbmerger

#pragma once

#include "MergeList.h"

#include "orvautil/OwnerVector.h"

#include <ctime>
#include <string>

namespace orva::db {
class File;
class Folder;
class VolumeDB;
} // namespace orva::db

namespace orva::dbmerger {

/// Photos of a catalog that are visible and not deleted.
struct PhotoCounts {
  int transcoded = 0; ///< with a finished rendition
  int total = 0;
};

// Reads of a catalog. Each takes the volume's mount point and its open catalog, and does
// not change the catalog. Lists have full paths, made from the catalog's relative ones, and are
// sorted by them (FolderItemCmp). A failed step ends a list early; committing the transaction of
// the reads then fails. Throws std::string.

/// The visible folders, deleted ones included, and a first one for the volume's root, whose path
/// is the mount point as given.
util::OwnerVector<db::Folder> ReadFolders(const std::string& volumeMountPoint,
                                          const db::VolumeDB& catalog);

/// The files that appeared with a finished rendition, or disappeared with a withdrawn one,
/// strictly after `since`.
util::OwnerVector<db::File> ReadChangedFiles(const std::string& volumeMountPoint,
                                             const db::VolumeDB& catalog, std::time_t since);

// The same lists in the form that a merge uses.

MergeList ListFolders(const std::string& volumeMountPoint, const db::VolumeDB& catalog);
MergeList ListChangedFiles(const std::string& volumeMountPoint, const db::VolumeDB& catalog,
                           std::time_t since);

PhotoCounts CountPhotos(const std::string& volumeMountPoint, const db::VolumeDB& catalog);

} // namespace orva::dbmerger

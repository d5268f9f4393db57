#pragma once

#include "orvadb/FolderItem.h"

namespace orva::db {

/// A row of a catalog's Folders table.
class Folder : public FolderItem {
public:
  int category = 0;
  std::time_t lastModifiedDate = 0; ///< seconds since the epoch
  bool isBackup = false;
  bool isHidden = false;
  bool isSystem = false;
  bool isDeleted = false; ///< the folder was removed from the volume
  int status = 0;
  std::time_t lastUpdatedDate = 0; ///< seconds since the epoch

  // What is inside, for programs that show a catalog; the merge leaves them zero.
  long long folderCount = 0;
  long long fileCount = 0;

  bool IsBackup() const override { return isBackup; }
  bool IsHidden() const override { return isHidden; }
  bool IsSystem() const override { return isSystem; }
  bool IsDeleted() const override { return isDeleted; }
  int GetItemType() const override { return FOLDER; }
  int GetStatus() const override { return status; }
  std::time_t GetLastModifiedDate() const override { return lastModifiedDate; }
};

} // namespace orva::db

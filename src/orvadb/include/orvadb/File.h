#pragma once

#include "orvadb/FolderItem.h"

namespace orva::db {

/// A row of a catalog's Files table, with the time of its transcoding.
class File : public FolderItem {
public:
  int category = 0;                 ///< 3 is a photo
  std::time_t lastModifiedDate = 0; ///< seconds since the epoch
  bool isBackup = false;
  bool isHidden = false;
  bool isSystem = false;
  bool isDeleted = false; ///< the file was removed from the volume
  int status = 0;
  std::time_t lastUpdatedDate = 0; ///< last change of the transcoding, seconds since the epoch
  std::string ext;                 ///< extension as the catalog stores it
  long long size = 0;              ///< bytes

  bool IsBackup() const override { return isBackup; }
  bool IsHidden() const override { return isHidden; }
  bool IsSystem() const override { return isSystem; }
  bool IsDeleted() const override { return isDeleted; }
  int GetItemType() const override { return FILE; }
  int GetStatus() const override { return status; }
  std::time_t GetLastModifiedDate() const override { return lastModifiedDate; }
};

} // namespace orva::db

#pragma once

#include "orvadb/DBObject.h"

#include <ctime>
#include <string>

namespace orva::db {

/// What the folders and the files of a catalog have in common. Plain data: read and written
/// directly.
class FolderItem : public DBObject {
public:
  /// The kinds of rows.
  enum ItemType : int { FOLDER = 1, FILE = 2 };

  long long id = -1;       ///< row identifier in the catalog; -1 when not yet a row
  long long folderId = -1; ///< its folder's id; -1 when unknown or directly in the volume's root
  std::string path;        ///< full path
  std::string name;        ///< last component of the path

  long long GetId() const override { return id; }
  std::string GetTableName() const override { return GetTableName(GetItemType()); }

  /// Table that holds rows of the kind `itemType`; empty for an unknown kind.
  static std::string GetTableName(int itemType);

  virtual std::time_t GetLastModifiedDate() const = 0;
};

} // namespace orva::db

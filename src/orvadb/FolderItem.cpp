#include "orvadb/FolderItem.h"

namespace orva::db {

std::string FolderItem::GetTableName(int itemType) {
  switch (itemType) {
  case FOLDER:
    return "Folders";
  case FILE:
    return "Files";
  default:
    return {};
  }
}

} // namespace orva::db

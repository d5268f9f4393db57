#include "orvadb/File.h"
#include "orvadb/Folder.h"

#include <gtest/gtest.h>

#include <type_traits>

namespace orva::db {
namespace {

static_assert(std::has_virtual_destructor_v<DBObject>);
static_assert(std::is_base_of_v<DBObject, FolderItem>);
static_assert(std::is_abstract_v<FolderItem>);

TEST(FolderItem, ANewObjectIsNotARow) {
  const Folder folder;
  EXPECT_EQ(folder.id, -1);
  EXPECT_EQ(folder.folderId, -1);
  EXPECT_EQ(folder.path, "");
  EXPECT_EQ(folder.name, "");
  EXPECT_EQ(folder.lastModifiedDate, 0);
  const File file;
  EXPECT_EQ(file.GetId(), -1);
  EXPECT_EQ(file.folderId, -1);
  EXPECT_EQ(file.lastModifiedDate, 0);
  EXPECT_EQ(file.size, 0);
}

TEST(FolderItem, EachKindOfRowHasItsTable) {
  EXPECT_EQ(FolderItem::GetTableName(FolderItem::FOLDER), "Folders");
  EXPECT_EQ(FolderItem::GetTableName(FolderItem::FILE), "Files");
  EXPECT_EQ(FolderItem::GetTableName(0), "");
  EXPECT_EQ(FolderItem::GetTableName(-1), "");
  const Folder folder;
  const File file;
  const DBObject* row = &folder;
  EXPECT_EQ(row->GetTableName(), "Folders");
  row = &file;
  EXPECT_EQ(row->GetTableName(), "Files");
  EXPECT_NE(folder.GetItemType(), file.GetItemType());
}

/// The row's own operations show its members.
template <typename Row>
void ExpectOperationsToShowMembers() {
  Row row;
  row.id = 1LL << 40;
  row.status = 3;
  row.lastModifiedDate = 1LL << 33;
  EXPECT_EQ(row.GetId(), 1LL << 40);
  EXPECT_EQ(row.GetStatus(), 3);
  EXPECT_EQ(row.GetLastModifiedDate(), 1LL << 33);

  EXPECT_FALSE(row.IsBackup() || row.IsHidden() || row.IsSystem() || row.IsDeleted());
  row.isBackup = true;
  EXPECT_TRUE(row.IsBackup() && !row.IsHidden() && !row.IsSystem() && !row.IsDeleted());
  row.isBackup = false;
  row.isHidden = true;
  EXPECT_TRUE(!row.IsBackup() && row.IsHidden() && !row.IsSystem() && !row.IsDeleted());
  row.isHidden = false;
  row.isSystem = true;
  EXPECT_TRUE(!row.IsBackup() && !row.IsHidden() && row.IsSystem() && !row.IsDeleted());
  row.isSystem = false;
  row.isDeleted = true;
  EXPECT_TRUE(!row.IsBackup() && !row.IsHidden() && !row.IsSystem() && row.IsDeleted());
}

TEST(FolderItem, AFolderShowsItsMembers) {
  ExpectOperationsToShowMembers<Folder>();
}

TEST(FolderItem, AFileShowsItsMembers) {
  ExpectOperationsToShowMembers<File>();
}

} // namespace
} // namespace orva::db

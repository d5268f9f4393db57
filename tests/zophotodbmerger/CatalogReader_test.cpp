#include "CatalogReader.h"

#include "Catalog.h"
#include "FolderItemCmp.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace orva::test {
namespace {

using dbmerger::CountPhotos;
using dbmerger::PhotoCounts;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr const char* MOUNT_POINT = "/shares/Vol/";
constexpr long MORE_THAN_32_BITS = 4294967301; // 2^32 + 5

class CatalogReaderTest : public ::testing::Test {
protected:
  util::OwnerVector<db::Folder> ReadFolders(const std::string& mountPoint = MOUNT_POINT) const {
    return dbmerger::ReadFolders(mountPoint, db::VolumeDB(mountPoint, false));
  }

  util::OwnerVector<db::File> ReadChangedFiles(std::time_t since) const {
    return dbmerger::ReadChangedFiles(MOUNT_POINT, db::VolumeDB(MOUNT_POINT, false), since);
  }

  PhotoCounts Count() const { return CountPhotos(MOUNT_POINT, db::VolumeDB(MOUNT_POINT, false)); }

  Catalog catalog{MOUNT_POINT};
};

template <typename Item>
std::vector<std::string> Paths(const util::OwnerVector<Item>& items) {
  std::vector<std::string> paths;
  for (const Item* const item : items) {
    paths.push_back(item->path);
  }
  return paths;
}

TEST_F(CatalogReaderTest, EmptyCatalogHasOnlyTheRoot) {
  const auto folders = ReadFolders();
  ASSERT_EQ(1U, folders.size());
  const db::Folder& root = *folders.front();
  EXPECT_EQ(-1, root.id);
  EXPECT_EQ(-1, root.folderId);
  EXPECT_EQ("/shares/Vol/", root.path);
  EXPECT_EQ("", root.name);
  EXPECT_EQ(4, root.category);
  EXPECT_EQ(0, root.lastModifiedDate);
  EXPECT_FALSE(root.isBackup);
  EXPECT_FALSE(root.isHidden);
  EXPECT_FALSE(root.isSystem);
  EXPECT_FALSE(root.isDeleted);
  EXPECT_EQ(0, root.status);
  EXPECT_EQ(-1, root.lastUpdatedDate);
  EXPECT_EQ(0, root.folderCount);
  EXPECT_EQ(0, root.fileCount);
}

TEST_F(CatalogReaderTest, RootKeepsTheMountPointAsGiven) {
  catalog.AddFolder("Pictures/");
  EXPECT_THAT(Paths(ReadFolders("/shares/Vol//")),
              ElementsAre("/shares/Vol//", "/shares/Vol/Pictures/"));
  EXPECT_THAT(Paths(ReadFolders("/shares/Vol")),
              ElementsAre("/shares/Vol", "/shares/Vol/Pictures/"));
}

TEST_F(CatalogReaderTest, EveryColumnOfAFolderIsRead) {
  catalog.Add(FolderRow{.id = 5'000'000'001,
                        .folderId = 5'000'000'002,
                        .path = "Pictures/",
                        .name = "Pictures",
                        .category = 6,
                        .lastModifiedDate = 1234,
                        .isDeleted = true,
                        .status = 8,
                        .lastUpdatedDate = 5678});
  const auto folders = ReadFolders();
  ASSERT_EQ(2U, folders.size());
  const db::Folder& folder = *folders[1];
  EXPECT_EQ(5'000'000'001, folder.id);
  EXPECT_EQ(5'000'000'002, folder.folderId);
  EXPECT_EQ("/shares/Vol/Pictures/", folder.path);
  EXPECT_EQ("Pictures", folder.name);
  EXPECT_EQ(6, folder.category);
  EXPECT_EQ(1234, folder.lastModifiedDate);
  EXPECT_FALSE(folder.isBackup);
  EXPECT_FALSE(folder.isHidden);
  EXPECT_FALSE(folder.isSystem);
  EXPECT_TRUE(folder.isDeleted);
  EXPECT_EQ(8, folder.status);
  EXPECT_EQ(5678, folder.lastUpdatedDate);
  EXPECT_EQ(0, folder.folderCount);
  EXPECT_EQ(0, folder.fileCount);
}

TEST_F(CatalogReaderTest, InvisibleFoldersAreLeftOut) {
  catalog.AddFolder("backup/", 0, {.backup = true});
  catalog.AddFolder("hidden/", 0, {.hidden = true});
  catalog.AddFolder("system/", 0, {.system = true});
  EXPECT_THAT(Paths(ReadFolders()), ElementsAre("/shares/Vol/"));
}

TEST_F(CatalogReaderTest, DeletedFoldersAreRead) {
  catalog.Add(FolderRow{.id = 1, .path = "deleted/", .isDeleted = true});
  EXPECT_THAT(Paths(ReadFolders()), ElementsAre("/shares/Vol/", "/shares/Vol/deleted/"));
}

TEST_F(CatalogReaderTest, FolderComesBeforeItsContent) {
  catalog.AddFolder("b/c/d/");
  catalog.AddFolder("b/c/");
  catalog.AddFolder("\xC3\xA9/");
  catalog.AddFolder("b-1/");
  catalog.AddFolder("b/");
  catalog.AddFolder("B/");
  EXPECT_THAT(Paths(ReadFolders()),
              ElementsAre("/shares/Vol/", "/shares/Vol/B/", "/shares/Vol/b-1/", "/shares/Vol/b/",
                          "/shares/Vol/b/c/", "/shares/Vol/b/c/d/", "/shares/Vol/\xC3\xA9/"));
}

TEST_F(CatalogReaderTest, FurtherColumnsOfAFolderAreIgnored) {
  catalog.Rows().Run("ALTER TABLE Folders ADD COLUMN cover TEXT");
  catalog.Rows().Run(
      "INSERT INTO Folders VALUES(1, -1, 'Pictures/', 'Pictures', 4, 12, 0, 0, 0, 0, "
      "2, 34, 'cover.jpg')");
  const auto folders = ReadFolders();
  ASSERT_EQ(2U, folders.size());
  EXPECT_EQ("Pictures", folders[1]->name);
  EXPECT_EQ(34, folders[1]->lastUpdatedDate);
  EXPECT_EQ(0, folders[1]->fileCount);
}

TEST_F(CatalogReaderTest, FolderTimesAreSigned32BitNumbers) {
  catalog.Add(FolderRow{
      .path = "a/", .lastModifiedDate = MORE_THAN_32_BITS, .lastUpdatedDate = 2147483648});
  const auto folders = ReadFolders();
  ASSERT_EQ(2U, folders.size());
  EXPECT_EQ(5, folders[1]->lastModifiedDate);
  EXPECT_EQ(-2147483648L, folders[1]->lastUpdatedDate);
}

TEST_F(CatalogReaderTest, EveryColumnOfAFileIsRead) {
  catalog.Add(FileRow{.id = 5'000'000'001,
                      .folderId = 5'000'000'002,
                      .path = "Pictures/a.jpg",
                      .name = "a.jpg",
                      .category = 9,
                      .lastModifiedDate = 1234,
                      .isBackup = true,
                      .isHidden = true,
                      .isSystem = true,
                      .status = 8,
                      .lastUpdatedDate = 4321,
                      .ext = "jpg",
                      .size = 6'000'000'000});
  catalog.Add(TranscodingRow{.sourceId = 5'000'000'001, .lastUpdatedDate = 5678});
  const auto files = ReadChangedFiles(0);
  ASSERT_EQ(1U, files.size());
  const db::File& file = *files.front();
  EXPECT_EQ(5'000'000'001, file.id);
  EXPECT_EQ(5'000'000'002, file.folderId);
  EXPECT_EQ("/shares/Vol/Pictures/a.jpg", file.path);
  EXPECT_EQ("a.jpg", file.name);
  EXPECT_EQ(9, file.category);
  EXPECT_EQ(1234, file.lastModifiedDate);
  EXPECT_TRUE(file.isBackup);
  EXPECT_TRUE(file.isHidden);
  EXPECT_TRUE(file.isSystem);
  EXPECT_FALSE(file.isDeleted);
  EXPECT_EQ(8, file.status);
  EXPECT_EQ(5678, file.lastUpdatedDate) << "the time of the transcoding, not of the file";
  EXPECT_EQ("jpg", file.ext);
  EXPECT_EQ(6'000'000'000, file.size);
}

TEST_F(CatalogReaderTest, FileTimesAreSigned32BitNumbers) {
  catalog.AddPhoto("a", MORE_THAN_32_BITS, 2147483648);
  const auto files = ReadChangedFiles(0);
  ASSERT_EQ(1U, files.size());
  EXPECT_EQ(5, files.front()->lastModifiedDate);
  EXPECT_EQ(-2147483648L, files.front()->lastUpdatedDate);
}

TEST_F(CatalogReaderTest, OnlyTranscodingsStrictlyAfterTheTimeAreRead) {
  catalog.AddPhoto("a", 0, 99);
  catalog.AddPhoto("b", 0, 100);
  catalog.AddPhoto("c", 0, 101);
  EXPECT_THAT(Paths(ReadChangedFiles(100)), ElementsAre("/shares/Vol/c"));
}

TEST_F(CatalogReaderTest, FirstReadHasEveryTranscodingAfterTheEpoch) {
  catalog.AddPhoto("a", 0, 0);
  catalog.AddPhoto("b", 0, 1);
  catalog.AddPhoto("c", 0, 2'000'000'000);
  EXPECT_THAT(Paths(ReadChangedFiles(0)), ElementsAre("/shares/Vol/b", "/shares/Vol/c"));
}

TEST_F(CatalogReaderTest, TimeOfAReadIsComparedIn64Bits) {
  catalog.AddPhoto("a", 0, 5'000'000'000);
  catalog.AddPhoto("b", 0, 5'000'000'001);
  EXPECT_THAT(Paths(ReadChangedFiles(5'000'000'000)), ElementsAre("/shares/Vol/b"));
}

TEST_F(CatalogReaderTest, OnlyTranscodingsOfTheProfileAreRead) {
  catalog.AddPhoto("a", 0, 10);
  catalog.Add(FileRow{.id = 2, .path = "b"});
  catalog.Add(TranscodingRow{
      .sourceId = 2, .lastUpdatedDate = 10, .profile = "cb62bbdd389b48898f2e5244977cb2c6"});
  catalog.Add(FileRow{.id = 3, .path = "without"});
  EXPECT_THAT(Paths(ReadChangedFiles(0)), ElementsAre("/shares/Vol/a"));
}

TEST_F(CatalogReaderTest, FinishedTranscodingsOfPresentFilesAndWithdrawnOnesOfDeletedFilesAreRead) {
  for (const bool deleted : {false, true}) {
    for (const long status : {-1, 0, 1, 2, 3}) {
      const long id = 10 * static_cast<long>(deleted) + status + 2;
      const std::string name = (deleted ? "deleted" : "present") + std::to_string(status);
      catalog.Add(FileRow{.id = id, .path = name, .isDeleted = deleted});
      catalog.Add(TranscodingRow{.sourceId = id, .lastUpdatedDate = 10, .status = status});
    }
  }
  const auto files = ReadChangedFiles(0);
  EXPECT_THAT(Paths(files), ElementsAre("/shares/Vol/deleted0", "/shares/Vol/present1"));
  EXPECT_TRUE(files[0]->isDeleted);
  EXPECT_FALSE(files[1]->isDeleted);
}

TEST_F(CatalogReaderTest, FilesOfAnyFlagsAndCategoryAreRead) {
  catalog.Add(FileRow{.id = 1, .path = "backup", .isBackup = true});
  catalog.Add(FileRow{.id = 2, .path = "hidden", .isHidden = true});
  catalog.Add(FileRow{.id = 3, .path = "song", .category = 1});
  catalog.Add(FileRow{.id = 4, .path = "system", .isSystem = true});
  for (const long id : {1, 2, 3, 4}) {
    catalog.Add(TranscodingRow{.sourceId = id, .lastUpdatedDate = 10});
  }
  EXPECT_THAT(Paths(ReadChangedFiles(0)), ElementsAre("/shares/Vol/backup", "/shares/Vol/hidden",
                                                      "/shares/Vol/song", "/shares/Vol/system"));
}

TEST_F(CatalogReaderTest, FileIsReadOncePerTranscoding) {
  catalog.AddPhoto("a", 0, 10);
  catalog.Add(TranscodingRow{.sourceId = 1, .lastUpdatedDate = 20});
  EXPECT_THAT(Paths(ReadChangedFiles(0)), ElementsAre("/shares/Vol/a", "/shares/Vol/a"));
}

TEST_F(CatalogReaderTest, FilesAreSortedByFullPath) {
  catalog.AddPhoto("b/z.jpg", 0, 10);
  catalog.AddPhoto("b.jpg", 0, 10);
  catalog.AddPhoto("\xC3\xA9.jpg", 0, 10);
  catalog.AddPhoto("b/a.jpg", 0, 10);
  catalog.AddPhoto("Z.jpg", 0, 10);
  EXPECT_THAT(Paths(ReadChangedFiles(0)),
              ElementsAre("/shares/Vol/Z.jpg", "/shares/Vol/b.jpg", "/shares/Vol/b/a.jpg",
                          "/shares/Vol/b/z.jpg", "/shares/Vol/\xC3\xA9.jpg"));
}

TEST_F(CatalogReaderTest, NullTextsReadAsEmpty) {
  catalog.AddPhoto("a", 0, 10);
  catalog.Rows().Run("UPDATE Files SET name = NULL, ext = NULL");
  const auto files = ReadChangedFiles(0);
  ASSERT_EQ(1U, files.size());
  EXPECT_EQ("", files.front()->name);
  EXPECT_EQ("", files.front()->ext);
}

TEST_F(CatalogReaderTest, EmptyCatalogCountsZero) {
  EXPECT_THAT(Paths(ReadChangedFiles(0)), IsEmpty());
  EXPECT_EQ(0, Count().transcoded);
  EXPECT_EQ(0, Count().total);
}

TEST_F(CatalogReaderTest, PhotosOfStatusThreeCountAsTranscoded) {
  for (const long status : {0, 1, 2, 3, 3, 4}) {
    catalog.Add(FileRow{.status = status});
  }
  EXPECT_EQ(2, Count().transcoded);
  EXPECT_EQ(6, Count().total);
}

TEST_F(CatalogReaderTest, OnlyVisiblePresentPhotosAreCounted) {
  catalog.Add(FileRow{});
  catalog.Add(FileRow{.category = 2});
  catalog.Add(FileRow{.isBackup = true});
  catalog.Add(FileRow{.isHidden = true});
  catalog.Add(FileRow{.isSystem = true});
  catalog.Add(FileRow{.isDeleted = true});
  EXPECT_EQ(1, Count().transcoded);
  EXPECT_EQ(1, Count().total);
}

TEST_F(CatalogReaderTest, MissingCatalogIsThrown) {
  EXPECT_THROW(ReadFolders("/shares"), std::string);
}

TEST_F(CatalogReaderTest, MissingTableIsThrown) {
  catalog.Rows().Run("DROP TABLE Folders");
  catalog.Rows().Run("DROP TABLE Files");
  EXPECT_THROW(ReadFolders(), std::string);
  EXPECT_THROW(ReadChangedFiles(0), std::string);
  EXPECT_THROW(Count(), std::string);
}

TEST_F(CatalogReaderTest, UnreadableRowEndsTheListAndFailsItsTransaction) {
  catalog.AddFolder("a/");
  catalog.AddFolder("b/");
  catalog.AddFolder("c/");
  catalog.Rows().Run("UPDATE Folders SET name = zeroblob(20000000) WHERE id = 3");
  const db::VolumeDB connection(MOUNT_POINT, false);
  db::Transaction transaction(connection, 1000);
  EXPECT_THAT(Paths(dbmerger::ReadFolders(MOUNT_POINT, connection)),
              ElementsAre("/shares/Vol/", "/shares/Vol/a/", "/shares/Vol/b/"));
  EXPECT_THROW(transaction.Commit(), std::string);
}

TEST(FolderItemCmp, PathComesBeforeAllLongerPathsThatBeginWithIt) {
  const dbmerger::FolderItemCmp<db::FolderItem> before;
  db::Folder shorter;
  db::File longer;
  shorter.path = "/shares/Vol/a/";
  longer.path = "/shares/Vol/a/b";
  EXPECT_TRUE(before(&shorter, &longer));
  EXPECT_FALSE(before(&longer, &shorter));
  EXPECT_FALSE(before(&shorter, &shorter));
}

TEST(FolderItemCmp, BytesAreComparedAsUnsigned) {
  const dbmerger::FolderItemCmp<db::FolderItem> before;
  db::Folder ascii;
  db::Folder accented;
  ascii.path = "z";
  accented.path = "\xC3\xA9";
  EXPECT_TRUE(before(&ascii, &accented));
  EXPECT_FALSE(before(&accented, &ascii));
}

} // namespace
} // namespace orva::test

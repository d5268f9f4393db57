#include "Comparison.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>

namespace orva::test {
namespace {

using dbmerger::FileDiffProcessor;
using dbmerger::FolderDiffProcessor;

using MergedFolderList = util::OwnerVector<dbmerger::Folder>;
using MergedFileList = util::OwnerVector<dbmerger::File>;
using CatalogFolderList = util::OwnerVector<db::Folder>;
using CatalogFileList = util::OwnerVector<db::File>;

const std::int64_t PARENT = 42;
const std::string EXTRA_TEXT = "extra";
const std::string VOLUME = "/shares/Vol/";

std::unique_ptr<dbmerger::Folder> MergedFolder(std::int64_t id, const std::string& folderName) {
  return std::make_unique<dbmerger::Folder>(
      dbmerger::Folder{.folder_id = id,
                       .parent_folder_id = 7,
                       .name = "/shares/Old/" + folderName + "/",
                       .folder_name = folderName,
                       .modified_date = 100 + id,
                       .volume = "/shares/Old/"});
}

std::unique_ptr<dbmerger::File> MergedFile(std::int64_t id, const std::string& name) {
  return std::make_unique<dbmerger::File>(dbmerger::File{.file_id = id,
                                                         .folder_id = 7,
                                                         .name = name,
                                                         .modified_date = 100 + id,
                                                         .volume = "/shares/Old/",
                                                         .created_date = 200 + id});
}

template <typename Item>
std::unique_ptr<Item> CatalogItem(const std::string& name, std::time_t modified = 0) {
  auto item = std::make_unique<Item>();
  item->name = name;
  item->path = "/shares/Vol/" + name;
  item->lastModifiedDate = modified;
  return item;
}

template <typename Record>
std::vector<std::string> Names(const util::OwnerVector<Record>& records) {
  std::vector<std::string> names;
  for (const Record* const record : records) {
    if constexpr (std::is_same_v<Record, dbmerger::Folder>) {
      names.push_back(record->folder_name);
    } else {
      names.push_back(record->name);
    }
  }
  return names;
}

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class DiffFolderTest : public ::testing::Test {
protected:
  ~DiffFolderTest() noexcept override = default;

  void Diff() { DiffFolder(merged.Elements(), catalog.Elements(), result); }

  MergedFolderList merged;
  CatalogFolderList catalog;
  FolderDiffProcessor result{.parent = PARENT, .extraText = EXTRA_TEXT, .volume = VOLUME};
};

class DiffFileTest : public ::testing::Test {
protected:
  ~DiffFileTest() noexcept override = default;

  void Diff() { DiffFile(merged.Elements(), catalog.Elements(), result); }

  MergedFileList merged;
  CatalogFileList catalog;
  FileDiffProcessor result{.parent = PARENT, .extraText = EXTRA_TEXT, .volume = VOLUME};
};

TEST_F(DiffFolderTest, EmptyMergedListMakesEveryCatalogFolderNew) {
  catalog.push_back(CatalogItem<db::Folder>("a"));
  catalog.push_back(CatalogItem<db::Folder>("b"));
  Diff();
  EXPECT_THAT(Names(result.added), ElementsAre("a", "b"));
  EXPECT_THAT(Names(result.removed), IsEmpty());
  EXPECT_THAT(Names(result.common), IsEmpty());
}

TEST_F(DiffFolderTest, EmptyCatalogListMakesEveryMergedFolderRemoved) {
  merged.push_back(MergedFolder(1, "a"));
  merged.push_back(MergedFolder(2, "b"));
  Diff();
  EXPECT_THAT(Names(result.removed), ElementsAre("a", "b"));
  EXPECT_THAT(Names(result.added), IsEmpty());
  EXPECT_THAT(Names(result.common), IsEmpty());
}

TEST_F(DiffFolderTest, FoldersAreAssignedToTheSideThatHasThem) {
  for (const char* const name : {"a", "c", "d", "f"}) {
    merged.push_back(MergedFolder(1, name));
  }
  for (const char* const name : {"b", "c", "e", "f", "g"}) {
    catalog.push_back(CatalogItem<db::Folder>(name));
  }
  Diff();
  EXPECT_THAT(Names(result.removed), ElementsAre("a", "d"));
  EXPECT_THAT(Names(result.added), ElementsAre("b", "e", "g"));
  EXPECT_THAT(Names(result.common), ElementsAre("c", "f"));
  EXPECT_TRUE(result.changed.empty());
}

TEST_F(DiffFolderTest, ShorterNameComesFirst) {
  merged.push_back(MergedFolder(1, "Photos"));
  merged.push_back(MergedFolder(2, "Photos2"));
  catalog.push_back(CatalogItem<db::Folder>("Photos2"));
  Diff();
  EXPECT_THAT(Names(result.removed), ElementsAre("Photos"));
  EXPECT_THAT(Names(result.common), ElementsAre("Photos2"));
  EXPECT_THAT(Names(result.added), IsEmpty());
}

TEST_F(DiffFolderTest, NamesAreComparedAsUnsignedBytes) {
  merged.push_back(MergedFolder(1, "z"));
  catalog.push_back(CatalogItem<db::Folder>("z"));
  catalog.push_back(CatalogItem<db::Folder>("\xC3\xA9"));
  Diff();
  EXPECT_THAT(Names(result.common), ElementsAre("z"));
  EXPECT_THAT(Names(result.added), ElementsAre("\xC3\xA9"));
  EXPECT_THAT(Names(result.removed), IsEmpty());
}

TEST_F(DiffFolderTest, NewRecordIsMadeFromTheCatalog) {
  catalog.push_back(CatalogItem<db::Folder>("Pictures", 1234));
  catalog.front()->id = 99;
  catalog.front()->folderId = 98;
  Diff();
  ASSERT_EQ(1U, result.added.size());
  const dbmerger::Folder& folder = *result.added.front();
  EXPECT_EQ(-1, folder.folder_id);
  EXPECT_EQ(PARENT, folder.parent_folder_id);
  EXPECT_EQ("/shares/Vol/Pictures", folder.name);
  EXPECT_EQ("Pictures", folder.folder_name);
  EXPECT_EQ(1234, folder.modified_date);
  EXPECT_EQ(VOLUME, folder.volume);
}

void ExpectCopy(const dbmerger::Folder& original, const dbmerger::Folder& copy) {
  EXPECT_NE(&original, &copy);
  EXPECT_EQ(original.folder_id, copy.folder_id);
  EXPECT_EQ(original.parent_folder_id, copy.parent_folder_id);
  EXPECT_EQ(original.name, copy.name);
  EXPECT_EQ(original.folder_name, copy.folder_name);
  EXPECT_EQ(original.modified_date, copy.modified_date);
  EXPECT_EQ(original.volume, copy.volume);
}

TEST_F(DiffFolderTest, RemovedAndCommonRecordsAreCopiesOfTheMergedOnes) {
  merged.push_back(MergedFolder(1, "a"));
  merged.push_back(MergedFolder(2, "b"));
  catalog.push_back(CatalogItem<db::Folder>("b", 5));
  Diff();
  ASSERT_EQ(1U, result.removed.size());
  ASSERT_EQ(1U, result.common.size());
  ExpectCopy(*merged[0], *result.removed.front());
  ExpectCopy(*merged[1], *result.common.front());
}

TEST_F(DiffFolderTest, ResultsAreAppended) {
  result.added.push_back(MergedFolder(1, "earlier"));
  result.removed.push_back(MergedFolder(1, "earlier"));
  result.common.push_back(MergedFolder(1, "earlier"));
  merged.push_back(MergedFolder(1, "a"));
  merged.push_back(MergedFolder(2, "b"));
  catalog.push_back(CatalogItem<db::Folder>("b"));
  catalog.push_back(CatalogItem<db::Folder>("c"));
  Diff();
  EXPECT_THAT(Names(result.removed), ElementsAre("earlier", "a"));
  EXPECT_THAT(Names(result.common), ElementsAre("earlier", "b"));
  EXPECT_THAT(Names(result.added), ElementsAre("earlier", "c"));
}

TEST_F(DiffFileTest, EmptyMergedListMakesEveryCatalogFileNew) {
  catalog.push_back(CatalogItem<db::File>("a.jpg"));
  catalog.push_back(CatalogItem<db::File>("b.jpg"));
  Diff();
  EXPECT_THAT(Names(result.added), ElementsAre("a.jpg", "b.jpg"));
  EXPECT_THAT(Names(result.removed), IsEmpty());
}

TEST_F(DiffFileTest, EmptyCatalogListMakesEveryMergedFileRemoved) {
  merged.push_back(MergedFile(1, "a.jpg"));
  merged.push_back(MergedFile(2, "b.jpg"));
  Diff();
  EXPECT_THAT(Names(result.removed), ElementsAre("a.jpg", "b.jpg"));
  EXPECT_THAT(Names(result.added), IsEmpty());
}

TEST_F(DiffFileTest, FileOnBothSidesIsNoDifferenceWithAnyDates) {
  merged.push_back(MergedFile(1, "a.jpg"));
  catalog.push_back(CatalogItem<db::File>("a.jpg", 987654));
  Diff();
  EXPECT_THAT(Names(result.added), IsEmpty());
  EXPECT_THAT(Names(result.removed), IsEmpty());
}

TEST_F(DiffFileTest, FilesAreAssignedToTheSideThatHasThem) {
  for (const char* const name : {"a", "c", "cc", "e"}) {
    merged.push_back(MergedFile(1, name));
  }
  for (const char* const name : {"b", "c", "d", "e"}) {
    catalog.push_back(CatalogItem<db::File>(name));
  }
  Diff();
  EXPECT_THAT(Names(result.removed), ElementsAre("a", "cc"));
  EXPECT_THAT(Names(result.added), ElementsAre("b", "d"));
}

TEST_F(DiffFileTest, CreationDateOfANewRecordIsItsModificationDate) {
  catalog.push_back(CatalogItem<db::File>("a.jpg", 1234));
  Diff();
  ASSERT_EQ(1U, result.added.size());
  const dbmerger::File& file = *result.added.front();
  EXPECT_EQ(-1, file.file_id);
  EXPECT_EQ(PARENT, file.folder_id);
  EXPECT_EQ("a.jpg", file.name);
  EXPECT_EQ(1234, file.modified_date);
  EXPECT_EQ(VOLUME, file.volume);
  EXPECT_EQ(1234, file.created_date);
}

TEST_F(DiffFileTest, RemovedRecordIsACopyOfTheMergedOne) {
  merged.push_back(MergedFile(3, "a.jpg"));
  Diff();
  ASSERT_EQ(1U, result.removed.size());
  const dbmerger::File& file = *result.removed.front();
  EXPECT_NE(merged.front(), &file);
  EXPECT_EQ(3, file.file_id);
  EXPECT_EQ(7, file.folder_id);
  EXPECT_EQ("a.jpg", file.name);
  EXPECT_EQ(103, file.modified_date);
  EXPECT_EQ("/shares/Old/", file.volume);
  EXPECT_EQ(203, file.created_date);
}

} // namespace
} // namespace orva::test

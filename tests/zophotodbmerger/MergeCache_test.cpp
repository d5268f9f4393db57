// PhotoDB's cache saves statements and changes nothing else: the same operations with the cache and
// without it give the same rows with the same ids.

#include "PhotoDB.h"

#include "Database.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <functional>
#include <optional>
#include <random>
#include <string>
#include <vector>

namespace orva::dbmerger {
namespace {

using db::Statement;
using db::Transaction;

/// One operation of a merge on both databases.
using Operation = std::function<void(PhotoDB&)>;

Operation AddFolder(const std::string& volume, const std::string& path) {
  return [=](PhotoDB& photos) {
    db::Folder folder;
    folder.path = path;
    folder.lastModifiedDate = 1;
    photos.AddFolder(volume, folder);
  };
}

Operation DeleteFolder(const std::string& volume, const std::string& path) {
  return [=](PhotoDB& photos) {
    db::Folder folder;
    folder.path = path;
    photos.DeleteFolder(volume, folder);
  };
}

db::File MakeFile(const std::string& path, const std::string& name) {
  db::File file;
  file.path = path;
  file.name = name;
  file.lastModifiedDate = 2;
  return file;
}

Operation AddFile(const std::string& volume, const std::string& path, const std::string& name) {
  return [=](PhotoDB& photos) {
    db::File file = MakeFile(path, name);
    photos.AddFile(volume, file);
  };
}

Operation DeleteFile(const std::string& volume, const std::string& path, const std::string& name) {
  return [=](PhotoDB& photos) {
    db::File file = MakeFile(path, name);
    photos.DeleteFile(volume, file);
  };
}

class MergeCacheTest : public testing::Test {
protected:
  MergeCacheTest() {
    for (const char* const location : {CACHED, UNCACHED}) {
      std::filesystem::create_directories(location);
      PhotoDB(location).Init();
    }
  }

  /// Runs the operations in one transaction on a database object of their own, twice.
  static void Run(const std::vector<Operation>& operations, bool commit = true) {
    testing::internal::CaptureStdout(); // the lines about single files
    RunOn(CACHED, PhotoDB::CacheUse::Normal, operations, commit);
    const std::string cached = testing::internal::GetCapturedStdout();
    testing::internal::CaptureStdout();
    RunOn(UNCACHED, PhotoDB::CacheUse::Bypass, operations, commit);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), cached);
  }

  static void ExpectSameRows() {
    for (const char* const sql :
         {"SELECT * FROM Folders ORDER BY folder_id", "SELECT * FROM Files ORDER BY file_id",
          "SELECT * FROM sqlite_sequence ORDER BY name",
          "SELECT type, name, sql FROM sqlite_master ORDER BY name"}) {
      ASSERT_EQ(Rows(UNCACHED, sql), Rows(CACHED, sql));
    }
  }

  static std::vector<std::string> Rows(const std::string& location, const std::string& sql) {
    const test::Database database(location + "/.zophotos/zophotos.db");
    return database.Run(sql);
  }

  static bool HasTransientIndex(PhotoDB& photos) {
    Statement query(photos, "SELECT 1 FROM sqlite_master WHERE name = 'Files_merge'");
    return query.Fetch();
  }

  static void RunOn(const std::string& location, PhotoDB::CacheUse cacheUse,
                    const std::vector<Operation>& operations, bool commit) {
    PhotoDB photos(location, cacheUse);
    photos.Init();
    Transaction transaction(photos, 1000);
    for (const Operation& operation : operations) {
      operation(photos);
    }
    if (commit) {
      transaction.Commit();
    }
  }

  static constexpr const char* CACHED = "/tmp/cached";
  static constexpr const char* UNCACHED = "/tmp/uncached";
};

/// A source of random merges, the same for the same seed.
class Source {
public:
  explicit Source(unsigned seed) : random_(seed) {}

  std::size_t Below(std::size_t bound) {
    return std::uniform_int_distribution<std::size_t>(0, bound - 1)(random_);
  }

  std::string Volume() { return Below(3) == 0 ? "/shares/B/" : "/shares/A/"; }

  std::string Folder(const std::string& volume) {
    std::string path = volume;
    for (std::size_t depth = Below(4); depth > 0; --depth) {
      path += static_cast<char>('a' + Below(3));
      path += '/';
    }
    return path;
  }

  /// One merge, usually in the order of the paths, as the daemon merges, but not always.
  std::vector<Operation> Merge() {
    const std::string volume = Volume();
    std::vector<std::pair<std::string, Operation>> folders{{volume, AddFolder(volume, volume)}};
    for (std::size_t count = Below(12); count > 0; --count) {
      const std::string path = Folder(volume);
      folders.emplace_back(path,
                           Below(6) == 0 ? DeleteFolder(volume, path) : AddFolder(volume, path));
    }
    std::vector<std::pair<std::string, Operation>> files;
    for (std::size_t count = Below(40); count > 0; --count) {
      const std::string name = "f" + std::to_string(Below(6));
      const std::string path = Folder(volume) + name;
      // A catalog may name a file differently from its path.
      const std::string catalogName = Below(15) == 0 ? "f" + std::to_string(Below(6)) : name;
      const std::string fileVolume = Below(20) == 0 ? Volume() : volume;
      files.emplace_back(path, Below(4) == 0 ? DeleteFile(fileVolume, path, catalogName)
                                             : AddFile(fileVolume, path, catalogName));
    }
    std::vector<Operation> operations;
    for (auto* const list : {&folders, &files}) {
      if (Below(5) != 0) {
        std::stable_sort(list->begin(), list->end(),
                         [](const auto& a, const auto& b) { return a.first < b.first; });
      }
      for (const auto& [path, operation] : *list) {
        operations.push_back(operation);
      }
    }
    if (Below(10) == 0) {
      operations.insert(operations.begin() + static_cast<std::ptrdiff_t>(Below(operations.size())),
                        [volume](PhotoDB& photos) { photos.DeleteVolume(volume); });
    }
    return operations;
  }

  bool Commits() { return Below(5) != 0; }

private:
  std::mt19937 random_;
};

TEST_F(MergeCacheTest, RandomMergesGiveTheSameRowsWithTheSameIds) {
  for (unsigned seed = 1; seed <= 40; ++seed) {
    SCOPED_TRACE(seed);
    Source source(seed);
    for (int merge = 0; merge < 6; ++merge) {
      Run(source.Merge(), source.Commits());
      ASSERT_NO_FATAL_FAILURE(ExpectSameRows());
    }
    for (const char* const location : {CACHED, UNCACHED}) {
      PhotoDB photos(location);
      photos.Init();
      photos.DeleteVolumes();
    }
  }
  EXPECT_THAT(Rows(CACHED, "SELECT seq > 100 FROM sqlite_sequence WHERE name = 'Files'"),
              testing::ElementsAre("1"));
}

TEST_F(MergeCacheTest, SeveralTransactionsOfOneObjectGiveTheSameRows) {
  for (unsigned seed = 101; seed <= 120; ++seed) {
    SCOPED_TRACE(seed);
    testing::internal::CaptureStdout();
    for (const auto& [location, cacheUse] : {std::pair(CACHED, PhotoDB::CacheUse::Normal),
                                             std::pair(UNCACHED, PhotoDB::CacheUse::Bypass)}) {
      Source source(seed);
      PhotoDB photos(location, cacheUse);
      photos.Init();
      for (int merge = 0; merge < 8; ++merge) {
        std::optional<Transaction> transaction;
        if (source.Below(6) != 0) { // otherwise each statement is a transaction of its own
          transaction.emplace(photos, 1000U);
        }
        for (const Operation& operation : source.Merge()) {
          operation(photos);
        }
        if (transaction && source.Commits()) {
          transaction->Commit();
        }
      }
    }
    testing::internal::GetCapturedStdout();
    ASSERT_NO_FATAL_FAILURE(ExpectSameRows());
  }
}

TEST_F(MergeCacheTest, AFileWhoseNameDiffersFromItsPathIsFoundByItsName) {
  const std::string volume = "/shares/A/";
  Run({AddFolder(volume, volume), AddFile(volume, volume + "a", "z"),
       AddFile(volume, volume + "z", "z"), AddFile(volume, volume + "zz", "y"),
       AddFile(volume, volume + "zzz", "y")});
  ExpectSameRows();
  EXPECT_THAT(Rows(CACHED, "SELECT name FROM Files ORDER BY file_id"),
              testing::ElementsAre("z", "y"));
}

TEST_F(MergeCacheTest, AFolderThatWasRolledBackIsRemovedFromTheCache) {
  const std::string volume = "/shares/A/";
  PhotoDB photos(CACHED);
  photos.Init();
  {
    const Transaction rolledBack(photos, 1000);
    AddFolder(volume, volume)(photos);
    AddFile(volume, volume + "a", "a")(photos);
  }
  Transaction transaction(photos, 1000);
  AddFile(volume, volume + "b", "b")(photos);
  transaction.Commit();
  EXPECT_THAT(Rows(CACHED, "SELECT * FROM Files"), testing::IsEmpty());
}

TEST_F(MergeCacheTest, RowsThatOthersAddBetweenTransactionsAreSeen) {
  const std::string volume = "/shares/A/";
  PhotoDB photos(CACHED);
  photos.Init();
  {
    Transaction transaction(photos, 1000);
    AddFolder(volume, volume)(photos);
    AddFile(volume, volume + "a", "a")(photos);
    transaction.Commit();
  }
  RunOn(CACHED, PhotoDB::CacheUse::Bypass, {AddFile(volume, volume + "b", "b")}, true);
  Transaction transaction(photos, 1000);
  AddFile(volume, volume + "b", "b")(photos);
  transaction.Commit();
  EXPECT_THAT(Rows(CACHED, "SELECT name FROM Files"), testing::ElementsAre("a", "b"));
}

/// Folders that all have files of the same names, as cameras give them.
std::vector<Operation> Camera(int firstName, int lastName) {
  const std::string volume = "/shares/A/";
  std::vector<Operation> operations{AddFolder(volume, volume)};
  for (int folder = 100; folder < 200; ++folder) {
    operations.push_back(AddFolder(volume, volume + std::to_string(folder) + "/"));
  }
  for (int folder = 100; folder < 200; ++folder) {
    for (int number = firstName; number < lastName; ++number) {
      const std::string name = "IMG_" + std::to_string(number);
      operations.push_back(AddFile(volume, volume + std::to_string(folder) + "/" + name, name));
    }
  }
  return operations;
}

TEST_F(MergeCacheTest, NamesThatManyFoldersShareAreAddedOnce) {
  Run(Camera(1010, 1060));
  ExpectSameRows();
  Run(Camera(1000, 1070));
  ExpectSameRows();
  Run(Camera(1000, 1070));
  ExpectSameRows();
  EXPECT_THAT(Rows(CACHED, "SELECT count(*) FROM Files"), testing::ElementsAre("7000"));
}

TEST_F(MergeCacheTest, NamesAreRemovedFromTheCacheWithTheirFile) {
  Run(Camera(1000, 1030));
  std::vector<Operation> operations = Camera(1000, 1030);
  const std::string volume = "/shares/A/";
  const std::string path = volume + "199/IMG_1010";
  // After the last folder's files, when the cache has all its names.
  operations.push_back(DeleteFile(volume, path, "IMG_1010"));
  operations.push_back(AddFile(volume, path, "IMG_1010"));
  operations.push_back(AddFile(volume, path, "IMG_1010"));
  Run(operations);
  ExpectSameRows();
  EXPECT_THAT(Rows(CACHED, "SELECT count(*) FROM Files"), testing::ElementsAre("3000"));
}

class FlatFolderTest : public MergeCacheTest {
protected:
  static constexpr int FILES = 3000;

  FlatFolderTest() {
    std::vector<Operation> operations{AddFolder(volume_, volume_)};
    for (int number = 0; number < FILES; ++number) {
      operations.push_back(AddFile(volume_, volume_ + Name(number), Name(number)));
    }
    Run(operations);
  }

  static std::string Name(int number) { return "p" + std::to_string(10000 + number); }

  std::vector<Operation> Removals(int count) const {
    std::vector<Operation> operations;
    for (int number = 0; number < count; ++number) {
      operations.push_back(DeleteFile(volume_, volume_ + Name(number * 2), Name(number * 2)));
    }
    return operations;
  }

  const std::string volume_ = "/shares/A/";
};

TEST_F(FlatFolderTest, ManyRemovalsLeaveTheSameRowsAndNoIndex) {
  std::vector<Operation> operations = Removals(FILES / 2);
  bool indexed = false;
  operations.emplace_back([&](PhotoDB& photos) { indexed = indexed || HasTransientIndex(photos); });
  operations.push_back(AddFile(volume_, volume_ + Name(0), Name(0)));
  Run(operations);
  EXPECT_TRUE(indexed);
  ExpectSameRows();
  EXPECT_THAT(Rows(CACHED, "SELECT count(*) FROM Files"), testing::ElementsAre("1501"));
}

TEST_F(FlatFolderTest, FewRemovalsCreateNoIndex) {
  std::vector<Operation> operations = Removals(3);
  bool indexed = false;
  operations.emplace_back([&](PhotoDB& photos) { indexed = indexed || HasTransientIndex(photos); });
  Run(operations);
  EXPECT_FALSE(indexed);
  ExpectSameRows();
}

TEST_F(FlatFolderTest, ARollbackRemovesTheIndex) {
  Run(Removals(FILES / 2), false);
  ExpectSameRows();
  EXPECT_THAT(Rows(CACHED, "SELECT count(*) FROM Files"), testing::ElementsAre("3000"));
  Run(Removals(FILES / 2));
  ExpectSameRows();
}

} // namespace
} // namespace orva::dbmerger

#include "IndexerTest.h"

#include "support/Programs.h"
#include "system/Database.h"
#include "system/PeakMemory.h"

#include "CatalogSchema.h"
#include "FolderIndexer.h"
#include "Indexer.h"
#include "Sql.h"
#include "VolumeRoot.h"
#include "orvadb/VolumeDB.h"

#include <gmock/gmock.h>

#include <fcntl.h>
#include <linux/fs.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <ctime>
#include <fstream>
#include <functional>
#include <iterator>
#include <map>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

/// Makes the catalog that the indexer would make.
void MakeCatalog(const std::string& volume) {
  catalog::Indexer(*catalog::OpenCatalog(volume), volume, std::time(nullptr)).Run();
}

/// Runs statements on a volume's catalog.
void Change(const std::string& volume, const Lines& statements) {
  const Database database(volume + "/.orva/orva.db");
  for (const std::string& sql : statements) {
    database.Run(sql);
  }
}

std::string ReadAll(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

class HostileIndexerTest : public IndexerTest {
protected:
  /// Volumes that are prepared by `crafts`, by name, and then indexed: all have a proper catalog in
  /// the end, and the crafted one has another name.
  void
  ExpectSetAside(const std::map<std::string, std::function<void(const std::string&)>>& crafts) {
    std::map<std::string, std::unique_ptr<Volume>> volumes;
    for (const auto& [name, craft] : crafts) {
      Volume* const volume =
          volumes.emplace(name, std::make_unique<Volume>(name, "16m")).first->second.get();
      for (int file = 0; file < 300; ++file) {
        Write(volume->Path() + "/Pictures/" + std::to_string(file) + ".jpg");
      }
      MakeCatalog(volume->Path());
      craft(volume->Path());
    }
    StartService();
    StartIndexer();
    for (const auto& [name, volume] : volumes) {
      // The crafted catalog may describe the volume, too.
      EXPECT_TRUE(AwaitLog("/" + name + "/: its catalog is not one of ours")) << name;
      EXPECT_THAT(AwaitCatalog(volume->Path()), IsEmpty()) << name;
      EXPECT_TRUE(fs::symlink_status(CatalogOf(volume->Path()) + ".set-aside-1").type() !=
                  fs::file_type::not_found)
          << name;
      // The indexer may be about to change it, and lock it for a moment.
      EXPECT_TRUE(Await([path = volume->Path()] {
        return Query(path, "PRAGMA integrity_check") == Lines{"ok"} &&
               Query(path, "SELECT count(*) FROM sqlite_schema WHERE type IN "
                           "('trigger', 'view')") == Lines{"0"};
      })) << name;
    }
    StopIndexer();
  }
};

TEST_F(HostileIndexerTest, CatalogsWithAnotherSchemaAreSetAside) {
  ExpectSetAside(
      {{"Trigger",
        [](const std::string& volume) {
          Change(volume, {"CREATE TRIGGER t AFTER INSERT ON Files BEGIN DELETE FROM Files; END"});
        }},
       {"View",
        [](const std::string& volume) {
          Change(volume, {"DROP TABLE Removals", "CREATE VIEW Removals AS SELECT 1 AS fileId"});
        }},
       {"Table", [](const std::string& volume) { Change(volume, {"CREATE TABLE Other(x)"}); }},
       {"Columns",
        [](const std::string& volume) {
          Change(volume, {"ALTER TABLE Files ADD COLUMN extra INTEGER"});
        }},
       {"Expression",
        [](const std::string& volume) { Change(volume, {"CREATE INDEX e ON Files(abs(id))"}); }}});
}

TEST_F(HostileIndexerTest, CatalogsWithImpossibleContentAreSetAside) {
  const auto change = [](const std::string& sql) {
    return [sql](const std::string& volume) { Change(volume, {sql}); };
  };
  ExpectSetAside({
      {"Identities", change("INSERT INTO Identity VALUES('00000000000000000000000000000000', 1)")},
      {"Identity", change("UPDATE Identity SET identity = '../../etc/passwd'")},
      {"LateStamp", change("UPDATE Identity SET newestStamp = 2147483648")},
      {"FutureStamp", change("UPDATE Identity SET newestStamp = unixepoch() + 172800")},
      {"FutureTranscoding", change("UPDATE Transcodings SET lastUpdatedDate = 1 << 40")},
      {"TextStamp", change("UPDATE Identity SET newestStamp = 'now'")},
      {"LargeFileId", change("UPDATE Files SET id = 9223372036854775807 WHERE id = 1")},
      {"LargeFolderId", change("UPDATE Folders SET id = 9223372036854775807")},
      {"NegativeId", change("UPDATE Files SET id = -9223372036854775807 WHERE id = 1")},
  });
}

TEST_F(HostileIndexerTest, DamagedCatalogsAreSetAside) {
  ExpectSetAside({
      {"Garbage",
       [](const std::string& volume) {
         std::ofstream(CatalogOf(volume)) << std::string(100'000, 'x');
       }},
      {"Pages",
       [](const std::string& volume) {
         std::fstream file(CatalogOf(volume), std::ios::in | std::ios::out | std::ios::binary);
         file.seekp(4096);
         file << std::string(fs::file_size(CatalogOf(volume)) - 4096, '\x7f');
       }},
      {"Cut",
       [](const std::string& volume) {
         fs::resize_file(CatalogOf(volume), fs::file_size(CatalogOf(volume)) / 2);
       }},
      {"Index",
       [](const std::string& volume) {
         // The index does not list a row of the table.
         Change(volume, {"PRAGMA writable_schema = ON",
                         "UPDATE sqlite_schema SET sql = sql || ' WHERE id <> 7' "
                         "WHERE name = 'Files_path' OR name = 'Files_folder'"});
         Change(volume, {"REINDEX", "PRAGMA writable_schema = ON",
                         "UPDATE sqlite_schema SET sql = substr(sql, 1, length(sql) - 14) "
                         "WHERE name = 'Files_path' OR name = 'Files_folder'"});
       }},
  });
}

TEST_F(HostileIndexerTest, WhatIsInThePlaceOfTheCatalogIsSetAside) {
  Write("/tmp/outside/victim", "do not touch");
  ExpectSetAside({
      {"Link",
       [](const std::string& volume) {
         fs::remove(CatalogOf(volume));
         fs::create_symlink("/tmp/outside/victim", CatalogOf(volume));
       }},
      {"DanglingLink",
       [](const std::string& volume) {
         fs::remove(CatalogOf(volume));
         fs::create_symlink("/tmp/outside/new", CatalogOf(volume));
       }},
      {"LogLink",
       [](const std::string& volume) {
         fs::create_symlink("/tmp/outside/victim", CatalogOf(volume) + "-wal");
       }},
      {"HardLink",
       [](const std::string& volume) {
         fs::create_hard_link(CatalogOf(volume), volume + "/other-name");
       }},
      {"Fifo",
       [](const std::string& volume) {
         fs::remove(CatalogOf(volume));
         ASSERT_EQ(mkfifo(CatalogOf(volume).c_str(), 0666), 0);
       }},
      {"Folder",
       [](const std::string& volume) {
         fs::remove(CatalogOf(volume));
         fs::create_directories(CatalogOf(volume) + "/inside");
       }},
  });
  EXPECT_EQ(ReadAll("/tmp/outside/victim"), "do not touch");
  EXPECT_FALSE(fs::exists("/tmp/outside/new"));
}

TEST_F(HostileIndexerTest, ACatalogThatLiesDescribesTheVolumeAfterTheWalk) {
  const Volume volume("A", "64m");
  for (const char* const path : {"/a.jpg", "/Pictures/b.jpg", "/Pictures/Deep/c.jpg"}) {
    Write(volume.Path() + path);
  }
  MakeCatalog(volume.Path());
  const Lines identity = Query(volume.Path(), "SELECT identity FROM Identity");
  Change(volume.Path(),
         {"UPDATE Files SET size = 1, isHidden = 1 WHERE name = 'a.jpg'",
          "UPDATE Files SET size = 'much', lastModifiedDate = 'late' WHERE name = 'b.jpg'",
          "UPDATE Folders SET isSystem = 1 WHERE name = 'Deep'",
          // A folder that does not exist, with content; two folders in each other; rows nowhere.
          "INSERT INTO Folders VALUES(50, -1, 'No/', 'No', 4, 1, 0, 0, 0, 0, 1, 1)",
          "INSERT INTO Files VALUES(50, 50, 'No/x.jpg', 'x.jpg', 3, 1, 0, 0, 0, 0, 3, 1, 'jpg', 1)",
          "INSERT INTO Folders VALUES(60, 61, 'X/Y/', 'Y', 4, 1, 0, 0, 0, 0, 1, 1)",
          "INSERT INTO Folders VALUES(61, 60, 'X/', 'X', 4, 1, 0, 0, 0, 0, 1, 1)",
          "INSERT INTO Files VALUES(60, 61, 'X/x.jpg', 'x.jpg', 3, 1, 0, 0, 0, 0, 3, 1, 'jpg', 1)",
          "INSERT INTO Files VALUES(61, 999, 'y.jpg', 'y.jpg', 3, 1, 0, 0, 0, 0, 3, 1, 'jpg', 1)",
          "INSERT INTO Files VALUES(62, -1, '../z.jpg', 'z.jpg', 3, 1, 0, 0, 0, 0, 3, 1, 'jpg', 1)",
          "INSERT INTO Files VALUES(63, -1, x'7A', x'7A', 3, 1, 0, 0, 0, 0, 3, 1, 'jpg', 1)",
          "UPDATE Folders SET folderId = id WHERE name = 'Pictures'",
          "UPDATE Files SET folderId = 61 WHERE name = 'c.jpg'"});
  StartService();
  StartIndexer();
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_EQ(Query(volume.Path(), "SELECT identity FROM Identity"), identity);
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

TEST_F(HostileIndexerTest, LongNamesInACatalogTakeLittleMemory) {
  const Volume volume("A", "2g");
  Write(volume.Path() + "/Pictures/a.jpg");
  MakeCatalog(volume.Path());
  // 40 MiB of names of folders, and twice as much of names of files.
  const std::string names =
      "WITH RECURSIVE n(i) AS (VALUES(100) UNION ALL SELECT i + 1 FROM n WHERE i < 119), "
      "named(i, name) AS (SELECT i, format('%d%.*c', i, 2 << 20, 'x') FROM n) ";
  Change(volume.Path(),
         {names + "INSERT INTO Folders "
                  "SELECT i, -1, name || '/', name, 4, 1, 0, 0, 0, 0, 1, 1 FROM named",
          names + "INSERT INTO Files "
                  "SELECT i, -1, name, name, 0, 1, 0, 0, 0, 0, 1, 1, '', 1 FROM named",
          names +
              "INSERT INTO Files "
              "SELECT i + 20, -1, '/' || name, name, 0, 1, 0, 0, 0, 1, 1, 1, '', 1 FROM named"});
  StartService();
  StartIndexer();
  EXPECT_TRUE(AwaitCatalog(volume.Path()).empty()); // the differences would be long
  // No file system has such names, so the catalog is made again.
  EXPECT_THAT(ErrorLines(), ElementsAre(HasSubstr("string or blob too big")));
  if (!AreProgramsSanitized()) {
    EXPECT_LT(PeakOf(Indexer().Pid()), 96 << 10); // KiB
  }
}

TEST_F(HostileIndexerTest, ALargeCatalogWithoutIndexesTakesLittleMemory) {
  const Volume volume("A", "2g");
  Write(volume.Path() + "/Pictures/a.jpg");
  MakeCatalog(volume.Path());
  Change(
      volume.Path(),
      {"DROP INDEX Folders_path",
       "WITH RECURSIVE n(i) AS (VALUES(100) UNION ALL SELECT i + 1 FROM n WHERE i < 50099), "
       "named(i, name) AS (SELECT i, format('%d%.*c', i, 2000, 'x') FROM n) "
       "INSERT INTO Folders SELECT i, -1, name || '/', name, 4, 1, 0, 0, 0, 0, 1, 1 FROM named"});
  StartService();
  StartIndexer();
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_THAT(ErrorLines(), ElementsAre(HasSubstr("it is large and has no indexes")));
  if (!AreProgramsSanitized()) {
    EXPECT_LT(PeakOf(Indexer().Pid()), 96 << 10); // KiB
  }
}

TEST_F(HostileIndexerTest, ManyRowsWithoutFilesAreRemovedInPieces) {
  const Volume volume("A", "2g");
  Write(volume.Path() + "/Pictures/a.jpg");
  MakeCatalog(volume.Path());
  const std::string numbers =
      "WITH RECURSIVE n(i) AS (VALUES(1000) UNION ALL SELECT i + 1 FROM n WHERE i < 151000) ";
  Change(volume.Path(),
         {numbers + "INSERT INTO Folders "
                    "SELECT i, -1, i || '/', i, 4, 1, 0, 0, 0, 0, 1, 1 FROM n",
          numbers +
              "INSERT INTO Files SELECT i, -1, i || '.jpg', i || '.jpg', 3, 1, 0, 0, 0, 0, 1, "
              "1, 'jpg', 1 FROM n"});
  const auto catalog = catalog::OpenCatalog(volume.Path());
  const catalog::VolumeRoot root(volume.Path(), catalog::VolumeRoot::Kind::Mount);
  catalog::FolderIndexer indexer(*catalog, root, catalog::NewPhotos::Waiting, std::time(nullptr),
                                 {});
  int unfinished = 0;
  for (; indexer.Update({}).empty(); ++unfinished) {
    ASSERT_FALSE(indexer.IsFinished());
  }
  EXPECT_TRUE(indexer.IsFinished());
  EXPECT_EQ(unfinished, 2); // one with files, one with folders
  EXPECT_EQ(indexer.Summary().folders, 1);
  EXPECT_EQ(indexer.Summary().deleted, 150'001);
  EXPECT_EQ(catalog::SelectNumber(*catalog, "SELECT count(*) FROM Folders WHERE isDeleted = 0"), 1);
  EXPECT_EQ(catalog::SelectNumber(*catalog, "SELECT count(*) FROM Files WHERE isDeleted = 0"), 1);
}

TEST_F(HostileIndexerTest, AVolumeIsNotIndexedWhileItsFolderOfTheProductIsNone) {
  Write("/tmp/outside/victim", "do not touch");
  const Volume link("Link", "1m");
  const Volume fifo("Fifo", "1m");
  const Volume file("File", "1m");
  fs::create_directory_symlink("/tmp/outside", link.Path() + "/.orva");
  ASSERT_EQ(mkfifo((fifo.Path() + "/.orva").c_str(), 0666), 0);
  Write(file.Path() + "/.orva", "a file");
  Write(link.Path() + "/a.jpg");
  StartService();
  StartIndexer();
  for (const char* const name : {"Link", "Fifo", "File"}) {
    EXPECT_TRUE(AwaitLog(std::string(name) + "/: not indexed: .orva is not a folder"));
    EXPECT_TRUE(
        Await([&] { return State(std::string("/shares/") + name) == std::string("unusable"); }));
  }
  EXPECT_THAT(ErrorLines(), SizeIs(3));
  EXPECT_EQ(std::distance(fs::directory_iterator("/tmp/outside"), {}), 1);
  fs::remove(link.Path() + "/.orva");
  const Volume another("Another", "1m"); // volumes are looked at again when something is mounted
  EXPECT_THAT(AwaitCatalog(link.Path()), IsEmpty());
}

TEST_F(HostileIndexerTest, NamesThatAreReplacedMeanwhileLeadNowhereElse) {
  Write("/tmp/outside/secret.jpg", "do not touch");
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  MakeCatalog(volume.Path());
  fs::create_directory_symlink("/tmp/outside", volume.Path() + "/link");
  StartService();
  StartIndexer();
  {
    std::atomic<bool> stopped = false;
    const std::jthread racer([&] {
      const std::string link = volume.Path() + "/link";
      while (!stopped) {
        for (const std::string name : {"/.orva", "/Pictures"}) {
          const std::string path = volume.Path() + name;
          renameat2(AT_FDCWD, link.c_str(), AT_FDCWD, path.c_str(), RENAME_EXCHANGE);
          renameat2(AT_FDCWD, link.c_str(), AT_FDCWD, path.c_str(), RENAME_EXCHANGE);
        }
      }
    });
    for (int round = 0; round < 20; ++round) {
      Write(volume.Path() + "/Work/" + std::to_string(round) + "/a.jpg");
      const long events = static_cast<long>(Events(volume.Path()).size());
      // The indexer may refuse the volume meanwhile.
      Await([&] {
        return static_cast<long>(Events(volume.Path()).size()) > events ||
               State(volume.Path()) == "unusable";
      });
    }
    stopped = true;
  }
  EXPECT_EQ(std::distance(fs::directory_iterator("/tmp/outside"), {}), 1);
  EXPECT_EQ(ReadAll("/tmp/outside/secret.jpg"), "do not touch");
  const Volume another("Another", "1m");
  Write(volume.Path() + "/Pictures/b.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

TEST_F(HostileIndexerTest, AtMostThreeCatalogsAreKeptAside) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/a.jpg");
  StartService();
  StartIndexer();
  Lines identities;
  for (int round = 0; round < 5; ++round) {
    ASSERT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
    ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
    identities.push_back(Query(volume.Path(), "SELECT identity FROM Identity").front());
    std::ofstream(CatalogOf(volume.Path())) << std::string(10'000, 'x');
    Write(volume.Path() + "/" + std::to_string(round) + ".jpg");
  }
  ASSERT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  Lines names;
  for (const auto& entry : fs::directory_iterator(volume.Path() + "/.orva")) {
    if (entry.path().native().find("set-aside") != std::string::npos) {
      names.push_back(entry.path().filename());
    }
  }
  std::ranges::sort(names);
  EXPECT_THAT(names,
              ElementsAre("orva.db.set-aside-1", "orva.db.set-aside-2", "orva.db.set-aside-3"));
  std::ranges::sort(identities);
  EXPECT_EQ(std::ranges::adjacent_find(identities), identities.end());
}

} // namespace
} // namespace orva::test

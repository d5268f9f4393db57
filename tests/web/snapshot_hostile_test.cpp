// Merged databases that are not the daemon's: crafted rows, tables and pages.

#include "SnapshotTest.h"

#include "hostile/CraftedDatabase.h"
#include "support/Programs.h"
#include "system/PeakMemory.h"

#include <gmock/gmock.h>

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <set>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using State = web::SnapshotStatus::State;

class HostileDatabase : public SnapshotTest {
protected:
  void SetUp() override {
    merged_.emplace(MERGED);
    folder_ = merged_->AddVolume(A);
    merged_->AddFile(folder_, "sound.jpg", 50, A);
  }

  /// Adds a file by SQL expressions.
  void AddFile(const std::string& folder, const std::string& name, const std::string& modified,
               const std::string& volume = "'/shares/A/'") {
    merged_->Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) VALUES(" +
                 folder + ", " + name + ", " + modified + ", " + volume + ", 0)");
  }

  void AddFolder(const std::string& parent, const std::string& path,
                 const std::string& volume = "'/shares/A/'") {
    merged_->Run("INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(" +
                 parent + ", " + path + ", 0, " + volume + ")");
  }

  /// Replaces a table by one without constraints and types.
  void Replace(const std::string& table, const std::string& columns) {
    merged_->Run("DROP TABLE " + table);
    merged_->Run("CREATE TABLE " + table + "(" + columns + ")");
  }

  void ExpectFailure(const std::string& reason) {
    merged_.reset();
    Start();
    EXPECT_FALSE(Update());
    EXPECT_EQ(snapshot_->Status().state, State::Failed);
    EXPECT_THAT(snapshot_->Status().reason, HasSubstr(reason));
    EXPECT_THAT(Names(), IsEmpty());
  }

  std::optional<MergedFile> merged_;
  std::int64_t folder_ = 0;
};

TEST_F(HostileDatabase, NamesAreKeptByteForByte) {
  const std::vector<std::string> names{"<img src=x onerror=alert(1)>.jpg",
                                       "\xFF\xFE.jpg",
                                       "a\nb\r\t\x1B[31m.jpg",
                                       "\u202Egpj.exe\u202C",
                                       "'\"&;.jpg",
                                       std::string(4096, 'n')};
  for (const std::string& name : names) {
    merged_->AddFile(folder_, name, 100, A);
  }
  Start();
  Update();
  EXPECT_EQ(reader_->Photos({}, std::nullopt, 100).size(), names.size() + 1);
  for (const web::Photo& photo : reader_->Photos({}, std::nullopt, names.size())) {
    EXPECT_THAT(names, ::testing::Contains(photo.name));
    EXPECT_EQ(photo.path, A + photo.name);
  }
  EXPECT_THAT(Names(WithWords("\"<img>\" OR alert")), SizeIs(0));
  EXPECT_THAT(Names(WithWords("<img> alert")), SizeIs(1));
}

TEST_F(HostileDatabase, RowsThatTheDaemonCannotHaveMergedAreLeftOut) {
  Replace("Files", "file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id, name, modified_date, "
                   "volume, created_date");
  const std::string folder = std::to_string(folder_);
  AddFile(folder, "'1.jpg'", "1");
  for (const char* const name :
       {"NULL", "7", "1.5", "x'612e6a7067'", "''", "'.'", "'..'", "'a/b.jpg'", "'/etc/passwd'",
        "'../../etc/passwd'", "'a' || char(0) || 'b'", "replace(hex(zeroblob(2049)), '00', 'aa')",
        "CAST(zeroblob(1000000) AS TEXT)", "zeroblob(1000000)",
        "replace(hex(zeroblob(1000000)), '00', 'ab')"}) {
    AddFile(folder, name, "2");
  }
  for (const char* const time : {"NULL", "'soon'", "1.5", "4294967296", "-9223372036854775808",
                                 "9223372036854775807", "2147483648", "x'00'"}) {
    AddFile(folder, "'time.jpg'", time);
  }
  for (const char* const volume :
       {"NULL", "7", "x'00'", "''", "replace(hex(zeroblob(5000)), '0', 'v')"}) {
    AddFile(folder, "'volume.jpg'", "3", volume);
  }
  for (const char* const inFolder :
       {"NULL", "'x'", "-1", "0", "999", "9223372036854775807", "1.5"}) {
    AddFile(inFolder, "'folder.jpg'", "4");
  }
  AddFile(folder, "'last.jpg'", "5");
  Start();
  Update();
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  EXPECT_THAT(Names(), ElementsAre("last.jpg", "1.jpg"));
  // Changes are noticed as before.
  AddFile(folder, "'new.jpg'", "6");
  AddFile(folder, "NULL", "6");
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("new.jpg", "last.jpg", "1.jpg"));
  merged_->Run("DELETE FROM Files WHERE name IS NULL OR name = '1.jpg'");
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("new.jpg", "last.jpg"));
  EXPECT_FALSE(Update());
}

TEST_F(HostileDatabase, FoldersThatTheDaemonCannotHaveMergedAreLeftOut) {
  Replace("Folders", "folder_id INTEGER PRIMARY KEY AUTOINCREMENT, parent_folder_id, name, "
                     "modified_date, volume");
  AddFolder("-1", "'/shares/A/'");
  for (const char* const path :
       {"NULL", "7", "x'2f'", "''", "'relative/'", "'/no/end'", "'/shares/A/../../etc/'",
        "'/shares/A/./x/'", "'/shares/' || char(0) || '/'",
        "'/' || replace(hex(zeroblob(3000)), '0', 'f') || '/'",
        "'/' || replace(hex(zeroblob(1000000)), '0', 'f') || '/'"}) {
    AddFolder("1", path);
  }
  AddFolder("NULL", "'/shares/A/null/'");
  AddFolder("1", "'/shares/A/volume/'", "NULL");
  Start();
  Update();
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  EXPECT_THAT(ReadAll(*snapshot_).folders, SizeIs(1));
}

TEST_F(HostileDatabase, IdsOfAllSizesAreRead) {
  merged_->Run("INSERT INTO Files VALUES(-5, 2, 'negative.jpg', 1, '/shares/A/', 0)");
  merged_->Run("INSERT INTO Files VALUES(0, 2, 'zero.jpg', 1, '/shares/A/', 0)");
  merged_->Run(
      "INSERT INTO Files VALUES(2147483649, 2, 'same lower bits.jpg', 50, '/shares/A/', 0)");
  merged_->Run("INSERT INTO Files VALUES(9223372036854775806, 2, 'large.jpg', 2, '/shares/A/', 0)");
  Start();
  Update();
  EXPECT_THAT(Names(), ElementsAre("sound.jpg", "large.jpg"));
  merged_->Run(
      "INSERT INTO Files VALUES(9223372036854775807, 2, 'largest.jpg', 3, '/shares/A/', 0)");
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("sound.jpg", "largest.jpg", "large.jpg"));
  EXPECT_FALSE(Update());
  merged_->Run("DELETE FROM Files WHERE file_id > 9000000000");
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("sound.jpg"));
}

TEST_F(HostileDatabase, CyclesOfFoldersEnd) {
  merged_->Run("INSERT INTO Folders VALUES(10, 11, '/shares/A/a/', 0, '/shares/A/')");
  merged_->Run("INSERT INTO Folders VALUES(11, 10, '/shares/A/a/b/', 0, '/shares/A/')");
  merged_->Run("INSERT INTO Folders VALUES(12, 12, '/shares/A/c/', 0, '/shares/A/')");
  Start();
  Update();
  EXPECT_THAT(reader_->Ancestors(10), SizeIs(100));
  EXPECT_THAT(reader_->Ancestors(12), SizeIs(100));
  EXPECT_THAT(reader_->Folders(12, {}, 10), SizeIs(1));
}

TEST_F(HostileDatabase, FoldersWithoutParentsAreBelowTheNearestOne) {
  merged_->Run("INSERT INTO Folders VALUES(10, 99, '/shares/A/a/b/c/', 0, '/shares/A/')");
  merged_->Run("INSERT INTO Folders VALUES(11, 99, '/elsewhere/', 0, '/shares/A/')");
  merged_->Run("INSERT INTO Folders VALUES(12, -7, '/', 0, '/shares/A/')");
  std::string deep = "/x/";
  for (int i = 0; i < 2'000; ++i) {
    deep += "d/";
  }
  merged_->Run("INSERT INTO Folders VALUES(13, 98, ?, 0, '/shares/A/')", {deep});
  Start();
  Update();
  EXPECT_EQ(reader_->FindFolder(10).value().parent, folder_);
  EXPECT_EQ(reader_->FindFolder(11).value().parent, 12);
  EXPECT_EQ(reader_->FindFolder(12).value().parent, -1);
  EXPECT_EQ(reader_->FindFolder(13).value().parent, -1);
}

TEST_F(HostileDatabase, PhotosOfAFolderThatIsRemovedAloneAreRemoved) {
  const std::int64_t folder = merged_->AddFolder(folder_, "/shares/A/x/", A);
  merged_->AddFile(folder, "1.jpg", 1, A);
  Start();
  Update();
  merged_->Run("DELETE FROM Folders WHERE folder_id = ?", {std::to_string(folder)});
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("sound.jpg"));
  EXPECT_FALSE(Update());
}

TEST_F(HostileDatabase, TheNumberOfVolumesIsLimited) {
  merged_->Run("BEGIN");
  for (int i = 0; i < 15'000; ++i) {
    const std::string volume = "/shares/V" + std::to_string(i) + "/";
    merged_->AddFile(folder_, "1.jpg", i, volume);
    merged_->Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) "
                 "VALUES(?, 1, 1, 1)",
                 {volume});
  }
  merged_->Run("COMMIT");
  Start();
  Update();
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  EXPECT_THAT(reader_->Volumes(), SizeIs(1000));
  EXPECT_THAT(Names(InVolume("/shares/V1/")), SizeIs(1));
  EXPECT_THAT(Names(InVolume("/shares/V14000/")), IsEmpty());
}

TEST_F(HostileDatabase, ManyVolumesWithLongNamesTakeLittleMemory) {
  merged_->Run("BEGIN");
  for (int i = 0; i < 15'000; ++i) {
    const std::string volume = "/shares/" + std::to_string(i) + std::string(4000, 'x') + "/";
    merged_->AddFile(folder_, "1.jpg", i, volume);
    merged_->Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) "
                 "VALUES(?, 1, 1, 1)",
                 {volume});
  }
  merged_->Run("COMMIT");
  const PeakMemory peak(getpid());
  Start();
  Update();
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  EXPECT_THAT(reader_->Volumes(), SizeIs(1000));
  if (!AreProgramsSanitized()) {
    EXPECT_LT(peak.Growth(), 64 << 10);
  }
}

TEST_F(HostileDatabase, StatisticsOfAnyTypeAreShown) {
  Replace("Statistics", "id INTEGER PRIMARY KEY, volume, photos_xcoded, photos_total, "
                        "last_updated_time");
  merged_->Run("INSERT INTO Statistics VALUES(1, '/shares/A/', 'x', -5, 9223372036854775807)");
  merged_->Run("INSERT INTO Statistics VALUES(2, '/shares/A/', 7, 7, 7)");
  merged_->Run(
      "INSERT INTO Statistics VALUES(3, NULL, 7, 7, 7), (4, x'00', 7, 7, 7), (5, '', 7, 7, "
      "7)");
  Start();
  Update();
  const web::VolumeRow row{
      .mountPoint = A, .transcoded = 0, .total = -5, .mergedUpTo = INT64_MAX, .isGone = false};
  EXPECT_THAT(reader_->Volumes(), ElementsAre(row));
}

TEST_F(HostileDatabase, TablesOfAnotherKindAreRefused) {
  for (
      const char* const files :
      {"CREATE VIEW Files AS SELECT 1 AS file_id, 2 AS folder_id, 'x' AS name, 1 AS modified_date, "
       "'/shares/A/' AS volume",
       "CREATE VIRTUAL TABLE Files USING fts5(file_id, folder_id, name, modified_date, volume)",
       "CREATE TABLE Files(file_id, folder_id, name, modified_date, volume)",
       "CREATE TABLE Files(file_id INTEGER PRIMARY KEY, folder_id, name AS (hex(zeroblob(90000))), "
       "modified_date, volume)",
       "CREATE TABLE Files(file_id, folder_id, name, modified_date, volume, PRIMARY KEY(file_id, "
       "name)) WITHOUT ROWID"}) {
    fs::remove_all("/tmp/merged");
    merged_.emplace(MERGED);
    merged_->Run("DROP TABLE Files");
    merged_->Run(files);
    ExpectFailure("is not a merged photo database");
  }
}

TEST_F(HostileDatabase, FilesThatAreNoDatabaseAreRefused) {
  merged_.reset();
  std::ofstream(MERGED) << std::string(100'000, 'x');
  ExpectFailure("not a database");
  fs::remove(MERGED);
  fs::create_directory(MERGED);
  ExpectFailure("is not a regular file");
}

TEST_F(HostileDatabase, TheFormerSnapshotIsShownWhileTheDatabaseCannotBeRead) {
  Start();
  Update();
  merged_->Run("ALTER TABLE Files RENAME TO Others");
  EXPECT_FALSE(Update());
  EXPECT_EQ(snapshot_->Status().state, State::Failed);
  EXPECT_THAT(Names(), ElementsAre("sound.jpg"));
}

TEST_F(HostileDatabase, ALostTableOfSequencesIsNoError) {
  Replace("Files", "file_id INTEGER PRIMARY KEY, folder_id, name, modified_date, volume, "
                   "created_date");
  Replace("Folders",
          "folder_id INTEGER PRIMARY KEY, parent_folder_id, name, modified_date, volume");
  merged_->Run("DELETE FROM sqlite_sequence");
  AddFolder("-1", "'/shares/A/'");
  AddFile("1", "'1.jpg'", "1");
  Start();
  Update();
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  AddFile("1", "'2.jpg'", "2");
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("2.jpg", "1.jpg"));
}

/// A database with these trees of pages many times over.
class EndlessDatabase : public HostileDatabase, public ::testing::WithParamInterface<std::string> {
protected:
  void SetUp() override {
    HostileDatabase::SetUp();
    merged_->Run("BEGIN");
    for (int i = 0; i < 2'000; ++i) {
      merged_->AddFolder(folder_, "/shares/A/" + std::to_string(i) + "/", A);
      merged_->AddFile(folder_, std::to_string(i) + ".jpg", i, A);
    }
    merged_->Run("COMMIT");
    const auto root = static_cast<std::uint32_t>(
        merged_->Number("SELECT rootpage FROM sqlite_schema WHERE name = '" + GetParam() + "'"));
    merged_.reset();
    CraftedDatabase crafted(MERGED);
    crafted.Multiply(root, 8);
    crafted.Save();
    Start();
  }
};

class EndlessTable : public EndlessDatabase {};

TEST_P(EndlessTable, EndsWithAnError) {
  EXPECT_FALSE(Update());
  EXPECT_EQ(snapshot_->Status().state, State::Failed);
}

INSTANTIATE_TEST_SUITE_P(Trees, EndlessTable, ::testing::Values("Files", "Folders"),
                         [](const auto& test) { return test.param; });

class EndlessIndex : public EndlessDatabase {};

TEST_P(EndlessIndex, IsNotRead) {
  EXPECT_TRUE(Update());
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  EXPECT_EQ(2'001U, ReadAll(*snapshot_).photos.size());
}

INSTANTIATE_TEST_SUITE_P(Trees, EndlessIndex,
                         ::testing::Values("Files_folderId", "Folders_folderId"),
                         [](const auto& test) { return test.param; });

} // namespace
} // namespace orva::test

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Classification.h"
#include "Generator.h"
#include "Indexer.h"
#include "Options.h"
#include "Renditions.h"
#include "Sql.h"
#include "VolumeRoot.h"

#include "commandline/UsageError.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/FileDescriptor.h"

#include "support/Program.h"
#include "support/Programs.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <limits>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace {

using namespace orva;
using catalog::ForEachRow;
using catalog::SelectNumber;
using test::Outcome;
using Lines = std::vector<std::string>;
namespace fs = std::filesystem;

constexpr std::time_t NOW = 1'700'000'000;

/// The result of a query on one volume: a line for each row, columns separated by "|".
Lines Select(const db::DB& catalog, const char* sql, int columns) {
  Lines lines;
  ForEachRow(catalog, sql, [&](const db::Statement& row) {
    std::string line = row.GetText(0);
    for (int column = 1; column < columns; ++column) {
      line += '|' + row.GetText(column);
    }
    lines.push_back(line);
  });
  return lines;
}

/// A folder of its own for each test, with a volume in it.
class OrvaCatalog : public testing::Test {
protected:
  OrvaCatalog() {
    std::string name = (fs::temp_directory_path() / "orva-catalog-XXXXXX").native();
    if (mkdtemp(name.data()) == nullptr) {
      throw std::runtime_error("mkdtemp");
    }
    base_ = name;
    volume_ = base_ / "volume";
    fs::create_directory(volume_);
  }
  ~OrvaCatalog() override {
    std::error_code ignored;
    fs::remove_all(base_, ignored);
  }

  /// Writes a file with any bytes to the volume; creates its folders.
  void Write(const std::string& path, const std::string& content = "content") const {
    fs::create_directories((volume_ / path).parent_path());
    std::ofstream(volume_ / path) << content;
    SetTime(path, NOW - 1000);
  }

  void SetTime(const std::string& path, std::time_t seconds) const {
    const std::array<timespec, 2> times = {timespec{seconds, 0}, timespec{seconds, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, (volume_ / path).c_str(), times.data(), 0), 0);
  }

  void Remove(const std::string& path) const { fs::remove_all(volume_ / path); }

  std::unique_ptr<db::VolumeDB> Open() const { return catalog::OpenCatalog(volume_.native()); }

  catalog::IndexSummary Index(std::time_t now = NOW) const {
    return catalog::Indexer(*Open(), volume_.native(), now).Run();
  }

  Lines Query(const char* sql, int columns = 1) const { return Select(*Open(), sql, columns); }
  long long Number(const char* sql) const { return SelectNumber(*Open(), sql); }

  /// What the next merge reads after one that read everything up to `since`:
  /// "path|isDeleted|stamp".
  Lines ChangedSince(std::time_t since) const {
    const auto database = Open();
    db::Statement statement(
        *database,
        "SELECT f.path, f.isDeleted, t.lastUpdatedDate from Files f, Transcodings t "
        "WHERE f.id = t.sourceId AND t.lastUpdatedDate > ? "
        "AND t.profile = 'cb62bbdd389b48898f2e5244977cb2c5' AND "
        "((f.isDeleted = 0 and t.status = 1) OR (f.isDeleted = 1 and t.status = 0)) ORDER BY 1");
    statement.BindTime(1, since);
    Lines lines;
    while (statement.Fetch()) {
      lines.push_back(statement.GetText(0) + '|' + statement.GetText(1) + '|' +
                      statement.GetText(2));
    }
    return lines;
  }

  /// Runs the program with both outputs in `output`; `arguments` go through the shell.
  static Outcome RunProgram(const std::string& arguments) {
    return RunShell(test::ProgramPath("orva-catalog") + ' ' + arguments + " 2>&1");
  }
  static Outcome RunShell(const std::string& command) {
    return test::Run({"/bin/sh", "-c", command});
  }

  fs::path base_;
  fs::path volume_;
};

// --- Names -------------------------------------------------------------------------------------

TEST(OrvaCatalogNames, PhotosAreRecognisedByExtensionInAnyCase) {
  for (const char* name : {"a.jpg", "a.JPG", "a.Jpeg", "a.jpeg", "a.png", "a.gif", "a.bmp", "a.tif",
                           "a.TIFF", "a.heic", "a.webp", "a.b.jpg"}) {
    EXPECT_EQ(catalog::CategoryOf(catalog::ExtensionOf(name)), 3) << name;
  }
  for (const char* name : {"jpg", ".jpg", "a.jpg.txt", "a.", "", "a.jp", "a.mp3", "a.mov"}) {
    EXPECT_NE(catalog::CategoryOf(catalog::ExtensionOf(name)), 3) << name;
  }
}

TEST(OrvaCatalogNames, OtherKindsHaveTheirOwnCategories) {
  EXPECT_EQ(catalog::CategoryOf("mp3"), catalog::MUSIC);
  EXPECT_EQ(catalog::CategoryOf("mov"), catalog::VIDEO);
  EXPECT_EQ(catalog::CategoryOf("txt"), catalog::OTHER);
  EXPECT_EQ(catalog::CategoryOf(""), catalog::OTHER);
}

TEST(OrvaCatalogNames, ABackupHasTheExtensionOfItsOriginal) {
  EXPECT_EQ(catalog::ExtensionOf("a.JPG~"), "jpg");
  EXPECT_EQ(catalog::ExtensionOf("a.jpg.bak"), "jpg");
  EXPECT_EQ(catalog::ExtensionOf("a.bak"), "");
  EXPECT_EQ(catalog::ExtensionOf("~"), "");
}

TEST(OrvaCatalogNames, FlagsComeFromTheName) {
  using catalog::Flags;
  using catalog::FlagsOf;
  EXPECT_EQ(FlagsOf("a.jpg", {}), Flags());
  EXPECT_EQ(FlagsOf(".a.jpg", {}), (Flags{.isHidden = true}));
  EXPECT_EQ(FlagsOf("a.jpg~", {}), (Flags{.isBackup = true}));
  EXPECT_EQ(FlagsOf("a.BAK", {}), (Flags{.isBackup = true}));
  EXPECT_EQ(FlagsOf("lost+found", {}), (Flags{.isSystem = true}));
  EXPECT_EQ(FlagsOf("Thumbs.db", {}), (Flags{.isSystem = true}));
  EXPECT_EQ(FlagsOf("DESKTOP.INI", {}), (Flags{.isSystem = true}));
  EXPECT_EQ(FlagsOf("AlbumArtSmall.jpg", {}), (Flags{.isSystem = true}));
  EXPECT_EQ(FlagsOf(".DS_Store", {}), (Flags{.isHidden = true, .isSystem = true}));
  EXPECT_EQ(FlagsOf("._a.jpg", {}), (Flags{.isHidden = true, .isSystem = true}));
}

TEST(OrvaCatalogNames, FlagsOfAFolderAreInheritedBelowIt) {
  const catalog::Flags folder = {.isBackup = true, .isHidden = true, .isSystem = true};
  EXPECT_EQ(catalog::FlagsOf("a.jpg", folder), folder);
}

// --- Schema ------------------------------------------------------------------------------------

TEST_F(OrvaCatalog, IsInTheProductsFolderOfTheVolume) {
  Index();
  EXPECT_TRUE(fs::is_regular_file(volume_ / ".orva" / "orva.db"));
}

TEST_F(OrvaCatalog, FoldersBeginsWithTheColumnsThatReadersSelectByPosition) {
  Lines columns = Query("PRAGMA table_info(Folders)", 2);
  columns.resize(12);
  EXPECT_EQ(columns, (Lines{"0|id", "1|folderId", "2|path", "3|name", "4|category",
                            "5|lastModifiedDate", "6|isBackup", "7|isHidden", "8|isSystem",
                            "9|isDeleted", "10|status", "11|lastUpdatedDate"}));
}

TEST_F(OrvaCatalog, HoldsAPathOnlyOnce) {
  const auto database = Open();
  db::File file;
  file.id = 1;
  file.path = file.name = "a.jpg";
  catalog::StoreFile(*database, file);
  file.id = 2;
  catalog::StoreFile(*database, file);
  EXPECT_EQ(SelectNumber(*database, "SELECT count(*) FROM Files"), 1);
}

TEST_F(OrvaCatalog, ReadersSeeTheLastCompleteStateWhileARunWrites) {
  Write("a.jpg");
  Index();
  const auto writer = Open();
  db::Transaction writing(*writer, 0);
  catalog::Execute(*writer, "DELETE FROM Files");

  const db::VolumeDB reader(volume_.native(), false);
  {
    const db::Transaction reading(reader, 0);
    EXPECT_EQ(SelectNumber(reader, "SELECT count(*) FROM Files"), 1);
    writing.Commit();
    EXPECT_EQ(SelectNumber(reader, "SELECT count(*) FROM Files"), 1);
  }
  EXPECT_EQ(SelectNumber(reader, "SELECT count(*) FROM Files"), 0);
}

TEST_F(OrvaCatalog, LeavesNoLogThatAReadOnlyVolumeWouldNeed) {
  Write("a.jpg");
  ASSERT_EQ(RunProgram("index " + volume_.native()).status, 0);
  EXPECT_FALSE(fs::exists(volume_ / ".orva" / "orva.db-wal"));

  // Also when a reader still has the catalog open.
  const db::VolumeDB reader(volume_.native(), false);
  ASSERT_EQ(SelectNumber(reader, "SELECT count(*) FROM Files"), 1);
  Write("b.jpg");
  ASSERT_EQ(RunProgram("index " + volume_.native()).status, 0);
  EXPECT_EQ(fs::file_size(volume_ / ".orva" / "orva.db-wal"), 0U);
}

TEST_F(OrvaCatalog, StampsAreTheTimeOfTheRunOrLaterThanAllOthers) {
  const auto database = Open();
  EXPECT_EQ(catalog::NextStamp(*database, NOW), NOW);
  for (const char* sql : {"INSERT INTO Transcodings VALUES(1, 1, 'another', 1, 1700000000)",
                          "UPDATE Transcodings SET lastUpdatedDate = 1800000000"}) {
    catalog::Execute(*database, sql);
    EXPECT_EQ(catalog::NextStamp(*database, NOW),
              SelectNumber(*database, "SELECT max(lastUpdatedDate) FROM Transcodings") + 1);
  }
  EXPECT_EQ(catalog::NextStamp(*database, 1'800'000'002), 1'800'000'002);
}

TEST(Stamps, TheNextOneWaitsForTheClock) {
  using std::chrono::seconds;
  EXPECT_EQ(catalog::PauseAfterStamp(NOW - 5, NOW), seconds(0));
  EXPECT_EQ(catalog::PauseAfterStamp(NOW + 2, NOW), seconds(0));
  EXPECT_EQ(catalog::PauseAfterStamp(NOW + 3, NOW), seconds(1));
  EXPECT_EQ(catalog::PauseAfterStamp(NOW + 10, NOW), seconds(8));
}

TEST(Stamps, TheNextOneDoesNotWaitForAClockThatWasSetBack) {
  EXPECT_EQ(catalog::PauseAfterStamp(NOW + 11, NOW), std::chrono::seconds(1));
  EXPECT_EQ(catalog::PauseAfterStamp(NOW + 1'000'000, NOW), std::chrono::seconds(1));
}

// --- Index: what is entered --------------------------------------------------------------------

TEST_F(OrvaCatalog, EntersFoldersAndFilesWithRelativePaths) {
  Write("top.jpg");
  Write("Pictures/2024/a.jpg");
  const catalog::IndexSummary summary = Index();

  EXPECT_EQ(Query("SELECT d.path, d.name, ifnull(p.path, d.folderId), d.category, d.isDeleted "
                  "FROM Folders d LEFT JOIN Folders p ON d.folderId = p.id ORDER BY d.path",
                  5),
            (Lines{"Pictures/|Pictures|-1|4|0", "Pictures/2024/|2024|Pictures/|4|0"}));
  EXPECT_EQ(Query("SELECT f.path, f.name, ifnull(d.path, f.folderId), f.category, f.isDeleted, "
                  "f.ext, f.size FROM Files f LEFT JOIN Folders d ON f.folderId = d.id "
                  "ORDER BY f.path",
                  7),
            (Lines{"Pictures/2024/a.jpg|a.jpg|Pictures/2024/|3|0|jpg|7",
                   "top.jpg|top.jpg|-1|3|0|jpg|7"}));
  EXPECT_EQ(summary.folders, 2);
  EXPECT_EQ(summary.files, 2);
  EXPECT_EQ(summary.photos, 2);
  EXPECT_EQ(summary.added, 2);
}

TEST_F(OrvaCatalog, OnlyPhotosAreRendered) {
  Write("a.jpg");
  Write("b.txt");
  Index();
  EXPECT_EQ(Query("SELECT f.path, f.category, f.status, ifnull(t.profile, '-'), "
                  "ifnull(t.status, '-'), ifnull(t.lastUpdatedDate, '-') "
                  "FROM Files f LEFT JOIN Transcodings t ON t.sourceId = f.id ORDER BY f.path",
                  6),
            (Lines{"a.jpg|3|3|cb62bbdd389b48898f2e5244977cb2c5|1|1700000000", "b.txt|0|1|-|-|-"}));
}

TEST_F(OrvaCatalog, LeavesOutTheProductsOwnFoldersOfTheRoot) {
  Write(".zophotos/zophotos.db");
  Write("Pictures/.zophotos/a.jpg");
  Write("Pictures/.orva/a.jpg");
  Index();
  EXPECT_EQ(Query("SELECT path FROM Folders ORDER BY path"),
            (Lines{"Pictures/", "Pictures/.orva/", "Pictures/.zophotos/"}));
}

TEST_F(OrvaCatalog, DoesNotFollowLinksAndLeavesOutSpecialFiles) {
  Write("Pictures/a.jpg");
  fs::create_directory_symlink(volume_ / "Pictures", volume_ / "Link");
  fs::create_symlink(volume_ / "Pictures" / "a.jpg", volume_ / "link.jpg");
  ASSERT_EQ(mkfifo((volume_ / "fifo.jpg").c_str(), 0600), 0);
  Index();
  EXPECT_EQ(Query("SELECT path FROM Folders"), Lines{"Pictures/"});
  EXPECT_EQ(Query("SELECT path FROM Files"), Lines{"Pictures/a.jpg"});
}

TEST_F(OrvaCatalog, CrossesBindMounts) {
  fs::create_directories(base_ / "elsewhere" / "Deep");
  std::ofstream(base_ / "elsewhere" / "Deep" / "a.jpg") << "photo";
  fs::create_directory(volume_ / "Bound");
  ASSERT_EQ(
      mount((base_ / "elsewhere").c_str(), (volume_ / "Bound").c_str(), nullptr, MS_BIND, nullptr),
      0)
      << "this test needs a root that may mount";
  Index();
  EXPECT_EQ(umount((volume_ / "Bound").c_str()), 0);
  EXPECT_EQ(Query("SELECT path FROM Files"), Lines{"Bound/Deep/a.jpg"});
}

TEST_F(OrvaCatalog, EntersFlagsFromNamesAndFromTheFoldersAbove) {
  Write(".hidden/Deep/a.jpg");
  Write("Old~/b.jpg");
  Write("lost+found/c.jpg");
  Write("Seen/.d.jpg");
  Write("Seen/e.jpg~");
  Write("Seen/._f.jpg");
  Write("Seen/g.jpg");
  Index();
  EXPECT_EQ(Query("SELECT path, isBackup, isHidden, isSystem FROM Folders ORDER BY path", 4),
            (Lines{".hidden/|0|1|0", ".hidden/Deep/|0|1|0", "Old~/|1|0|0", "Seen/|0|0|0",
                   "lost+found/|0|0|1"}));
  EXPECT_EQ(Query("SELECT path, isBackup, isHidden, isSystem FROM Files ORDER BY path", 4),
            (Lines{".hidden/Deep/a.jpg|0|1|0", "Old~/b.jpg|1|0|0", "Seen/._f.jpg|0|1|1",
                   "Seen/.d.jpg|0|1|0", "Seen/e.jpg~|1|0|0", "Seen/g.jpg|0|0|0",
                   "lost+found/c.jpg|0|0|1"}));
  // All of them are rendered photos; the reader decides which of them it takes.
  EXPECT_EQ(ChangedSince(0).size(), 7U);
}

TEST_F(OrvaCatalog, StoresNamesAsBytes) {
  const std::string name = "caf\xe9 '\"\n\xff.jpg";
  Write("Dir\xe9/" + name);
  Index();
  EXPECT_EQ(Query("SELECT path FROM Folders"), Lines{"Dir\xe9/"});
  EXPECT_EQ(Query("SELECT name FROM Files"), Lines{name});
  EXPECT_EQ(Query("SELECT path FROM Files"), Lines{"Dir\xe9/" + name});
  EXPECT_EQ(Index(NOW + 10).added, 0);
}

TEST_F(OrvaCatalog, StoresTimesOfMoreThan32Bits) {
  Write("future.jpg");
  SetTime("future.jpg", 5'000'000'000);
  Write("past.jpg");
  SetTime("past.jpg", -86'400);
  struct stat future = {};
  ASSERT_EQ(stat((volume_ / "future.jpg").c_str(), &future), 0);
  ASSERT_GT(future.st_mtime, std::numeric_limits<int>::max());
  Index();
  EXPECT_EQ(Query("SELECT lastModifiedDate FROM Files ORDER BY path"),
            (Lines{std::to_string(future.st_mtime), "-86400"}));
  EXPECT_EQ(Index(NOW + 10).changed, 0);
}

TEST_F(OrvaCatalog, AnEmptyVolumeHasAnEmptyCatalog) {
  const catalog::IndexSummary summary = Index();
  EXPECT_EQ(summary.folders + summary.files, 0);
  EXPECT_EQ(Number("SELECT (SELECT count(*) FROM Folders) + (SELECT count(*) FROM Files)"), 0);
}

// --- Index: what changes -----------------------------------------------------------------------

TEST_F(OrvaCatalog, ARunOverAnUnchangedVolumeChangesNothing) {
  Write("Pictures/a.jpg");
  Write("b.txt");
  Index();
  const char* const everything =
      "SELECT id, path, folderId, isDeleted, status, lastUpdatedDate FROM Folders UNION ALL "
      "SELECT id, path, folderId, isDeleted, status, lastUpdatedDate FROM Files UNION ALL "
      "SELECT id, sourceId, profile, '-', status, lastUpdatedDate FROM Transcodings";
  const Lines before = Query(everything, 6);
  const catalog::IndexSummary summary = Index(NOW + 10);
  EXPECT_EQ(before.size(), 4U);
  EXPECT_EQ(Query(everything, 6), before);
  EXPECT_EQ(summary.files, 2);
  EXPECT_EQ(summary.added + summary.changed + summary.deleted + summary.revived, 0);
}

TEST_F(OrvaCatalog, ANewPhotoIsStampedByItsRunOnly) {
  Write("a.jpg");
  Index();
  Write("b.jpg");
  EXPECT_EQ(Index(NOW + 10).added, 1);
  EXPECT_EQ(ChangedSince(NOW), Lines{"b.jpg|0|1700000010"});
}

TEST_F(OrvaCatalog, RunsWithinOneSecondHaveDifferentStamps) {
  Write("a.jpg");
  Index();
  Write("b.jpg");
  Index();
  EXPECT_EQ(ChangedSince(NOW), Lines{"b.jpg|0|1700000001"});
}

TEST_F(OrvaCatalog, APhotoWithAnotherTimeIsRenderedAgain) {
  Write("a.jpg");
  Write("b.jpg");
  Index();
  const Lines ids = Query("SELECT id FROM Files ORDER BY path");
  SetTime("a.jpg", NOW - 5);
  EXPECT_EQ(Index(NOW + 10).changed, 1);
  EXPECT_EQ(ChangedSince(NOW), Lines{"a.jpg|0|1700000010"});
  EXPECT_EQ(Query("SELECT lastModifiedDate FROM Files WHERE path = 'a.jpg'"), Lines{"1699999995"});
  EXPECT_EQ(Query("SELECT id FROM Files ORDER BY path"), ids);
}

TEST_F(OrvaCatalog, APhotoWithAnotherSizeIsRenderedAgain) {
  Write("a.jpg");
  Index();
  Write("a.jpg", "longer content");
  EXPECT_EQ(Index(NOW + 10).changed, 1);
  EXPECT_EQ(ChangedSince(NOW), Lines{"a.jpg|0|1700000010"});
  EXPECT_EQ(Number("SELECT size FROM Files"), 14);
  EXPECT_EQ(Number("SELECT count(*) FROM Transcodings"), 1);
}

TEST_F(OrvaCatalog, AVanishedFileKeepsItsRowAndItsTranscodingIsWithdrawn) {
  Write("a.jpg");
  Write("b.jpg");
  Index();
  Remove("a.jpg");
  const catalog::IndexSummary summary = Index(NOW + 10);
  EXPECT_EQ(summary.deleted, 1);
  EXPECT_EQ(summary.files, 1);
  EXPECT_EQ(summary.photos, 1);
  EXPECT_EQ(Query("SELECT path, isDeleted, status FROM Files ORDER BY path", 3),
            (Lines{"a.jpg|1|1", "b.jpg|0|3"}));
  EXPECT_EQ(ChangedSince(NOW), Lines{"a.jpg|1|1700000010"});

  EXPECT_EQ(Index(NOW + 20).deleted, 0);
  EXPECT_EQ(ChangedSince(NOW + 10), Lines{});
}

TEST_F(OrvaCatalog, AFileThatComesBackRevivesItsRow) {
  Write("a.jpg");
  Index();
  Remove("a.jpg");
  Index(NOW + 10);
  Write("a.jpg");
  const catalog::IndexSummary summary = Index(NOW + 20);
  EXPECT_EQ(summary.revived, 1);
  EXPECT_EQ(summary.added, 0);
  EXPECT_EQ(Query("SELECT id, isDeleted, status FROM Files", 3), Lines{"1|0|3"});
  EXPECT_EQ(ChangedSince(NOW + 10), Lines{"a.jpg|0|1700000020"});
}

TEST_F(OrvaCatalog, AVanishedFolderIsMarkedWithEverythingBelowIt) {
  Write("Pictures/2024/a.jpg");
  Write("Pictures/b.jpg");
  Index();
  Remove("Pictures");
  Index(NOW + 10);
  EXPECT_EQ(Query("SELECT path, isDeleted FROM Folders ORDER BY path", 2),
            (Lines{"Pictures/|1", "Pictures/2024/|1"}));
  EXPECT_EQ(ChangedSince(NOW),
            (Lines{"Pictures/2024/a.jpg|1|1700000010", "Pictures/b.jpg|1|1700000010"}));
}

TEST_F(OrvaCatalog, AFolderThatComesBackRevivesItsRowAndStampsItsFilesAgain) {
  Write("Pictures/a.jpg");
  SetTime("Pictures", NOW - 500);
  Index();
  Remove("Pictures");
  Index(NOW + 10);
  Write("Pictures/a.jpg");
  SetTime("Pictures", NOW - 500);
  Index(NOW + 20);
  EXPECT_EQ(Query("SELECT id, isDeleted FROM Folders", 2), Lines{"1|0"});
  EXPECT_EQ(ChangedSince(NOW + 10), Lines{"Pictures/a.jpg|0|1700000020"});
}

TEST_F(OrvaCatalog, FilesOfAFolderMarkedDeletedAreStampedWhenItComesBack) {
  Write("Pictures/a.jpg");
  Write("Other/b.jpg");
  Index();
  catalog::Execute(*Open(), "UPDATE Folders SET isDeleted = 1 WHERE path = 'Pictures/'");
  Index(NOW + 10);
  EXPECT_EQ(ChangedSince(NOW), Lines{"Pictures/a.jpg|0|1700000010"});
}

TEST_F(OrvaCatalog, ARenamedFolderLeavesItsOldPathAndEntersTheNewOne) {
  Write("Pictures/a.jpg");
  Index();
  fs::rename(volume_ / "Pictures", volume_ / ".Pictures");
  Index(NOW + 10);
  EXPECT_EQ(Query("SELECT path, isHidden, isDeleted FROM Folders ORDER BY path", 3),
            (Lines{".Pictures/|1|0", "Pictures/|0|1"}));
  EXPECT_EQ(ChangedSince(NOW),
            (Lines{".Pictures/a.jpg|0|1700000010", "Pictures/a.jpg|1|1700000010"}));

  fs::rename(volume_ / ".Pictures", volume_ / "Pictures");
  Index(NOW + 20);
  EXPECT_EQ(Query("SELECT path, isDeleted FROM Folders ORDER BY path", 2),
            (Lines{".Pictures/|1", "Pictures/|0"}));
  EXPECT_EQ(ChangedSince(NOW + 10),
            (Lines{".Pictures/a.jpg|1|1700000020", "Pictures/a.jpg|0|1700000020"}));
}

TEST_F(OrvaCatalog, AFileMayBecomeAFolder) {
  Write("a.jpg");
  Index();
  Remove("a.jpg");
  Write("a.jpg/b.jpg");
  Index(NOW + 10);
  EXPECT_EQ(Query("SELECT path, isDeleted FROM Folders", 2), Lines{"a.jpg/|0"});
  EXPECT_EQ(Query("SELECT path, isDeleted FROM Files ORDER BY path", 2),
            (Lines{"a.jpg|1", "a.jpg/b.jpg|0"}));
}

// --- Index: failures ---------------------------------------------------------------------------

TEST_F(OrvaCatalog, UnreadableFoldersAreNotMarkedDeleted) {
  // The path is too long to be opened, also for the superuser.
  const std::string name(250, 'd');
  std::string path;
  const util::FileDescriptor start(open(".", O_PATH | O_DIRECTORY | O_CLOEXEC));
  ASSERT_EQ(chdir(volume_.c_str()), 0);
  for (int depth = 0; depth < 17; ++depth) {
    ASSERT_EQ(mkdir(name.c_str(), 0700), 0);
    ASSERT_EQ(chdir(name.c_str()), 0);
    path += name + '/';
  }
  ASSERT_EQ(fchdir(start.Get()), 0);

  const auto database = Open();
  db::File file;
  for (const std::string& known : {path + "a.jpg", std::string("gone.jpg")}) {
    ++file.id;
    file.path = known;
    catalog::StoreFile(*database, file);
  }
  const catalog::IndexSummary summary = Index();
  ASSERT_EQ(summary.unreadable.size(), 1U);
  EXPECT_NE(summary.unreadable[0].find("File name too long"), std::string::npos);
  EXPECT_EQ(summary.deleted, 1);
  EXPECT_EQ(Query("SELECT path FROM Files WHERE isDeleted = 1"), Lines{"gone.jpg"});

  const Outcome outcome = RunProgram("index " + volume_.native());
  EXPECT_EQ(outcome.status, 0);
  EXPECT_TRUE(outcome.output.starts_with(
      "orva-catalog: not updated, cannot be read: " + volume_.native() + "/ddd"))
      << outcome.output;
}

TEST_F(OrvaCatalog, AFailedRunLeavesTheCatalogAsItWas) {
  Write("a.jpg");
  Index();
  const auto database = Open();
  Remove("a.jpg");
  Write("b.jpg");
  catalog::Execute(*database, "INSERT INTO Transcodings VALUES(99, 99, 'other profile', 0, 0)");
  catalog::Execute(*database, "CREATE UNIQUE INDEX Fault ON Transcodings(status) WHERE status = 0");
  catalog::Indexer indexer(*database, volume_.native(), NOW + 10);
  EXPECT_THROW(indexer.Run(), std::string);
  EXPECT_EQ(Query("SELECT path, isDeleted FROM Files", 2), Lines{"a.jpg|0"});
}

TEST_F(OrvaCatalog, AVolumeThatCannotBeReadIsAFailure) {
  Write("a.jpg");
  Index();
  const auto database = Open();
  for (const std::string& place : {std::string(4096, 'x'), std::string("absent")}) {
    catalog::Indexer indexer(*database, (volume_ / place).native(), NOW + 10);
    EXPECT_THROW(indexer.Run(), util::Exception);
  }
  EXPECT_EQ(Number("SELECT isDeleted FROM Files"), 0);
}

// --- Index: photos that wait, and single folders ------------------------------------------------

class OrvaCatalogFolders : public OrvaCatalog {
protected:
  using Hooks = catalog::FolderIndexer::Hooks;

  /// Updates the folder at `path`. Returns the paths of the folders in it.
  Lines Update(const std::string& path, std::time_t now = NOW, Hooks hooks = {}) const {
    const auto database = Open();
    const catalog::VolumeRoot root(volume_.native(), catalog::VolumeRoot::Kind::Directory);
    db::Transaction transaction(*database, 0);
    catalog::FolderIndexer indexer(*database, root, catalog::NewPhotos::Waiting, now,
                                   std::move(hooks));
    Lines inside;
    for (const catalog::IndexedFolder& folder : indexer.Update(indexer.Find(path).value())) {
      inside.push_back(folder.path);
    }
    transaction.Commit();
    return inside;
  }

  /// The transcoder's part: what `mark` does with the photo that waits.
  template <typename Mark>
  void MarkWaiting(std::time_t now, Mark mark) const {
    const auto database = Open();
    db::Transaction transaction(*database, 0);
    const auto waiting = catalog::NewestWaiting(*database, 10);
    ASSERT_EQ(waiting.size(), 1U);
    EXPECT_TRUE(mark(*database, waiting.front(), catalog::NextStamp(*database, now)));
    transaction.Commit();
  }
  void Finish(std::time_t now) const { MarkWaiting(now, catalog::MarkFinished); }
  void Fail(std::time_t now) const {
    MarkWaiting(now,
                [](const db::DB& database, const catalog::WaitingPhoto& photo, std::time_t stamp) {
                  return catalog::MarkFailed(database, photo, "reason", stamp);
                });
  }

  /// "path|isDeleted|status|status of the transcoding" of all files.
  Lines States() const {
    return Query("SELECT f.path, f.isDeleted, f.status, ifnull(t.status, '-') FROM Files f "
                 "LEFT JOIN Transcodings t ON t.sourceId = f.id ORDER BY f.path",
                 4);
  }
};

TEST_F(OrvaCatalogFolders, OnlyTheGivenFolderIsUpdated) {
  Write("Pictures/Deep/a.jpg");
  Write("Pictures/b.jpg");
  Write("c.jpg");
  EXPECT_EQ(Update(""), Lines{"Pictures/"});
  EXPECT_EQ(Query("SELECT path FROM Files"), Lines{"c.jpg"});
  EXPECT_EQ(Update("Pictures/"), Lines{"Pictures/Deep/"});
  EXPECT_EQ(Query("SELECT path FROM Files ORDER BY path"), (Lines{"Pictures/b.jpg", "c.jpg"}));
}

TEST_F(OrvaCatalogFolders, AFolderWithoutChangesWritesNothing) {
  Write("a.jpg");
  Update("");
  const long long stamp = Number("SELECT newestStamp FROM Identity");
  Update("", NOW + 10);
  EXPECT_EQ(Number("SELECT newestStamp FROM Identity"), stamp);
}

TEST_F(OrvaCatalogFolders, TheTimeOfTheFolderItselfIsUpdated) {
  Write("Pictures/a.jpg");
  Update("");
  SetTime("Pictures", NOW - 77);
  Update("Pictures/");
  EXPECT_EQ(Number("SELECT lastModifiedDate FROM Folders"), NOW - 77);
}

TEST_F(OrvaCatalogFolders, NewPhotosWait) {
  Write("a.jpg");
  Write("b.txt");
  Update("");
  EXPECT_EQ(States(), (Lines{"a.jpg|0|1|-", "b.txt|0|1|-"}));
  EXPECT_EQ(catalog::CountWaiting(*Open()), 1);
}

TEST_F(OrvaCatalogFolders, AChangedPhotoWaitsAndStaysListed) {
  Write("a.jpg");
  Update("");
  Finish(NOW + 1);
  SetTime("a.jpg", NOW - 5);
  Update("", NOW + 10);
  EXPECT_EQ(States(), Lines{"a.jpg|0|1|1"});
  EXPECT_EQ(ChangedSince(NOW + 1), Lines{});
}

TEST_F(OrvaCatalogFolders, AChangedPhotoThatHadFailedWaitsAgain) {
  Write("a.jpg");
  Update("");
  Fail(NOW + 1);
  EXPECT_EQ(catalog::CountFailed(*Open()), 1);
  SetTime("a.jpg", NOW - 5);
  Update("", NOW + 10);
  EXPECT_EQ(catalog::CountFailed(*Open()), 0);
  EXPECT_EQ(catalog::CountWaiting(*Open()), 1);
}

TEST_F(OrvaCatalogFolders, AVanishedPhotoLeavesTheMergedDatabaseAndItsRenditionIsRemoved) {
  Write("a.jpg");
  Write("Pictures/b.jpg");
  Index();
  Remove("a.jpg");
  Remove("Pictures");
  Update("", NOW + 10);
  EXPECT_EQ(States(), (Lines{"Pictures/b.jpg|1|1|0", "a.jpg|1|1|0"}));
  EXPECT_EQ(catalog::RemovedFiles(*Open(), 10).size(), 2U);
}

TEST_F(OrvaCatalogFolders, APhotoThatComesBackWaits) {
  Write("a.jpg");
  Index();
  Remove("a.jpg");
  Index(NOW + 10);
  Write("a.jpg");
  Update("", NOW + 20);
  EXPECT_EQ(States(), Lines{"a.jpg|0|1|0"});
  EXPECT_EQ(ChangedSince(NOW + 10), Lines{});
}

TEST_F(OrvaCatalogFolders, TheSecondRowOfAFailedPhotoStaysUntilThePhotoIsFinished) {
  Write("a.jpg");
  Update("");
  Finish(NOW + 1);
  SetTime("a.jpg", NOW - 5);
  Update("", NOW + 2);
  Fail(NOW + 3);
  EXPECT_EQ(States(), (Lines{"/a.jpg|1|1|0", "a.jpg|0|2|3"}));
  Update("", NOW + 4); // it is no file of the folder
  EXPECT_EQ(States(), (Lines{"/a.jpg|1|1|0", "a.jpg|0|2|3"}));
  SetTime("a.jpg", NOW - 4);
  Index(NOW + 5);
  EXPECT_EQ(States(), Lines{"a.jpg|0|3|1"});
  EXPECT_EQ(Number("SELECT count(*) FROM Transcodings"), 1);
}

TEST_F(OrvaCatalogFolders, AFileThatIsNotCompleteKeepsItsRow) {
  Write("a.jpg");
  Write("b.jpg");
  Update("");
  Write("a.jpg", "longer content");
  Write("b.jpg", "longer content");
  Write("c.jpg");
  const auto isComplete = [](const catalog::IndexedFolder&, const std::string& name,
                             const catalog::FolderIndexer::FileState&) { return name == "b.jpg"; };
  Update("", NOW + 10, {.isComplete = isComplete});
  EXPECT_EQ(Query("SELECT path, size FROM Files ORDER BY path", 2), (Lines{"a.jpg|7", "b.jpg|14"}));
}

TEST_F(OrvaCatalogFolders, AFolderIsOpenBeforeItIsListed) {
  Write("a.jpg");
  const auto opened = [this](const catalog::IndexedFolder& folder, int descriptor) {
    EXPECT_EQ(folder.path, "");
    EXPECT_NE(descriptor, -1);
    Write("b.jpg");
  };
  Update("", NOW, {.opened = opened});
  EXPECT_EQ(Query("SELECT path FROM Files ORDER BY path"), (Lines{"a.jpg", "b.jpg"}));
}

TEST_F(OrvaCatalogFolders, RowsThatNoFolderLeadsToAreMarkedDeleted) {
  Write("a.jpg");
  Index();
  catalog::Execute(*Open(),
                   "INSERT INTO Folders VALUES(5, 6, 'X/Y/', 'Y', 4, 1, 0, 0, 0, 0, 1, 1)");
  catalog::Execute(*Open(), "INSERT INTO Folders VALUES(6, 5, 'X/', 'X', 4, 1, 0, 0, 0, 0, 1, 1)");
  catalog::Execute(*Open(), "INSERT INTO Files VALUES(5, 6, 'X/x.jpg', 'x.jpg', 3, 1, 0, 0, 0, 0, "
                            "3, 1, 'jpg', 1)");
  EXPECT_EQ(Index(NOW + 10).deleted, 1);
  EXPECT_EQ(Number("SELECT count(*) FROM Folders WHERE isDeleted = 0"), 0);
  EXPECT_EQ(Query("SELECT path FROM Files WHERE isDeleted = 0"), Lines{"a.jpg"});
}

TEST_F(OrvaCatalog, APathOfAVolumeIsOpenedWithoutLinks) {
  using catalog::VolumeRoot;
  Write("Pictures/a.jpg");
  fs::create_directory_symlink("Pictures", volume_ / "Link");
  const VolumeRoot root(volume_.native(), VolumeRoot::Kind::Directory);
  EXPECT_TRUE(root.Open("", O_RDONLY | O_DIRECTORY));
  EXPECT_TRUE(root.Open("Pictures/a.jpg", O_RDONLY));
  EXPECT_TRUE(root.Open("Pictures", O_PATH | O_DIRECTORY));
  EXPECT_FALSE(root.Open("Link", O_RDONLY));
  EXPECT_EQ(errno, ELOOP);
  EXPECT_FALSE(root.Open("Link/a.jpg", O_RDONLY));
  EXPECT_EQ(errno, ELOOP);
  EXPECT_FALSE(root.Open("../volume", O_RDONLY));
  EXPECT_EQ(errno, EXDEV);
  EXPECT_THROW(VolumeRoot(volume_.native(), VolumeRoot::Kind::Mount), util::Exception);
  EXPECT_THROW(VolumeRoot((volume_ / "Link").native(), VolumeRoot::Kind::Directory),
               util::Exception);
}

// --- Generate ----------------------------------------------------------------------------------

constexpr catalog::GeneratorPlan SMALL = {
    .files = 25, .perFolder = 10, .names = catalog::Names::Camera, .tree = catalog::Tree::Flat};

TEST_F(OrvaCatalog, GeneratesRenderedPhotosInFoldersOfTheGivenSize) {
  EXPECT_EQ(catalog::Generate(*Open(), SMALL, NOW), 3);
  EXPECT_EQ(Query("SELECT d.path, d.folderId, count(*) FROM Folders d, Files f "
                  "WHERE f.folderId = d.id AND f.path = d.path || f.name "
                  "AND f.category = 3 AND f.status = 3 GROUP BY d.id ORDER BY d.path",
                  3),
            (Lines{"Folder_0000001/|-1|10", "Folder_0000002/|-1|10", "Folder_0000003/|-1|5"}));
  EXPECT_EQ(ChangedSince(NOW - 1).size(), 25U);
}

TEST_F(OrvaCatalog, CameraNamesAreTheSameInEveryFolder) {
  catalog::Generate(*Open(), SMALL, NOW);
  EXPECT_EQ(
      Query("SELECT name FROM Files WHERE folderId = 3 ORDER BY name"),
      (Lines{"IMG_0001.JPG", "IMG_0002.JPG", "IMG_0003.JPG", "IMG_0004.JPG", "IMG_0005.JPG"}));
  EXPECT_EQ(Number("SELECT count(DISTINCT name) FROM Files"), 10);
}

TEST_F(OrvaCatalog, UniqueNamesDifferEverywhere) {
  catalog::GeneratorPlan plan = SMALL;
  plan.names = catalog::Names::Unique;
  catalog::Generate(*Open(), plan, NOW);
  EXPECT_EQ(Number("SELECT count(DISTINCT name) FROM Files"), 25);
}

TEST_F(OrvaCatalog, ADeepTreeIsEightWide) {
  const catalog::GeneratorPlan plan = {
      .files = 100, .perFolder = 1, .names = catalog::Names::Camera, .tree = catalog::Tree::Deep};
  EXPECT_EQ(catalog::Generate(*Open(), plan, NOW), 100);
  EXPECT_EQ(Number("SELECT count(*) FROM Folders WHERE folderId = -1"), 8);
  EXPECT_EQ(Number("SELECT max(n) FROM (SELECT count(*) AS n FROM Folders GROUP BY folderId)"), 8);
  EXPECT_EQ(Number("SELECT count(*) FROM Folders d, Folders p "
                   "WHERE d.folderId = p.id AND d.path = p.path || d.name || '/'"),
            92);
  EXPECT_EQ(Number("SELECT max(length(path) - length(replace(path, '/', ''))) FROM Folders"), 3);
}

TEST_F(OrvaCatalog, AFolderMayContainAllFiles) {
  const catalog::GeneratorPlan plan = {.files = 25, .perFolder = 1000};
  EXPECT_EQ(catalog::Generate(*Open(), plan, NOW), 1);
  EXPECT_EQ(Number("SELECT count(*) FROM Files WHERE folderId = 1"), 25);
}

TEST_F(OrvaCatalog, GeneratingReplacesTheContentAndIsRepeatable) {
  catalog::Generate(*Open(), {.files = 100, .perFolder = 5}, NOW);
  const char* const content = "SELECT f.id, f.path, f.lastModifiedDate, f.size, t.status FROM "
                              "Files f, Transcodings t WHERE t.sourceId = f.id ORDER BY f.id";
  catalog::Generate(*Open(), SMALL, NOW + 10);
  const Lines first = Query(content, 5);
  EXPECT_EQ(first.size(), 25U);
  EXPECT_EQ(Number("SELECT count(*) FROM Folders"), 3);
  EXPECT_EQ(Number("SELECT count(*) FROM Transcodings"), 25);
  catalog::Generate(*Open(), SMALL, NOW + 10);
  EXPECT_EQ(Query(content, 5), first);
  EXPECT_EQ(Number("SELECT min(lastUpdatedDate) FROM Transcodings"), NOW + 11);
}

TEST_F(OrvaCatalog, AGeneratedCatalogHasTheIndexesOfAnIndexedOne) {
  const char* const schema = "SELECT sql FROM sqlite_schema WHERE sql IS NOT NULL ORDER BY name";
  const auto database = Open();
  const Lines indexed = Select(*database, schema, 1);
  EXPECT_EQ(indexed.size(), 14U);
  catalog::Generate(*database, SMALL, NOW);
  EXPECT_EQ(Select(*database, schema, 1), indexed);
}

TEST_F(OrvaCatalog, RestampingStampsEveryTranscodingAndNothingElse) {
  catalog::Generate(*Open(), SMALL, NOW);
  const Lines files = Query("SELECT id, path, lastUpdatedDate FROM Files", 3);
  EXPECT_EQ(catalog::Restamp(*Open(), NOW), 25);
  EXPECT_EQ(ChangedSince(NOW).size(), 25U);
  EXPECT_EQ(Query("SELECT id, path, lastUpdatedDate FROM Files", 3), files);
}

// --- Command line ------------------------------------------------------------------------------

TEST(OrvaCatalogOptions, AreRead) {
  const auto options =
      catalog::ParseOptions({"generate", "/shares/Vol", "--files", "12", "--per-folder", "5",
                             "--names", "camera", "--tree", "deep"});
  ASSERT_TRUE(options);
  EXPECT_EQ(options->command, catalog::Command::Generate);
  EXPECT_EQ(options->mountPoint, "/shares/Vol");
  EXPECT_EQ(options->plan.files, 12);
  EXPECT_EQ(options->plan.perFolder, 5);
  EXPECT_EQ(options->plan.names, catalog::Names::Camera);
  EXPECT_EQ(options->plan.tree, catalog::Tree::Deep);
  EXPECT_EQ(catalog::ParseOptions({"index", "/v"})->command, catalog::Command::Index);
  EXPECT_EQ(catalog::ParseOptions({"generate", "/v", "--restamp"})->command,
            catalog::Command::Restamp);
  EXPECT_EQ(catalog::ParseOptions({"generate", "/v", "--files", "1", "--restamp"})->command,
            catalog::Command::Restamp);
}

TEST(OrvaCatalogOptions, AreDecimalAndTheLastOneCounts) {
  const auto options =
      catalog::ParseOptions({"generate", "/v", "--files=7", "--files", "010", "--per-folder",
                             "1000000000", "--names", "unique", "--tree", "flat"});
  ASSERT_TRUE(options);
  EXPECT_EQ(options->plan.files, 10);
  EXPECT_EQ(options->plan.perFolder, 1'000'000'000);
  EXPECT_EQ(options->plan.names, catalog::Names::Unique);
  EXPECT_EQ(options->plan.tree, catalog::Tree::Flat);
}

TEST(OrvaCatalogOptions, WrongUsageIsRefused) {
  const std::vector<std::pair<Lines, std::string>> wrong = {
      {{}, "a command is required"},
      {{"scan", "/v"}, "unknown command: 'scan'"},
      {{"index"}, "MOUNT is required"},
      {{"index", ""}, "MOUNT must not be empty"},
      {{"index", "--files"}, "unknown option: --files"},
      {{"index", "/v", "--files"}, "unknown option: --files"},
      {{"index", "/v", "/w"}, "unexpected argument: '/w'"},
      {{"generate", "/v"}, "--files is required"},
      {{"generate", "/v", "--files"}, "option --files needs a value"},
      {{"generate", "/v", "--names"}, "option --names needs a value"},
      {{"generate", "/v", "--tree"}, "option --tree needs a value"},
      {{"generate", "/v", "--files=", "1", "--restamp"}, "option --files needs a value"},
      {{"generate", "/v", "--files", "1", "--per-folder", "1", "--names", "camera"},
       "--tree is required"},
      {{"generate", "/v", "--files", "-1", "--restamp"},
       "option --files takes a number from 0 to 1000000000, not '-1'"},
      {{"generate", "/v", "--files", "1x", "--restamp"},
       "option --files takes a number from 0 to 1000000000, not '1x'"},
      {{"generate", "/v", "--files", "0x10", "--restamp"},
       "option --files takes a number from 0 to 1000000000, not '0x10'"},
      {{"generate", "/v", "--files", "99999999999999999999", "--restamp"},
       "option --files takes a number from 0 to 1000000000, not '99999999999999999999'"},
      {{"generate", "/v", "--per-folder", "0", "--restamp"},
       "option --per-folder takes a number from 1 to 1000000000, not '0'"},
      {{"generate", "/v", "--names", "none", "--restamp"},
       "option --names takes unique or camera, not 'none'"},
      {{"generate", "/v", "--tree", "round", "--restamp"},
       "option --tree takes flat or deep, not 'round'"},
      {{"generate", "/v", "--colour", "red", "--restamp"}, "unknown option: --colour"},
      {{"generate", "/v", "stray", "--restamp"}, "unexpected argument: 'stray'"}};
  for (const auto& [arguments, message] : wrong) {
    try {
      catalog::ParseOptions(arguments);
      ADD_FAILURE() << testing::PrintToString(arguments) << " accepted instead of: " << message;
    } catch (const commandline::UsageError& error) {
      EXPECT_EQ(error.what(), message);
    }
  }
}

TEST_F(OrvaCatalog, TheProgramIndexesAndPrintsWhatItChanged) {
  Write("Pictures/a.jpg");
  Write("b.txt");
  const Outcome first = RunProgram("index " + volume_.native());
  EXPECT_EQ(first.status, 0);
  EXPECT_EQ(first.output, volume_.native() + ": 1 folder, 2 files, 1 photo; files: 2 added, "
                                             "0 changed, 0 deleted, 0 revived\n");
  Remove("b.txt");
  const Outcome second = RunProgram("index " + volume_.native() + "/");
  EXPECT_EQ(second.output, volume_.native() + ": 1 folder, 1 file, 1 photo; files: 0 added, "
                                              "0 changed, 1 deleted, 0 revived\n");
}

TEST_F(OrvaCatalog, ProgressIsShownOnATerminalAndErased) {
  Write("Pictures/a.jpg");
  const Outcome outcome =
      RunShell("script --quiet --return --command '" + test::ProgramPath("orva-catalog") +
               " index " + volume_.native() + "' /dev/null");
  EXPECT_EQ(outcome.status, 0);
  const std::string progress = "\r\033[K1 folder, 1 file, 1 photo\r\033[K";
  EXPECT_EQ(outcome.output.substr(0, progress.size() + volume_.native().size()),
            progress + volume_.native());
}

TEST_F(OrvaCatalog, TheProgramSaysThatItMayNotWrite) {
  const std::string command = "setpriv --bounding-set=-all --inh-caps=-all " +
                              test::ProgramPath("orva-catalog") + " index " + volume_.native() +
                              " 2>&1";
  const std::string error = "orva-catalog: cannot write " + core::GetCatalogPath(volume_.native()) +
                            ": Permission denied\n";
  const auto refused = [&] {
    const Outcome outcome = RunShell(command);
    return outcome.status == 1 && outcome.output == error;
  };
  // The volume, the catalog's folder and the catalog.
  fs::permissions(volume_, fs::perms(0555));
  EXPECT_TRUE(refused());
  fs::permissions(volume_, fs::perms(0755));
  EXPECT_EQ(RunShell(command).status, 0);
  const fs::path catalog = core::GetCatalogPath(volume_.native());
  fs::permissions(catalog.parent_path(), fs::perms(0555));
  EXPECT_TRUE(refused());
  fs::permissions(catalog.parent_path(), fs::perms(0755));
  fs::permissions(catalog, fs::perms(0444));
  EXPECT_TRUE(refused());
}

TEST_F(OrvaCatalog, TheProgramNamesNoSourceInAnErrorOfTheDatabase) {
  const fs::path catalog = core::GetCatalogPath(volume_.native());
  fs::create_directory(catalog.parent_path());
  std::ofstream(catalog) << std::string(1000, 'x');
  const Outcome outcome = RunProgram("index " + volume_.native());
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.output.rfind("orva-catalog: file is not a database (extended code 26) in ", 0),
            0U)
      << outcome.output;
}

TEST_F(OrvaCatalog, TheProgramGeneratesAndRestamps) {
  const Outcome made = RunProgram("generate " + volume_.native() +
                                  " --files 25 --per-folder 10 --names unique --tree flat");
  EXPECT_EQ(made.status, 0);
  EXPECT_EQ(made.output, volume_.native() + ": generated 25 photos in 3 folders\n");
  const Outcome stamped = RunProgram("generate " + volume_.native() + " --restamp");
  EXPECT_EQ(stamped.status, 0);
  EXPECT_EQ(stamped.output, volume_.native() + ": stamped 25 transcodings again\n");
  EXPECT_EQ(RunProgram("generate " + volume_.native() +
                       " --files 1 --per-folder 10 --names unique --tree flat")
                .output,
            volume_.native() + ": generated 1 photo in 1 folder\n");
  EXPECT_EQ(RunProgram("generate " + volume_.native() + " --restamp").output,
            volume_.native() + ": stamped 1 transcoding again\n");
}

TEST_F(OrvaCatalog, HelpAndVersionGoToStandardOutput) {
  const auto printed = [](const std::string& arguments) {
    const Outcome outcome =
        RunShell(test::ProgramPath("orva-catalog") + ' ' + arguments + " 2>/dev/null");
    EXPECT_EQ(outcome.status, 0) << arguments;
    return outcome.output;
  };
  const std::string help = printed("--help");
  for (const char* const part : {"Fills the media catalog", "Usage: orva-catalog", "index",
                                 "generate", "--help", "--version", "Exit status"}) {
    EXPECT_NE(help.find(part), std::string::npos) << part;
  }
  EXPECT_EQ(printed("-h"), help);
  const std::string generate = printed("generate --help");
  for (const char* const part : {"Usage: orva-catalog generate", "MOUNT", "--files", "--per-folder",
                                 "--names", "--tree", "--restamp"}) {
    EXPECT_NE(generate.find(part), std::string::npos) << part;
  }
  EXPECT_EQ(printed("--version"), "orva-catalog " PROGRAM_VERSION "\n");
}

TEST_F(OrvaCatalog, TheExitStatusDistinguishesWrongUsageFromFailure) {
  const Outcome usage = RunProgram("index");
  EXPECT_EQ(usage.status, 2);
  EXPECT_EQ(usage.output, "orva-catalog: MOUNT is required\n"
                          "Try 'orva-catalog index --help'.\n");
  const Outcome absent = RunProgram("index /absent");
  EXPECT_EQ(absent.status, 1);
  EXPECT_EQ(absent.output, "orva-catalog: /absent is not a directory\n");
  const Outcome noCatalog = RunProgram("generate " + volume_.native() + " --restamp");
  EXPECT_EQ(noCatalog.status, 1);
  EXPECT_EQ(noCatalog.output, "orva-catalog: " + volume_.native() + " has no catalog\n");
  EXPECT_FALSE(fs::exists(volume_ / ".orva"));
}

TEST_F(OrvaCatalog, AFileThatIsNotADatabaseIsAFailure) {
  fs::create_directory(volume_ / ".orva");
  std::ofstream(volume_ / ".orva" / "orva.db") << std::string(4096, 'x');
  const Outcome outcome = RunProgram("index " + volume_.native());
  EXPECT_EQ(outcome.status, 1);
  EXPECT_NE(outcome.output.find("file is not a database"), std::string::npos) << outcome.output;
}

TEST_F(OrvaCatalog, AHomeThatCannotBeCreatedIsAFailure) {
  std::ofstream(volume_ / ".orva") << "a file";
  const Outcome outcome = RunProgram("index " + volume_.native());
  EXPECT_EQ(outcome.status, 1);
  EXPECT_NE(outcome.output.find(volume_.native() + "/.orva"), std::string::npos) << outcome.output;
}

} // namespace

#include "DaemonLayerTest.h"

#include "Catalog.h"
#include "DBMerger.h"
#include "Deadline.h"
#include "PhotoDB.h"
#include "VolumeInfoManager.h"

#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"

#include <sys/socket.h>
#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <future>
#include <stdexcept>
#include <system_error>
#include <thread>

namespace orva::test {
namespace {

using dbmerger::DBMerger;
using dbmerger::PhotoDB;
using dbmerger::VolumeInfo;
using dbmerger::VolumeInfoManager;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

const std::string MASTER = "/shares/Master/";
const std::string VOLUME = "/shares/Vol/";

/// A value that is too long to be read, so that its row cannot be read either.
const std::string UNREADABLE = "zeroblob(20000000)";

class DBMergerTest : public DaemonLayerTest {
protected:
  DBMergerTest() {
    MakeDirectory(MASTER);
    std::filesystem::current_path(MakeDirectory("/tmp/scratch"));
  }

  ~DBMergerTest() override {
    merger.stopRequested = true;
    merger.Wait();
  }

  /// Merges the volume. Returns the standard output.
  std::string Merge() {
    return OutputOf([&] { merger.MergeDB(MASTER, VOLUME); });
  }

  std::string ReMerge() {
    return OutputOf([&] { merger.ReMergeDB(MASTER, VOLUME); });
  }

  /// Two folders with three photos.
  void AddPhotos() {
    catalog.AddFolder("a/", 11);
    catalog.AddFolder("a/b/", 12);
    catalog.AddPhoto("top.jpg", 21, 100);
    catalog.AddPhoto("a/one.jpg", 22, 300);
    catalog.AddPhoto("a/b/two.jpg", 23, 200);
  }

  /// The only error in the log: that of a failed merge, without its beginning.
  std::string FailureOfTheMerge() {
    const std::string beginning = "Error that we will ignore ";
    Log lines = Logged();
    std::erase_if(lines, [](const LogLine& line) { return line.priority == Info("").priority; });
    if (lines.size() != 1 || lines[0].priority != Error("").priority ||
        !lines[0].text.starts_with(beginning) || !lines[0].text.ends_with('\n')) {
      throw std::logic_error("not the only error of a failed merge: " +
                             ::testing::PrintToString(lines));
    }
    return lines[0].text.substr(beginning.size());
  }

  Catalog catalog{VOLUME};
  DBMerger merger;
};

std::string Processing(const std::string& path, bool isDeleted = false, int status = 3) {
  return "Processing file " + path + " isdeleted=" + (isDeleted ? "1" : "0") +
         " status = " + std::to_string(status) + "\n";
}

std::string Adding(const std::string& path) {
  return Processing(path) + "Adding file " + path + " for mount " + VOLUME + "\n";
}

// The thread.

TEST_F(DaemonLayerTest, MergerLogsTheRegisteredMountPoints) {
  for (const char* const mountPoint : {"/shares/b/", "/shares/a/", "/shares/c/"}) {
    VolumeInfo volume{.mountPoint = MakeDirectory(mountPoint)};
    VolumeInfoManager::Instance().addVolumeInfo(volume);
  }
  DBMerger merger;
  EXPECT_FALSE(merger.stopRequested);
  merger.Wait();
  EXPECT_THAT(LoggedByAllThreads(), ElementsAre(Info("Iterating over mount point /shares/b/\n"),
                                                Info("Iterating over mount point /shares/a/\n"),
                                                Info("Iterating over mount point /shares/c/\n")));
}

TEST_F(DaemonLayerTest, MergerWithoutVolumesEndsSilentlyAndCreatesTheRegistry) {
  DBMerger merger;
  EXPECT_NE(nullptr, VolumeInfoManager::instance);
  merger.Wait();
  EXPECT_THAT(LoggedByAllThreads(), IsEmpty());
}

TEST_F(DaemonLayerTest, MergerCopiesTheRegistryWhenItIsCreated) {
  VolumeInfo volume{.mountPoint = MakeDirectory("/shares/a/")};
  VolumeInfoManager::Instance().addVolumeInfo(volume);
  DBMerger merger;
  VolumeInfoManager::Instance().removeVolumeInfo(volume);
  merger.Wait();
  EXPECT_THAT(LoggedByAllThreads(), ElementsAre(Info("Iterating over mount point /shares/a/\n")));
}

TEST_F(DaemonLayerTest, MergersBodyCanBeRunAgain) {
  VolumeInfo volume{.mountPoint = MakeDirectory("/shares/a/")};
  VolumeInfoManager::Instance().addVolumeInfo(volume);
  DBMerger merger;
  merger.Wait();
  merger.Run();
  merger.Create(8, 0, false);
  merger.Wait();
  const LogLine line = Info("Iterating over mount point /shares/a/\n");
  EXPECT_THAT(LoggedByAllThreads(), ElementsAre(line, line, line));
}

/// A system log that is full, because it is not read, before the thread of a merger has logged all
/// volumes.
class FullLog : public ::testing::Test {
protected:
  static constexpr int VOLUMES = 900;

  FullLog() {
    for (int i = 0; i < VOLUMES; ++i) {
      VolumeInfo volume{.mountPoint = MakeDirectory("/shares/" + std::to_string(i) + "/")};
      VolumeInfoManager::Instance().addVolumeInfo(volume);
    }
    const util::Socket::Address address("/dev/log");
    const timeval deadline{.tv_sec = DEADLINE.count(), .tv_usec = 0};
    if (bind(socket_.Get(), address.Get(), address.Length()) != 0 ||
        setsockopt(socket_.Get(), SOL_SOCKET, SO_RCVTIMEO, &deadline, sizeof deadline) != 0) {
      throw std::system_error(errno, std::generic_category(), "/dev/log");
    }
  }

  /// The next line.
  std::string Read() const {
    std::string line(1000, '\0');
    const ssize_t size = recv(socket_.Get(), line.data(), line.size(), 0);
    line.resize(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
    return line;
  }

private:
  util::FileDescriptor socket_{socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)};
};

TEST_F(FullLog, DestroyingAMergerNeitherStopsNorJoinsItsThread) {
  auto destroyed = std::async(std::launch::async, [] { std::make_unique<DBMerger>().reset(); });
  EXPECT_EQ(std::future_status::ready, destroyed.wait_for(DEADLINE));
  for (int i = 0; i < VOLUMES; ++i) {
    ASSERT_THAT(Read(), HasSubstr("Iterating over mount point /shares/" + std::to_string(i) + "/"));
  }
}

// Merges.

TEST_F(DBMergerTest, FirstMergeAddsEverything) {
  AddPhotos();
  EXPECT_EQ(Adding("/shares/Vol/a/b/two.jpg") + Adding("/shares/Vol/a/one.jpg") +
                Adding("/shares/Vol/top.jpg"),
            Merge());
  EXPECT_EQ(MergeLines(VOLUME, 3, 3), Logged());
  EXPECT_THAT(MergedRows(MASTER, "SELECT * FROM Folders"),
              ElementsAre("1|-1|/shares/|0|<DUMMY>", "2|1|/shares/Vol/|0|/shares/Vol/",
                          "3|2|/shares/Vol/a/|11|/shares/Vol/",
                          "4|3|/shares/Vol/a/b/|12|/shares/Vol/"));
  EXPECT_THAT(MergedRows(MASTER, "SELECT * FROM Files"),
              ElementsAre("1|4|two.jpg|23|/shares/Vol/|23", "2|3|one.jpg|22|/shares/Vol/|22",
                          "3|2|top.jpg|21|/shares/Vol/|21"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|3|3|300"));
}

TEST_F(DBMergerTest, TranscodingAtTheEpochIsNotNew) {
  catalog.AddPhoto("a.jpg", 0, 0);
  EXPECT_EQ("", Merge());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|1|1|0"));
}

TEST_F(DBMergerTest, LaterMergeReadsOnlyWhatChangedSince) {
  AddPhotos();
  Merge();
  Logged();
  catalog.AddPhoto("a/new.jpg", 24, 301);
  catalog.AddPhoto("a/same second.jpg", 25, 300);
  EXPECT_EQ(Adding("/shares/Vol/a/new.jpg"), Merge());
  EXPECT_EQ(MergeLines(VOLUME, 3, 1), Logged());
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/a/b/two.jpg", "/shares/Vol/a/new.jpg",
                                               "/shares/Vol/a/one.jpg", "/shares/Vol/top.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|5|5|301"));
}

TEST_F(DBMergerTest, UnchangedMergeRefreshesTheCountsOnly) {
  AddPhotos();
  Merge();
  Logged();
  catalog.Add(FileRow{.id = 9, .path = "unfinished.jpg", .status = 1});
  catalog.AddFolder("new/");
  EXPECT_EQ("", Merge());
  EXPECT_EQ(MergeLines(VOLUME, 4, 0), Logged());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|3|4|300"));
  EXPECT_THAT(MergedRows(MASTER, "SELECT count(*) FROM Folders WHERE name LIKE '%/new/'"),
              ElementsAre("1"));
}

TEST_F(DBMergerTest, DeletedFileIsRemovedAndAdvancesTheTime) {
  AddPhotos();
  Merge();
  catalog.DeletePhoto("a/one.jpg", 400);
  const std::string path = "/shares/Vol/a/one.jpg";
  EXPECT_EQ(Processing(path, true) + "Removing file " + path + " for mount /shares/Vol/\n" +
                "Deleting " + path + "\nFound parent folder 3 for " + path + "\n",
            Merge());
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/a/b/two.jpg", "/shares/Vol/top.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|2|2|400"));
}

TEST_F(DBMergerTest, DeletedFileThatWasNeverMergedAdvancesTheTime) {
  AddPhotos();
  catalog.DeletePhoto("a/one.jpg", 400);
  Merge();
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/a/b/two.jpg", "/shares/Vol/top.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|2|2|400"));
}

TEST_F(DBMergerTest, DeletedFolderIsRemovedWithItsFiles) {
  AddPhotos();
  Merge();
  catalog.DeleteFolder("a/b/");
  EXPECT_EQ("Deleting /shares/Vol/a/b/\nFound folder 4 for /shares/Vol/a/b/\n", Merge());
  EXPECT_THAT(MergedFolders(MASTER),
              ElementsAre("/shares/Vol/|/shares/Vol/", "/shares/Vol/a/|/shares/Vol/"));
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/a/one.jpg", "/shares/Vol/top.jpg"));
}

TEST_F(DBMergerTest, SystemFilesAreSkippedAndReadAgain) {
  catalog.AddPhoto("system.jpg", 0, 500, {.system = true});
  const std::string line = Processing("/shares/Vol/system.jpg");
  EXPECT_EQ(line, Merge());
  EXPECT_THAT(MergedFiles(MASTER), IsEmpty());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|0|0|0"));
  EXPECT_EQ(line, Merge());
  EXPECT_EQ(MergeLines(VOLUME, 1, 1) + MergeLines(VOLUME, 1, 1), Logged());
}

TEST_F(DBMergerTest, HiddenAndBackupFilesAreMerged) {
  catalog.AddPhoto("backup.jpg", 0, 10, {.backup = true});
  catalog.AddPhoto("hidden.jpg", 0, 20, {.hidden = true});
  Merge();
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/backup.jpg", "/shares/Vol/hidden.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|0|0|20"));
}

TEST_F(DBMergerTest, FilesOfInvisibleFoldersAreLeftOutButAdvanceTheTime) {
  catalog.AddFolder("hidden/", 0, {.hidden = true});
  catalog.AddPhoto("hidden/a.jpg", 0, 10);
  EXPECT_EQ(Adding("/shares/Vol/hidden/a.jpg"), Merge());
  EXPECT_THAT(MergedFiles(MASTER), IsEmpty());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|1|1|10"));
}

TEST_F(DBMergerTest, FileWithTwoTranscodingsIsAddedOnce) {
  catalog.AddPhoto("a.jpg", 0, 10);
  catalog.Add(TranscodingRow{.sourceId = 1, .lastUpdatedDate = 30});
  EXPECT_EQ(Adding("/shares/Vol/a.jpg") + Adding("/shares/Vol/a.jpg"), Merge());
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/a.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|1|1|30"));
}

TEST_F(DBMergerTest, TimeNeverMovesBackwards) {
  // Read as 32 bits, this is long before the epoch.
  catalog.AddPhoto("a.jpg", 0, 2147483648);
  Merge();
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/a.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|1|1|0"));
}

TEST_F(DBMergerTest, MergeDoesNotChangeTheTimeOfTheStatus) {
  AddPhotos();
  Merge();
  MergedRows(MASTER, "UPDATE Status SET mdate = 4242, desc = 'text'");
  catalog.AddPhoto("new.jpg", 0, 900);
  Merge();
  EXPECT_THAT(MergedRows(MASTER, "SELECT * FROM Status"), ElementsAre("1|2.0|4242|text|0"));
}

TEST_F(DBMergerTest, SeveralVolumesAreMerged) {
  AddPhotos();
  Merge();
  Catalog other("/shares/Other/");
  other.AddPhoto("x.jpg", 0, 50);
  OutputOf([&] { merger.MergeDB(MASTER, "/shares/Other/"); });
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Other/x.jpg", "/shares/Vol/a/b/two.jpg",
                                               "/shares/Vol/a/one.jpg", "/shares/Vol/top.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER),
              ElementsAre("/shares/Other/|1|1|50", "/shares/Vol/|3|3|300"));
}

TEST_F(DBMergerTest, CatalogIsNotChanged) {
  AddPhotos();
  const auto before = catalog.Rows().Run("PRAGMA data_version");
  Merge();
  EXPECT_EQ(before, catalog.Rows().Run("PRAGMA data_version"));
  EXPECT_FALSE(std::filesystem::exists("/shares/Vol/.zophotos"));
}

TEST_F(DBMergerTest, StoppedMergeCommitsTheCountsAndAnUnchangedTime) {
  AddPhotos();
  merger.stopRequested = true;
  EXPECT_EQ("", Merge());
  EXPECT_EQ(MergeLines(VOLUME, 3, 3), Logged());
  EXPECT_THAT(MergedFolders(MASTER), IsEmpty());
  EXPECT_THAT(MergedFiles(MASTER), IsEmpty());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|3|3|0"));
  EXPECT_TRUE(merger.stopRequested) << "the merger does not clear it";
}

// Re-merges and removals.

TEST_F(DBMergerTest, ReMergeStartsFromTheBeginning) {
  AddPhotos();
  Merge();
  Logged();
  catalog.Rows().Run("DELETE FROM Files WHERE id = 2");
  catalog.Rows().Run("DELETE FROM Folders WHERE path = 'a/b/'");
  EXPECT_EQ(Adding("/shares/Vol/a/b/two.jpg") + Adding("/shares/Vol/top.jpg"), ReMerge());
  EXPECT_EQ(MergeLines(VOLUME, 2, 2), Logged());
  EXPECT_THAT(MergedFolders(MASTER),
              ElementsAre("/shares/Vol/|/shares/Vol/", "/shares/Vol/a/|/shares/Vol/"));
  EXPECT_THAT(MergedFiles(MASTER), ElementsAre("/shares/Vol/top.jpg"));
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|2|2|200"));
}

TEST_F(DBMergerTest, ReMergeOfAVolumeThatWasNeverMergedMergesIt) {
  AddPhotos();
  ReMerge();
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|3|3|300"));
  EXPECT_EQ(3U, MergedFiles(MASTER).size());
}

TEST_F(DBMergerTest, FailedReMergeLeavesTheVolumeEmptyAndItsTimeZero) {
  AddPhotos();
  Merge();
  Logged();
  catalog.Rows().Run("DROP TABLE Transcodings");
  EXPECT_EQ("", ReMerge());
  EXPECT_THAT(FailureOfTheMerge(), ::testing::HasSubstr("no such table: Transcodings"));
  EXPECT_THAT(MergedFiles(MASTER), IsEmpty());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|3|3|0"));
}

TEST_F(DBMergerTest, FailedDeletionInAReMergeIsThrown) {
  AddPhotos();
  Merge();
  MergedRows(MASTER, "DROP TABLE Statistics");
  EXPECT_THROW(ReMerge(), std::string);
}

TEST_F(DBMergerTest, RemovedVolumeKeepsItsCounts) {
  AddPhotos();
  Merge();
  Logged();
  EXPECT_EQ("", OutputOf([&] { merger.RemoveVolume(MASTER, VOLUME); }));
  EXPECT_THAT(MergedFolders(MASTER), IsEmpty());
  EXPECT_THAT(MergedFiles(MASTER), IsEmpty());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|3|3|0"));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(DBMergerTest, RemovalWithoutAMasterChangesNoVolume) {
  AddPhotos();
  Merge();
  Logged();
  const Lines before = MergedContent(MASTER);
  merger.RemoveVolume("DUMMY_MOUNT_POINT", VOLUME);
  EXPECT_EQ(before, MergedContent(MASTER));
  EXPECT_TRUE(std::filesystem::exists("/tmp/scratch/.zophotos/zophotos.db"));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(DBMergerTest, FailedRemovalIsThrown) {
  PhotoDB(MASTER).Init();
  MergedRows(MASTER, "DROP TABLE Files");
  EXPECT_THROW(merger.RemoveVolume(MASTER, VOLUME), std::string);
}

// Failures.

/// A merge in which an insertion fails, with each of SQLite's ways to resolve a conflict.
class RefusedMergeTest : public DBMergerTest, public ::testing::WithParamInterface<const char*> {};

TEST_P(RefusedMergeTest, LeavesEverythingAsBefore) {
  AddPhotos();
  Merge();
  Logged();
  MergedRows(MASTER, "ALTER TABLE Files RENAME TO Stored");
  MergedRows(MASTER, std::string("CREATE TABLE Files(file_id INTEGER PRIMARY KEY, folder_id, name, "
                                 "modified_date UNIQUE ON CONFLICT ") +
                         GetParam() + ", volume, created_date)");
  MergedRows(MASTER, "INSERT INTO Files SELECT * FROM Stored");
  const Lines before = MergedContent(MASTER);
  catalog.AddFolder("c/");
  catalog.AddPhoto("c/a.jpg", 31, 400);
  catalog.AddPhoto("c/m.jpg", 31, 401);
  catalog.AddPhoto("c/z.jpg", 33, 402);

  EXPECT_EQ(Adding("/shares/Vol/c/a.jpg") + Adding("/shares/Vol/c/m.jpg"), Merge());

  EXPECT_THAT(FailureOfTheMerge(),
              ::testing::AllOf(::testing::StartsWith("src/zophotodbmerger/PhotoDB.cpp:"),
                               ::testing::HasSubstr("UNIQUE constraint failed"),
                               ::testing::HasSubstr("INSERT INTO Files")));
  EXPECT_EQ(before, MergedContent(MASTER));

  catalog.Rows().Run("UPDATE Files SET lastModifiedDate = 32 WHERE id = 5");
  Merge();
  EXPECT_EQ(6U, MergedFiles(MASTER).size());
  EXPECT_THAT(MergedStatistics(MASTER), ElementsAre("/shares/Vol/|6|6|402"));
}

INSTANTIATE_TEST_SUITE_P(Ways, RefusedMergeTest, ::testing::Values("ABORT", "FAIL", "ROLLBACK"),
                         [](const auto& way) { return std::string(way.param); });

TEST_F(DBMergerTest, FailedStatisticsFailTheMerge) {
  AddPhotos();
  Merge();
  Logged();
  MergedRows(MASTER, "INSERT INTO Statistics VALUES(9, '/shares/Other/', 0, 0, 400)");
  MergedRows(MASTER, "CREATE UNIQUE INDEX refuse ON Statistics(last_updated_time)");
  const Lines before = MergedContent(MASTER);
  catalog.AddPhoto("new.jpg", 0, 400);
  Merge();
  Log errors = Logged();
  std::erase_if(errors, [](const LogLine& line) { return line.priority == Info("").priority; });
  ASSERT_EQ(2U, errors.size());
  EXPECT_EQ(Error("Could not update stats for /shares/Vol/. Return code 19"), errors[0]);
  EXPECT_THAT(errors[1].text, ::testing::StartsWith("Error that we will ignore "));
  EXPECT_EQ(before, MergedContent(MASTER));
}

TEST_F(DBMergerTest, StatisticsThatCannotBeMadeFailTheMerge) {
  AddPhotos();
  PhotoDB(MASTER).Init();
  MergedRows(MASTER, "INSERT INTO Statistics VALUES(9, '/shares/Other/', 0, 0, 0)");
  MergedRows(MASTER, "CREATE UNIQUE INDEX refuse ON Statistics(photos_total)");
  const Lines before = MergedContent(MASTER);
  EXPECT_EQ("", Merge());
  const Log log = Logged();
  ASSERT_EQ(2U, log.size());
  EXPECT_EQ(Error("Could not insert stats for /shares/Vol/ "), log[0]);
  EXPECT_EQ(Error("Error that we will ignore No statistics for /shares/Vol/\n"), log[1]);
  EXPECT_EQ(before, MergedContent(MASTER));
}

TEST_F(DBMergerTest, VolumeWithoutACatalogFailsTheMergeBeforeItBegins) {
  MakeDirectory("/shares/Other");
  merger.MergeDB(MASTER, "/shares/Other/");
  EXPECT_NE("", FailureOfTheMerge());
  merger.MergeDB(MASTER, "/shares/Gone/");
  EXPECT_NE("", FailureOfTheMerge());
  EXPECT_FALSE(std::filesystem::exists(MASTER + ".zophotos"));
}

TEST_F(DBMergerTest, FaultInTheMiddleOfTheFoldersFailsTheMerge) {
  AddPhotos();
  catalog.Rows().Run("UPDATE Folders SET name = " + UNREADABLE + " WHERE id = 2");
  PhotoDB(MASTER).Init();
  const Lines before = MergedContent(MASTER);
  EXPECT_EQ("", Merge());
  EXPECT_THAT(FailureOfTheMerge(), ::testing::HasSubstr("SELECT * FROM Folders"));
  EXPECT_EQ(before, MergedContent(MASTER));
}

TEST_F(DBMergerTest, FaultInTheMiddleOfTheFilesFailsTheMerge) {
  AddPhotos();
  catalog.Rows().Run("UPDATE Files SET name = " + UNREADABLE + " WHERE id = 2");
  PhotoDB(MASTER).Init();
  const Lines before = MergedContent(MASTER);
  EXPECT_EQ("", Merge());
  EXPECT_THAT(FailureOfTheMerge(), ::testing::HasSubstr("from Files f, Transcodings t"));
  EXPECT_EQ(before, MergedContent(MASTER));
}

TEST_F(DBMergerTest, FaultInTheCountsFailsTheMerge) {
  AddPhotos();
  catalog.Add(FileRow{.id = 9, .path = "without a transcoding"});
  catalog.Rows().Run("UPDATE Files SET status = " + UNREADABLE + " WHERE id = 9");
  PhotoDB(MASTER).Init();
  const Lines before = MergedContent(MASTER);
  EXPECT_EQ("", Merge());
  EXPECT_THAT(FailureOfTheMerge(), ::testing::HasSubstr("SELECT count(*) FROM Files"));
  EXPECT_EQ(before, MergedContent(MASTER));
}

TEST_F(DBMergerTest, CatalogThatStaysLockedFailsTheMerge) {
  AddPhotos();
  Merge();
  Logged();
  const Lines before = MergedContent(MASTER);
  catalog.Rows().Run("BEGIN EXCLUSIVE");
  EXPECT_EQ("", Merge());
  catalog.Rows().Run("COMMIT");
  EXPECT_THAT(FailureOfTheMerge(), ::testing::HasSubstr("database is locked"));
  EXPECT_EQ(before, MergedContent(MASTER));
}

/// True while another connection changes the merged database.
bool IsBeingMerged(const Database& merged) {
  try {
    merged.Run("BEGIN IMMEDIATE");
  } catch (const std::runtime_error&) {
    return true;
  }
  merged.Run("ROLLBACK");
  return false;
}

/// Commits the catalog once the merge has begun.
std::thread CommitDuringTheMerge(const Catalog& catalog) {
  return std::thread([&catalog] {
    const Database merged(MergedDatabasePath(MASTER));
    merged.Run("PRAGMA busy_timeout = 0");
    const auto deadline = std::chrono::steady_clock::now() + DEADLINE;
    while (!IsBeingMerged(merged) && std::chrono::steady_clock::now() < deadline) {
      std::this_thread::yield();
    }
    catalog.Rows().Run("COMMIT");
  });
}

TEST_F(DBMergerTest, CatalogThatIsBeingWrittenIsWaitedFor) {
  AddPhotos();
  PhotoDB(MASTER).Init();
  catalog.Rows().Run("BEGIN EXCLUSIVE");
  catalog.AddPhoto("just.jpg", 0, 400);
  std::thread indexer = CommitDuringTheMerge(catalog);
  Merge();
  indexer.join();
  EXPECT_EQ(MergeLines(VOLUME, 3, 4), Logged());
  EXPECT_EQ(4U, MergedFiles(MASTER).size());
}

TEST_F(DBMergerTest, CatalogThatGrowsWhileItIsWaitedForIsReadCompletely) {
  AddPhotos();
  PhotoDB(MASTER).Init();
  catalog.Rows().Run("BEGIN EXCLUSIVE");
  for (int i = 10; i < 10'010; ++i) {
    catalog.AddPhoto("photo" + std::to_string(i), 0, 400);
  }
  std::thread indexer = CommitDuringTheMerge(catalog);
  Merge();
  indexer.join();
  EXPECT_EQ(MergeLines(VOLUME, 3, 10'003), Logged());
  EXPECT_EQ(10'003U, MergedFiles(MASTER).size());
}

TEST_F(DBMergerTest, ReaderOfTheMergedDatabaseDoesNotPreventTheNextMerge) {
  AddPhotos();
  Merge();
  Logged();
  const Database reader(MergedDatabasePath(MASTER));
  EXPECT_THAT(reader.Run("SELECT count(*) FROM Files"), ElementsAre("3"));
  catalog.AddPhoto("new.jpg", 0, 400);
  Merge();
  EXPECT_EQ(MergeLines(VOLUME, 3, 1), Logged());
  EXPECT_THAT(reader.Run("SELECT count(*) FROM Files"), ElementsAre("4"));
}

TEST_F(DBMergerTest, UnusableMasterIsThrown) {
  AddPhotos();
  std::ofstream(MASTER + ".zophotos") << "in the way";
  EXPECT_EQ("Invalid DB location : '/shares/Master/.zophotos'",
            Thrown<PhotoDB::Error>([&] { Merge(); }).Message());
  EXPECT_THROW(ReMerge(), PhotoDB::Error);
  EXPECT_THROW(merger.RemoveVolume(MASTER, VOLUME), PhotoDB::Error);
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(DBMergerTest, MergeSucceedsAfterAFailedOne) {
  AddPhotos();
  std::ofstream(MASTER + ".zophotos") << "in the way";
  EXPECT_THROW(Merge(), PhotoDB::Error);
  std::filesystem::remove(MASTER + ".zophotos");
  Merge();
  EXPECT_EQ(3U, MergedFiles(MASTER).size());
}

} // namespace
} // namespace orva::test

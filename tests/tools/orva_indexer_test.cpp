#include "IndexerTest.h"

#include "support/OtherUsers.h"
#include "support/Programs.h"
#include "support/TestScale.h"
#include "system/DaemonProcess.h"
#include "system/Database.h"
#include "system/Deadline.h"

#include "CatalogSchema.h"
#include "Renditions.h"
#include "Sql.h"
#include "UntrustedCatalog.h"
#include "VolumeRoot.h"
#include "orva-indexer/Locator.h"
#include "orva-indexer/Volume.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"
#include "orvautil/FileDescriptor.h"

#include <gmock/gmock.h>

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <ctime>
#include <fstream>
#include <functional>
#include <iterator>
#include <optional>
#include <random>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

/// The number of events called `name`.
long Count(const Lines& events, const std::string& name) {
  return std::ranges::count(events, name);
}

/// Marks all photos of a catalog finished, as the transcoder does.
void FinishPhotos(const std::string& volume) {
  const auto database = catalog::OpenCatalog(volume);
  db::Transaction transaction(*database, catalog::BUSY_TIMEOUT);
  const std::time_t stamp = catalog::NextStamp(*database, std::time(nullptr));
  for (const auto& photo : catalog::NewestWaiting(*database, 1000)) {
    catalog::MarkFinished(*database, photo, stamp);
  }
  transaction.Commit();
}

// --- Volumes -----------------------------------------------------------------------------------

TEST_F(IndexerTest, APluggedVolumeIsWalkedAndAnnounced) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  Write(volume.Path() + "/b.txt");
  StartService();
  StartIndexer();
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_TRUE(Await([&] { return Events(volume.Path()).size() >= 3; }));
  Lines events = Events(volume.Path());
  events.resize(3);
  EXPECT_THAT(events, ElementsAre("Plugged", "Scanned", "End"));
  EXPECT_THAT(Query(volume.Path(), "SELECT path, status FROM Files ORDER BY path"),
              ElementsAre("Pictures/a.jpg|1", "b.txt|1"));
  EXPECT_THAT(Query(volume.Path(), "SELECT count(*) FROM Transcodings"), ElementsAre("0"));
  EXPECT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  EXPECT_THAT(ErrorLines(), IsEmpty());
  StopIndexer();
}

TEST_F(IndexerTest, APlainDirectoryIsAVolumeIfItsMessageSaysSo) {
  Write("/shares/Photos/a.jpg");
  StartService();
  StartIndexer();
  PlugDirectory("/shares/Photos");
  EXPECT_THAT(AwaitCatalog("/shares/Photos"), IsEmpty());
  fs::rename("/shares/Photos", "/shares/Gone");
  EXPECT_TRUE(AwaitLog("/shares/Photos/: gone"));
  EXPECT_FALSE(fs::exists("/shares/Photos"));
}

TEST_F(IndexerTest, NothingIsWrittenWhereNothingIsMounted) {
  Write("/shares/B/a.jpg");
  StartService();
  StartIndexer();
  Send("plugged", "/shares/B");
  EXPECT_TRUE(AwaitLog("/shares/B/: gone"));
  EXPECT_FALSE(fs::exists("/shares/B/.orva"));
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

TEST_F(IndexerTest, TheFolderOfTheVolumesIsNoVolume) {
  const Volume volume("A", "64m");
  StartService();
  StartIndexer();
  Send("plugged", "/shares");
  PlugDirectory("/shares/./");
  PlugDirectory("/");
  EXPECT_TRUE(Await([&] { return LogLines("not indexed").size() == 3; }));
  EXPECT_THAT(LogLines("not indexed"),
              ElementsAre("Volume /shares/: not indexed: the volumes are below it",
                          "Volume /shares/./: not indexed: the volumes are below it",
                          "Volume /: not indexed: the volumes are below it"));
  EXPECT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") == 1; }));
  EXPECT_EQ(State("/shares"), "absent");
  EXPECT_FALSE(fs::exists(CatalogOf("/shares")));
  EXPECT_FALSE(fs::exists("/.orva"));
}

TEST_F(IndexerTest, AVolumeCanBeUnmountedWhileItIsWatched) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  EXPECT_TRUE(Await([&] { return umount2(volume.Path().c_str(), 0) == 0; }));
  EXPECT_TRUE(AwaitLog("/shares/A/: gone"));
  EXPECT_THAT(fs::directory_iterator(volume.Path()), fs::directory_iterator());
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

TEST_F(IndexerTest, AVolumeThatVanishesDuringItsWalkIsNoError) {
  Volume volume("A", "512m");
  for (int folder = 0; folder < 100; ++folder) {
    const std::string path = volume.Path() + "/" + std::to_string(folder);
    fs::create_directory(path);
    for (int file = 0; file < 200; ++file) {
      std::ofstream(path + "/" + std::to_string(file) + ".jpg");
    }
  }
  StartService();
  StartIndexer();
  ASSERT_TRUE(AwaitLog("/shares/A/: walking"));
  Service().Signal(SIGSTOP); // so that it does not announce that
  volume.Unmount();
  EXPECT_TRUE(AwaitLog("/shares/A/: gone"));
  EXPECT_THAT(ErrorLines(), IsEmpty());
  StopIndexer();
}

TEST_F(IndexerTest, EverythingIsAnnouncedAgainWhenTheServiceComesBack) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/a.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  Service().Signal(SIGTERM);
  ASSERT_EQ(Service().WaitForEnd(), 0);
  StartService();
  // The observer of the test may connect after the indexer.
  EXPECT_TRUE(Await([] {
    std::ifstream file("/tmp/orva-notify.out");
    const std::string output(std::istreambuf_iterator<char>(file), {});
    return output.find("Name=\"Scanned\" MountPoint=\"/shares/A\"") != std::string::npos &&
           output.find("Name=\"End\" MountPoint=\"/shares/A\"") != std::string::npos;
  }));
  Write(volume.Path() + "/b.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

TEST_F(IndexerTest, AVolumeThatIsNotPluggedWhenTheServiceComesBackIsGone) {
  const Volume volume("A", "64m");
  fs::create_directory("/shares/Plain");
  StartService();
  StartIndexer();
  PlugDirectory("/shares/Plain");
  ASSERT_TRUE(Await([&] { return State("/shares/Plain") == "watching"; }));
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  Service().Signal(SIGTERM);
  ASSERT_EQ(Service().WaitForEnd(), 0);
  StartService();
  EXPECT_TRUE(AwaitLog("/shares/Plain/: gone"));
  EXPECT_TRUE(Await([&] { return State("/shares/Plain") == "absent"; }));
  EXPECT_EQ(State(volume.Path()), "watching");
  std::ifstream file("/tmp/orva-notify.out");
  const std::string output(std::istreambuf_iterator<char>(file), {});
  EXPECT_THAT(output, Not(HasSubstr("Name=\"Scanned\" MountPoint=\"/shares/Plain\"")));
  fs::remove_all("/shares/Plain");
}

TEST_F(IndexerTest, StartsBeforeTheService) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/a.jpg");
  StartIndexer();
  StartService();
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

// --- Changes -----------------------------------------------------------------------------------

TEST_F(IndexerTest, AChangeIsAnnouncedOnce) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  const long ends = Count(Events(volume.Path()), "End");
  Write(volume.Path() + "/Pictures/b.jpg");
  EXPECT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") == ends + 1; }));
  EXPECT_THAT(Query(volume.Path(), "SELECT path FROM Files ORDER BY path"),
              ElementsAre("Pictures/a.jpg", "Pictures/b.jpg"));
  EXPECT_EQ(Count(Events(volume.Path()), "Scanned"), 1);
}

/// The work on a volume in the test's own process, without the other programs.
class VolumeWorkTest : public IndexerTest {
protected:
  VolumeWorkTest() { Restart(); }

  /// Begins as after a start of the indexer.
  void Restart() {
    volume_.emplace(disk_.Path() + '/', catalog::VolumeRoot::Kind::Mount);
    EXPECT_TRUE(WorkUntil([this] { return volume_->IsWalked(); }));
  }

  std::string At(const std::string& path) const { return disk_.Path() + '/' + path; }

  /// Works as the service does until `condition` holds. False after the deadline.
  bool WorkUntil(const std::function<bool()>& condition) {
    return Await([&] {
      volume_->ReadEvents();
      if (volume_->NextWork() <= indexer::Clock::now()) {
        const auto result = volume_->Work([] {}, [](const db::DB&) {}, std::time(nullptr));
        changes_ += result.hasChanged ? 1 : 0;
      }
      return condition();
    });
  }

  /// Works until a query of the catalog has this result.
  bool WorkUntilFound(const std::string& sql, const Lines& rows) {
    return WorkUntil([&] { return Query(disk_.Path(), sql) == rows; });
  }

  indexer::Volume& TheVolume() { return *volume_; }
  test::Volume& Disk() { return disk_; }

  /// Pieces of work after which the volume is announced, since the last call.
  int TakeChanges() { return std::exchange(changes_, 0); }

private:
  test::Volume disk_{"A", "64m"};
  std::optional<indexer::Volume> volume_;
  int changes_ = 0;
};

TEST_F(VolumeWorkTest, OnlyChangesOfPhotosAndFoldersAreAnnounced) {
  constexpr char SIZES[] = "SELECT path, size FROM Files WHERE isDeleted = 0 ORDER BY path";
  Write(At("Notes/a.txt"), "1");
  ASSERT_TRUE(WorkUntilFound(SIZES, {"Notes/a.txt|1"}));
  EXPECT_GT(TakeChanges(), 0); // of the folder
  Write(At("Notes/a.txt"), "12");
  ASSERT_TRUE(WorkUntilFound(SIZES, {"Notes/a.txt|2"}));
  Write(At("Notes/b.txt"), "1");
  ASSERT_TRUE(WorkUntilFound(SIZES, {"Notes/a.txt|2", "Notes/b.txt|1"}));
  fs::remove(At("Notes/a.txt"));
  ASSERT_TRUE(WorkUntilFound(SIZES, {"Notes/b.txt|1"}));
  EXPECT_EQ(TakeChanges(), 0);
  Write(At("Notes/c.jpg"), "1");
  ASSERT_TRUE(WorkUntilFound(SIZES, {"Notes/b.txt|1", "Notes/c.jpg|1"}));
  EXPECT_GT(TakeChanges(), 0);
  fs::remove(At("Notes/c.jpg"));
  ASSERT_TRUE(WorkUntilFound(SIZES, {"Notes/b.txt|1"}));
  EXPECT_GT(TakeChanges(), 0);
  fs::remove_all(At("Notes"));
  ASSERT_TRUE(WorkUntilFound(SIZES, {}));
  EXPECT_GT(TakeChanges(), 0);
}

TEST_F(IndexerTest, ACatalogIsMadeAgainWhenItsFolderIsRemoved) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  fs::remove_all(volume.Path() + "/.orva");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "Scanned") == 2; }));
  fs::rename(volume.Path() + "/.orva", "/shares/A/elsewhere");
  EXPECT_TRUE(Await([&] { return fs::exists(CatalogOf(volume.Path())); }));
}

TEST_F(IndexerTest, AChangeOfADiskThatIsMountedTwiceIsAnnouncedForBothVolumes) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/a.jpg");
  StartService();
  StartIndexer();
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") == 1; }));
  fs::create_directory("/shares/B");
  ASSERT_EQ(mount(volume.Path().c_str(), "/shares/B", nullptr, MS_BIND, nullptr), 0);
  ASSERT_TRUE(Await([&] { return Count(Events("/shares/B"), "End") == 1; }));
  for (const std::string path : {"/shares/A", "/shares/B"}) {
    const long endsOfA = Count(Events(volume.Path()), "End");
    const long endsOfB = Count(Events("/shares/B"), "End");
    Write(path + "/b.jpg", path);
    EXPECT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") > endsOfA; }));
    EXPECT_TRUE(Await([&] { return Count(Events("/shares/B"), "End") > endsOfB; }));
  }
  umount2("/shares/B", MNT_DETACH);
}

TEST_F(IndexerTest, PhotosThatArriveOneByOneTakeFewStamps) {
  const Volume volume("A", "64m");
  fs::create_directory(volume.Path() + "/Pictures");
  StartService();
  StartIndexer();
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") == 1; }));
  constexpr char NEWEST[] = "SELECT newestStamp FROM Identity";
  const std::time_t begin = std::time(nullptr);
  int photos = 0;
  ASSERT_TRUE(Await([&] { // checks about 20 times a second
    Write(volume.Path() + "/Pictures/" + std::to_string(photos) + ".jpg");
    return ++photos == 250;
  }));
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  // One stamp, and one announcement, in two seconds.
  const Lines newest = Query(volume.Path(), NEWEST);
  const std::time_t now = std::time(nullptr);
  ASSERT_EQ(newest.size(), 1U);
  EXPECT_LE(std::stoll(newest.front()), now + 1);
  EXPECT_LE(Count(Events(volume.Path()), "End"), (now - begin) / 2 + 3);
  EXPECT_THAT(Events(volume.Path()), Not(Contains("TranscodedBatch")));
}

TEST_F(IndexerTest, AFileWaitsWhileItIsWrittenAndOthersDoNot) {
  const Volume volume("A", "64m");
  StartService();
  StartIndexer();
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") == 1; }));
  std::ofstream slow(volume.Path() + "/slow.jpg");
  slow << "half" << std::flush;
  Write(volume.Path() + "/other.jpg");
  ASSERT_TRUE(
      Await([&] { return Query(volume.Path(), "SELECT path FROM Files") == Lines{"other.jpg"}; }));
  slow << " whole" << std::flush;
  Write(volume.Path() + "/third.jpg");
  ASSERT_TRUE(Await([&] {
    return Query(volume.Path(), "SELECT path FROM Files ORDER BY path") ==
           (Lines{"other.jpg", "third.jpg"});
  }));
  slow.close();
  EXPECT_TRUE(Await([&] {
    return Query(volume.Path(), "SELECT size FROM Files WHERE path = 'slow.jpg'") == Lines{"10"};
  }));
}

TEST_F(VolumeWorkTest, APhotoThatIsReplacedByOneOfTheSameSizeAndTimeIsRenderedAgain) {
  constexpr char STATES[] = "SELECT path, status FROM Files WHERE isDeleted = 0 ORDER BY path";
  const auto time = fs::file_time_type::clock::now() - std::chrono::hours(1);
  const auto write = [&](const std::string& name, const std::string& content) {
    Write(At(name), content);
    fs::last_write_time(At(name), time);
  };
  const auto finish = [&](const std::string& name) {
    ASSERT_TRUE(WorkUntil([&] {
      const auto next = TheVolume().NextWork();
      return next > indexer::Clock::now() + std::chrono::seconds(5) &&
             Query(Disk().Path(), "SELECT count(*) FROM Files WHERE isDeleted = 0 AND path = '" +
                                      name + "'") == Lines{"1"};
    }));
    FinishPhotos(Disk().Path());
  };
  write("a.jpg", "one");
  write("b.jpg", "two");
  finish("b.jpg");
  ASSERT_EQ(Query(Disk().Path(), STATES), (Lines{"a.jpg|3", "b.jpg|3"}));
  fs::rename(At("b.jpg"), At("a.jpg"));
  EXPECT_TRUE(WorkUntilFound(STATES, {"a.jpg|1"}));
  finish("a.jpg");
  write("a.jpg", "new");
  EXPECT_TRUE(WorkUntilFound(STATES, {"a.jpg|1"}));
  finish("a.jpg");
  // A program that opens it for writing and writes nothing changes nothing.
  std::fstream(At("a.jpg"), std::ios::in | std::ios::out).close();
  Write(At("c.txt"));
  EXPECT_TRUE(WorkUntilFound(STATES, {"a.jpg|3", "c.txt|1"}));
}

TEST_F(IndexerTest, AChangeOfAFileIsEnteredUnderItsOtherNamesToo) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/One/a.jpg", "1");
  fs::create_directory(volume.Path() + "/Two");
  fs::create_hard_link(volume.Path() + "/One/a.jpg", volume.Path() + "/Two/b.jpg");
  StartService();
  StartIndexerIn({"PROBE_CLOCK_SPEED=20"}); // the walk of all folders is on a timer
  ASSERT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  Write(volume.Path() + "/One/a.jpg", "12");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

TEST_F(VolumeWorkTest, AFileThatIsTruncatedByItsNameIsEnteredSoon) {
  constexpr char SIZE[] = "SELECT size FROM Files WHERE path = 'a.jpg'";
  Write(At("a.jpg"), "whole");
  ASSERT_TRUE(WorkUntilFound(SIZE, {"5"}));
  ASSERT_EQ(truncate(At("a.jpg").c_str(), 3), 0);
  EXPECT_TRUE(WorkUntilFound(SIZE, {"3"}));
  // While another program writes it, it waits.
  std::ofstream slow(At("a.jpg"), std::ios::app);
  slow << "more" << std::flush;
  Write(At("b.jpg"));
  ASSERT_TRUE(WorkUntilFound("SELECT count(*) FROM Files", {"2"}));
  EXPECT_EQ(Query(Disk().Path(), SIZE), Lines{"3"});
  slow.close();
  EXPECT_TRUE(WorkUntilFound(SIZE, {"7"}));
}

/// A photo that a program is writing, among others.
class UnfinishedPhotoTest : public VolumeWorkTest {
protected:
  void Begin(const std::string& path) {
    fs::create_directories(fs::path(At(path)).parent_path());
    slow_.open(At(path));
    slow_ << "half" << std::flush;
  }

  /// Whether another photo is entered, and the one that is being written is not.
  bool IsEnteredAlone(const std::string& other) {
    Write(At(other), "1");
    found_.push_back(other + "|1");
    return AreFound();
  }

  bool IsEnteredAtItsEnd(const std::string& path) {
    slow_ << " whole";
    slow_.close();
    found_.push_back(path + "|10");
    return AreFound();
  }

private:
  bool AreFound() {
    std::ranges::sort(found_);
    return WorkUntilFound("SELECT path, size FROM Files WHERE isDeleted = 0 ORDER BY path", found_);
  }

  std::ofstream slow_;
  Lines found_;
};

TEST_F(UnfinishedPhotoTest, WaitsAlsoIfItIsOpenWhenTheIndexerStarts) {
  Begin("slow.jpg");
  Restart();
  ASSERT_TRUE(IsEnteredAlone("a.jpg"));
  ASSERT_TRUE(IsEnteredAlone("b.jpg"));
  EXPECT_TRUE(IsEnteredAtItsEnd("slow.jpg"));
}

TEST_F(UnfinishedPhotoTest, WaitsAlsoInARenamedFolder) {
  Begin("1/slow.jpg");
  ASSERT_TRUE(IsEnteredAlone("a.jpg"));
  fs::rename(At("1"), At("2"));
  ASSERT_TRUE(IsEnteredAlone("2/b.jpg"));
  EXPECT_TRUE(IsEnteredAtItsEnd("2/slow.jpg"));
}

TEST_F(UnfinishedPhotoTest, WaitsAlsoUnderAnotherName) {
  Begin("slow.part");
  fs::rename(At("slow.part"), At("slow.jpg"));
  ASSERT_TRUE(IsEnteredAlone("a.jpg"));
  ASSERT_TRUE(IsEnteredAlone("b.jpg"));
  EXPECT_TRUE(IsEnteredAtItsEnd("slow.jpg"));
}

TEST_F(VolumeWorkTest, APhotoWhoseEndOfWritingIsNotReportedIsEntered) {
  constexpr char FILES[] = "SELECT path, size FROM Files ORDER BY path";
  fs::create_directories(At("1"));
  fs::create_directories(At("2"));
  std::ofstream slow(At("1/slow.jpg"));
  slow << "half" << std::flush;
  fs::create_hard_link(At("1/slow.jpg"), At("2/link.jpg"));
  Write(At("a.jpg"), "1");
  Restart();
  ASSERT_TRUE(WorkUntilFound(FILES, {"a.jpg|1"}));
  slow << " whole";
  slow.close(); // reported for the other name
  EXPECT_TRUE(WorkUntilFound(FILES, {"1/slow.jpg|10", "2/link.jpg|10", "a.jpg|1"}));
}

TEST_F(VolumeWorkTest, APhotoThatIsStillEmptyWaitsUntilItIsClosed) {
  constexpr char FILES[] = "SELECT path FROM Files ORDER BY path";
  std::ofstream slow(At("slow.jpg"));
  Lines others;
  for (const std::string name : {"a.jpg", "b.jpg", "c.jpg", "d.jpg", "e.jpg"}) { // 2 s each
    Write(At(name));
    others.push_back(name);
    ASSERT_TRUE(WorkUntilFound(FILES, others));
  }
  slow << "whole";
  slow.close();
  others.emplace_back("slow.jpg");
  EXPECT_TRUE(WorkUntilFound(FILES, others));
}

TEST_F(VolumeWorkTest, ManyLinksDoNotLetUnfinishedPhotosIn) {
  constexpr char FILES[] = "SELECT path FROM Files ORDER BY path";
  Write(At("links/a.jpg"));
  ASSERT_TRUE(WorkUntilFound(FILES, {"links/a.jpg"}));
  for (int link = 0; link < 10'001; ++link) {
    fs::create_symlink("nowhere", At("links/" + std::to_string(link)));
  }
  Write(At("links/b.jpg"));
  ASSERT_TRUE(WorkUntilFound(FILES, {"links/a.jpg", "links/b.jpg"}));
  std::ofstream slow(At("slow.jpg"));
  slow << "half" << std::flush;
  Write(At("z.jpg"));
  EXPECT_TRUE(WorkUntilFound(FILES, {"links/a.jpg", "links/b.jpg", "z.jpg"}));
}

TEST_F(IndexerTest, ALinkIsEnteredAlthoughItIsNeverClosed) {
  const Volume volume("A", "64m");
  Write("/tmp/elsewhere.jpg");
  Write(volume.Path() + "/a.jpg");
  StartService();
  StartIndexer();
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") == 1; }));
  fs::create_hard_link(volume.Path() + "/a.jpg", volume.Path() + "/b.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

TEST_F(IndexerTest, ATreeThatIsMovedInIsEntered) {
  // The volume is a part of a file system, so that a tree can be moved into it.
  fs::create_directories("/tmp/disk");
  ASSERT_EQ(mount("disk", "/tmp/disk", "tmpfs", 0, "size=256m"), 0);
  fs::create_directories("/tmp/disk/volume");
  fs::create_directories("/shares/A");
  ASSERT_EQ(mount("/tmp/disk/volume", "/shares/A", nullptr, MS_BIND, nullptr), 0);
  for (int folder = 0; folder < TestScale(100, 1000); ++folder) {
    Write("/tmp/disk/tree/" + std::to_string(folder % 10) + "/" + std::to_string(folder) +
          "/a.jpg");
  }
  StartService();
  StartIndexer();
  ASSERT_TRUE(Await([&] { return Count(Events("/shares/A"), "End") == 1; }));
  fs::rename("/tmp/disk/tree", "/tmp/disk/volume/tree");
  EXPECT_THAT(AwaitCatalog("/shares/A"), IsEmpty());
  Write("/shares/A/tree/3/3/b.jpg"); // it is watched
  EXPECT_THAT(AwaitCatalog("/shares/A"), IsEmpty());
  // Another tree takes its place.
  fs::rename("/tmp/disk/volume/tree", "/tmp/disk/tree");
  EXPECT_THAT(AwaitCatalog("/shares/A"), IsEmpty());
  Write("/shares/A/tree/3/3/another.jpg");
  EXPECT_THAT(AwaitCatalog("/shares/A"), IsEmpty());
  fs::rename("/tmp/disk/tree", "/tmp/disk/volume/other");
  fs::rename("/tmp/disk/volume/other/3", "/tmp/disk/volume/other/4/inside");
  EXPECT_THAT(AwaitCatalog("/shares/A"), IsEmpty());
  Write("/shares/A/other/4/inside/3/c.jpg");
  EXPECT_THAT(AwaitCatalog("/shares/A"), IsEmpty());
  StopIndexer();
  EXPECT_EQ(umount2("/shares/A", 0), 0);
}

TEST_F(IndexerTest, AfterAnOverflowOfTheQueueEverythingIsWalked) {
  const Volume volume("A", "256m");
  Write(volume.Path() + "/Pictures/a.jpg");
  StartService();
  StartIndexer();
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  Indexer().Signal(SIGSTOP);
  std::ifstream limit("/proc/sys/fs/inotify/max_queued_events");
  int events = 0;
  ASSERT_TRUE(limit >> events);
  for (int file = 0; file <= events / 2; ++file) { // created and closed
    std::ofstream(volume.Path() + "/Pictures/" + std::to_string(file) + ".jpg");
  }
  fs::create_directories(volume.Path() + "/Later/Inside");
  Indexer().Signal(SIGCONT);
  EXPECT_TRUE(AwaitLog("too many changes at once"));
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  Write(volume.Path() + "/Later/Inside/b.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

TEST_F(IndexerTest, AtTheWatchLimitTheVolumeIsWalkedOnATimer) {
  const Volume volume("A", "64m");
  for (int folder = 0; folder < 20; ++folder) {
    Write(volume.Path() + "/" + std::to_string(folder) + "/a.jpg");
  }
  StartService();
  // The limit of a user namespace counts in addition to that of the system.
  const Program::Arguments limited = {
      "unshare", "--user", "--map-root-user",
      "/bin/sh", "-c",     "echo 10 >/proc/sys/user/max_inotify_watches && exec \"$0\""};
  StartIndexer(limited);
  EXPECT_TRUE(AwaitLog("fs.inotify.max_user_watches"));
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_TRUE(Await([&] { return State(volume.Path()) == "timed"; }));
  EXPECT_EQ(LogLines("fs.inotify.max_user_watches").size(), 1U);
}

TEST_F(IndexerTest, WhereThereAreNoEventsTheVolumeIsWalkedOnATimer) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  StartService();
  StartIndexerIn({"PROBE_FILE_SYSTEM=0x65735546", "PROBE_CLOCK_SPEED=100"}); // FUSE
  EXPECT_TRUE(AwaitLog("its changes are looked for on a timer"));
  EXPECT_TRUE(Await([&] { return State(volume.Path()) == "timed"; }));
  Write(volume.Path() + "/Pictures/New/b.jpg");
  fs::remove(volume.Path() + "/Pictures/a.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  Write(volume.Path() + "/Pictures/New/c.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_TRUE(Await([&] { return State(volume.Path()) == "timed"; }));
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

TEST_F(IndexerTest, AMountBelowTheVolumeIsFollowed) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Inside/a.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  const std::string inside = volume.Path() + "/Inside";
  ASSERT_EQ(mount("inside", inside.c_str(), "tmpfs", 0, "size=1m"), 0);
  Write(inside + "/b.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_EQ(umount2(inside.c_str(), 0), 0);
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

TEST_F(IndexerTest, AFolderThatIsMountedAtTwoPlacesIsFollowedAtBoth) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/One/Inside/a.jpg");
  fs::create_directory(volume.Path() + "/Two");
  ASSERT_EQ(mount((volume.Path() + "/One").c_str(), (volume.Path() + "/Two").c_str(), nullptr,
                  MS_BIND, nullptr),
            0);
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  Write(volume.Path() + "/One/b.jpg");
  Write(volume.Path() + "/One/Inside/c.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  Write(volume.Path() + "/Two/New/d.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_EQ(umount2((volume.Path() + "/Two").c_str(), 0), 0);
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  Write(volume.Path() + "/One/New/e.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
}

/// Random operations on the files and folders of a volume.
class Operations {
public:
  Operations(std::string root, unsigned seed) : root_(std::move(root)), random_(seed) {}

  void Perform() {
    switch (Number(9)) {
    case 0:
    case 1:
    case 2:
      CreateFile();
      break;
    case 3:
      fs::create_directories(SomeFolder() + "/" + Name(), ignored_);
      break;
    case 4:
      fs::rename(SomeFile(), SomeFolder() + "/" + Name(), ignored_);
      break;
    case 5:
      fs::rename(SomeFolder(), SomeFolder() + "/" + Name(), ignored_);
      break;
    case 6:
      fs::remove(SomeFile(), ignored_);
      break;
    case 7:
      if (Number(4) == 0) {
        RemoveFolder();
      }
      break;
    default:
      std::ofstream(SomeFile(), std::ios::app) << "more";
    }
    fs::create_directories(root_);
  }

private:
  unsigned Number(unsigned end) { return static_cast<unsigned>(random_()) % end; }

  std::string Name() {
    static const std::array names = {"a.jpg",  "B.JPG",      "c",       "d~",
                                     ".e.jpg", "lost+found", "f g.png", "\xe9.gif",
                                     "h.txt",  "i\n.jpg",    "j.bak",   "k"};
    return names[Number(names.size())];
  }

  void CreateFile() { std::ofstream(SomeFolder() + "/" + Name()) << std::string(Number(100), 'x'); }

  void RemoveFolder() {
    const std::string folder = SomeFolder();
    if (folder != root_) {
      fs::remove_all(folder, ignored_);
    }
  }

  std::string Some(bool folders) {
    std::vector<std::string> found = {root_};
    for (const auto& entry : fs::recursive_directory_iterator(root_)) {
      if (entry.path().native().find("/.orva") == std::string::npos &&
          entry.is_directory() == folders) {
        found.push_back(entry.path());
      }
    }
    return found[Number(static_cast<unsigned>(found.size()))];
  }
  std::string SomeFolder() { return Some(true); }
  std::string SomeFile() { return Some(false); }

  const std::string root_;
  std::mt19937 random_;
  std::error_code ignored_;
};

TEST_F(IndexerTest, RandomOperationsConvergeToWhatANewCatalogSays) {
  const Volume volume("A", "64m");
  StartService();
  StartIndexer();
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") == 1; }));
  constexpr int SEED = 14;
  Operations operations(volume.Path(), SEED);
  for (int round = 0; round < TestScale(15, 200); ++round) {
    for (int i = 0; i < TestScale(20, 50); ++i) {
      operations.Perform();
    }
    ASSERT_THAT(AwaitCatalog(volume.Path()), IsEmpty()) << "seed " << SEED << ", round " << round;
  }
  EXPECT_THAT(Query(volume.Path(), "PRAGMA integrity_check"), ElementsAre("ok"));
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

TEST_F(IndexerTest, AKilledIndexerConvergesAfterItsStart) {
  const Volume volume("A", "64m");
  StartService();
  std::mt19937 random(14);
  Operations operations(volume.Path(), 15);
  for (int round = 0; round < TestScale(5, 50); ++round) {
    StartIndexer();
    const auto instant = std::chrono::milliseconds(random() % 3000);
    const auto end = std::chrono::steady_clock::now() + instant;
    while (std::chrono::steady_clock::now() < end) {
      operations.Perform();
    }
    Indexer().Signal(SIGKILL);
    Indexer().WaitForEnd();
  }
  StartIndexer();
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_THAT(Query(volume.Path(), "PRAGMA integrity_check"), ElementsAre("ok"));
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

// --- Pieces of work ----------------------------------------------------------------------------

TEST_F(IndexerTest, AVolumeCanBeUnmountedBetweenTwoPiecesOfItsFirstWalk) {
  const Volume volume("A", "64m");
  for (const std::string folder : {"a", "b", "c"}) {
    Write(volume.Path() + "/" + folder + "/photo.jpg");
  }
  indexer::Volume indexed(volume.Path() + "/", catalog::VolumeRoot::Kind::Mount);
  const auto begin = indexer::Clock::now();
  auto pulse = begin;
  // As on a slow disk: the first folder takes all of the time of a piece of work.
  indexed.Work(
      [&] {
        do {
          pulse = indexer::Clock::now();
        } while (pulse - begin < std::chrono::seconds(3));
      },
      [](const db::DB&) {}, std::time(nullptr));
  EXPECT_FALSE(indexed.IsIdle());
  EXPECT_GT(indexed.NextWork(), pulse);
  EXPECT_EQ(umount2(volume.Path().c_str(), 0), 0);
}

// --- Busy catalogs -----------------------------------------------------------------------------

TEST_F(IndexerTest, FoldersAreWalkedAgainIfTheirCommitFailsOnABusyCatalog) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  indexer::Volume indexed(volume.Path() + "/", catalog::VolumeRoot::Kind::Mount);
  const auto work = [&indexed](const std::function<void()>& pulse) {
    return indexed.Work(
        pulse, [](const db::DB&) {}, std::time(nullptr));
  };
  EXPECT_FALSE(work([] { throw std::string("database is locked (extended code 5)"); }).hasChanged);
  ASSERT_LT(indexed.NextWork(), indexer::Clock::time_point::max());
  EXPECT_TRUE(Await([&] {
    if (indexed.NextWork() <= indexer::Clock::now()) {
      work([] {});
    }
    return indexed.IsWalked() &&
           Query(volume.Path(), "SELECT path FROM Files") == Lines{"Pictures/a.jpg"};
  }));
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

TEST_F(IndexerTest, AFolderThatCannotBeReadIsLoggedOnceWheneverItAppears) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/first.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_THAT(ErrorLines(), IsEmpty());
  const auto current = fs::current_path();
  fs::current_path(volume.Path());
  for (int depth = 0; depth < 17; ++depth) { // 4,267 bytes
    const std::string name(250, 'd');
    ASSERT_EQ(mkdir(name.c_str(), 0755), 0);
    fs::current_path(name);
  }
  fs::current_path(current);
  EXPECT_TRUE(AwaitLog("1 files or folders cannot be read, for example " + volume.Path()));
  Write(volume.Path() + "/second.jpg");
  ASSERT_TRUE(Await([&] {
    return Query(volume.Path(), "SELECT path FROM Files ORDER BY path") ==
           (Lines{"first.jpg", "second.jpg"});
  }));
  EXPECT_THAT(ErrorLines(), ElementsAre(HasSubstr("cannot be read")));
}

TEST_F(IndexerTest, ACatalogThatStaysLockedIsLoggedOnceAndUpdatedLater) {
  const Volume locked("A", "64m");
  const Volume other("B", "64m");
  Write(locked.Path() + "/first.jpg");
  Write(other.Path() + "/first.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(locked.Path()), IsEmpty());
  ASSERT_THAT(AwaitCatalog(other.Path()), IsEmpty());
  {
    Database writer(CatalogOf(locked.Path()));
    writer.setBusyTimeout(5000);
    writer.Run("BEGIN IMMEDIATE");
    Write(locked.Path() + "/a.jpg");
    EXPECT_TRUE(AwaitLog("/shares/A/: another program has locked its catalog"));
    Write(other.Path() + "/b.jpg");
    EXPECT_THAT(AwaitCatalog(other.Path()), IsEmpty());
    EXPECT_THAT(Query(locked.Path(), "SELECT path FROM Files"), ElementsAre("first.jpg"));
  }
  EXPECT_THAT(AwaitCatalog(locked.Path()), IsEmpty());
  EXPECT_THAT(ErrorLines(), ElementsAre(HasSubstr("locked")));
}

TEST_F(IndexerTest, ALockedCatalogIsTriedAgainAfterGrowingPauses) {
  const Volume volume("A", "64m");
  catalog::OpenCatalog(volume.Path());
  indexer::Volume indexed(volume.Path() + "/", catalog::VolumeRoot::Kind::Mount);
  const auto pause = [&indexed] {
    indexed.Work([] {}, [](const db::DB&) {}, std::time(nullptr));
    const auto now = indexer::Clock::now();
    return indexed.NextWork() - now;
  };
  Database writer(CatalogOf(volume.Path()));
  writer.Run("BEGIN IMMEDIATE");
  const auto first = pause();
  EXPECT_GT(pause(), first);
}

TEST(CatalogProblem, ALockThatIsNotGrantedInTimeIsNoDamage) {
  const auto problemOf = [](int code) {
    return catalog::ProblemOf("failed (extended code " + std::to_string(code) + ") in \"SELECT\"");
  };
  EXPECT_EQ(problemOf(5), catalog::CatalogProblem::Busy);   // SQLITE_BUSY
  EXPECT_EQ(problemOf(261), catalog::CatalogProblem::Busy); // SQLITE_BUSY_RECOVERY
  EXPECT_EQ(problemOf(15), catalog::CatalogProblem::Busy);  // SQLITE_PROTOCOL
  EXPECT_EQ(problemOf(11), catalog::CatalogProblem::Foreign);
}

// --- The clock ---------------------------------------------------------------------------------

TEST_F(IndexerTest, FilesAndFoldersFromTheFutureAndThePastAreEnteredOnce) {
  const Volume volume("A", "64m");
  const auto setTime = [&](const std::string& name, std::time_t time) {
    const std::array<timespec, 2> times{timespec{.tv_sec = time, .tv_nsec = 0},
                                        timespec{.tv_sec = time, .tv_nsec = 0}};
    EXPECT_EQ(utimensat(AT_FDCWD, (volume.Path() + name).c_str(), times.data(), 0), 0);
  };
  constexpr std::time_t IN_2100 = 4'102'444'800;
  Write(volume.Path() + "/Future/a.jpg");
  Write(volume.Path() + "/Past/a.jpg");
  setTime("/Future/a.jpg", IN_2100);
  setTime("/Future", IN_2100);
  setTime("/Past/a.jpg", -IN_2100);
  setTime("/Past", -IN_2100);
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_THAT(Query(volume.Path(), "SELECT path, lastModifiedDate FROM Files ORDER BY path"),
              ElementsAre("Future/a.jpg|4102444800", "Past/a.jpg|-4102444800"));
  constexpr char STAMPS[] = "SELECT path, lastUpdatedDate FROM Files WHERE name = 'a.jpg'";
  const Lines stamps = Query(volume.Path(), STAMPS);
  EXPECT_THAT(Query(volume.Path(), "SELECT newestStamp < 4000000000 FROM Identity"),
              ElementsAre("1"));
  // A change is noticed although the folder's time stays.
  Write(volume.Path() + "/Future/b.jpg");
  setTime("/Future", IN_2100);
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  // What has not changed is not written again.
  EXPECT_EQ(Query(volume.Path(), STAMPS), stamps);
}

TEST_F(IndexerTest, FilesAreEnteredAfterTheClockWasSetBack) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/Pictures/a.jpg");
  StartService();
  StartIndexerIn({"PROBE_CLOCK_OFFSET=-86400"}); // all files were changed tomorrow
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_TRUE(Await([&] { return State(volume.Path()) == "watching"; }));
  Write(volume.Path() + "/Pictures/b.jpg");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  Write(volume.Path() + "/Pictures/b.jpg", "other content");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

TEST_F(IndexerTest, ACatalogThatNobodyMergesIsKnownAgainWhenTheClockWasSetBack) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/a.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") > 0; }));
  // What was announced is remembered before the next announcement.
  const long ends = Count(Events(volume.Path()), "End");
  Write(volume.Path() + "/b.jpg");
  ASSERT_TRUE(Await([&] { return Count(Events(volume.Path()), "End") > ends; }));
  StopIndexer();
  const Lines identity = Query(volume.Path(), "SELECT identity FROM Identity");
  Write(volume.Path() + "/c.jpg");
  StartIndexerIn({"PROBE_CLOCK_OFFSET=-300000000"});
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_EQ(Query(volume.Path(), "SELECT identity FROM Identity"), identity);
  EXPECT_THAT(ErrorLines(), IsEmpty());
}

// --- Volumes that cannot be written ------------------------------------------------------------

TEST_F(IndexerTest, AReadOnlyVolumeIsIndexedWhenItBecomesWritable) {
  Volume volume("A", "64m");
  Write(volume.Path() + "/a.jpg");
  volume.MakeReadOnly();
  StartService();
  StartIndexer();
  ASSERT_TRUE(AwaitLog("/shares/A/: read-only"));
  EXPECT_TRUE(Await([&] { return State(volume.Path()) == "read-only"; }));
  volume.MakeWritable();
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_EQ(LogLines("read-only").size(), 1U);
}

TEST_F(IndexerTest, ACatalogThatWasDamagedTwiceInARowIsMadeAgainAtTheNextRetry) {
  const Volume volume("A", "64m");
  Write(volume.Path() + "/a.jpg");
  indexer::Volume indexed(volume.Path() + "/", catalog::VolumeRoot::Kind::Mount);
  const auto work = [&indexed] {
    indexed.Work([] {}, [](const db::DB&) {}, std::time(nullptr));
    return std::string(indexed.Status().state);
  };
  const auto damage = [&volume] { Write(CatalogOf(volume.Path()), std::string(100'000, 'x')); };
  damage();
  EXPECT_EQ(work(), "walking");
  damage();
  EXPECT_EQ(work(), "unusable");
  EXPECT_GT(indexed.NextWork(), indexer::Clock::now() + std::chrono::seconds(30));
  damage();
  EXPECT_EQ(work(), "unusable");
  work();
  EXPECT_TRUE(indexed.IsWalked());
  EXPECT_NE(std::string(indexed.Status().state), "unusable");
  EXPECT_EQ(LogLines("renamed").size(), 2U);
}

TEST_F(IndexerTest, AFullVolumeIsIndexedWhenThereIsSpace) {
  Volume volume("A", "1m");
  Write(volume.Path() + "/a.jpg");
  std::ofstream filler(volume.Path() + "/filler");
  while (filler << std::string(4096, 'x') << std::flush) {
  }
  filler.close();
  StartService();
  StartIndexer();
  ASSERT_TRUE(AwaitLog("/shares/A/: full"));
  volume.Resize(64 << 20);
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_EQ(LogLines(": full").size(), 1U);
}

TEST_F(IndexerTest, AVolumeWithoutFreeInodesKeepsItsCatalog) {
  Volume volume("A", "8m,nr_inodes=40");
  Write(volume.Path() + "/a.jpg");
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  int fillers = 0;
  while (std::ofstream(volume.Path() + "/filler" + std::to_string(fillers))) {
    ++fillers;
  }
  ASSERT_TRUE(AwaitLog("/shares/A/: full"));
  fs::remove(volume.Path() + "/filler0");
  fs::remove(volume.Path() + "/filler1");
  fs::remove(volume.Path() + "/filler2");
  EXPECT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  EXPECT_THAT(LogLines("set-aside"), IsEmpty());
}

TEST_F(VolumeWorkTest, AFullVolumeIsWalkedWhenSomeSpaceHasBecomeFree) {
  Write(At("a.jpg"));
  ASSERT_THAT(WorkUntilFound("SELECT path FROM Files", {"a.jpg"}), true);
  for (int i = 0; i < 2000; ++i) { // more rows than there is space for
    Write(At("Pictures/" + std::to_string(i) + ".jpg"), "");
  }
  std::ofstream filler(At(".orva/filler"));
  while (filler << std::string(4096, 'x') << std::flush) {
  }
  filler.close();
  ASSERT_TRUE(WorkUntil([&] { return TheVolume().Status().state == std::string("read-only"); }))
      << testing::PrintToString(LogLines()) << TheVolume().Status().state;
  for (int check = 0; check < 2; ++check) {
    const auto next = TheVolume().NextWork();
    EXPECT_LT(next, indexer::Clock::now() + std::chrono::seconds(5));
    ASSERT_TRUE(WorkUntil([&] { return TheVolume().NextWork() > next; }));
    EXPECT_EQ(TheVolume().Status().state, std::string("read-only"));
  }
  fs::remove(At(".orva/filler"));
  EXPECT_TRUE(WorkUntilFound("SELECT count(*) FROM Files", {"2001"}));
  EXPECT_EQ(LogLines(": full").size(), 1U);
  EXPECT_EQ(LogLines("indexed again").size(), 1U);
}

// --- Renditions --------------------------------------------------------------------------------

/// The indexer and a volume with a photo whose rendition is finished.
class RenditionAccessTest : public IndexerTest {
protected:
  RenditionAccessTest() { Write(Photo()); }

  std::string Photo() const { return volume_.Path() + "/Holiday/Beach/a.jpg"; }
  std::string Rendition() const { return volume_.Path() + "/.orva/renditions/0/1.jpg"; }

  /// Starts the indexer, and makes the rendition.
  void Start(mode_t mode = 0444) {
    StartService();
    StartIndexer();
    ASSERT_THAT(AwaitCatalog(volume_.Path()), IsEmpty());
    Finish(mode);
    ASSERT_EQ(Status(), "3");
  }

  void Finish(mode_t mode) {
    fs::remove(Rendition());
    Write(Rendition());
    ASSERT_EQ(chmod(Rendition().c_str(), mode), 0);
    FinishPhotos(volume_.Path());
  }

  void Fail(const std::string& reason) {
    const auto database = catalog::OpenCatalog(volume_.Path());
    db::Transaction transaction(*database, catalog::BUSY_TIMEOUT);
    catalog::Execute(*database, "UPDATE Files SET status = 1");
    const auto waiting = catalog::NewestWaiting(*database, 1);
    ASSERT_EQ(waiting.size(), 1U);
    EXPECT_TRUE(catalog::MarkFailed(*database, waiting.front(), reason,
                                    catalog::NextStamp(*database, std::time(nullptr))));
    transaction.Commit();
  }

  std::string Status() const {
    const Lines status =
        Query(volume_.Path(), "SELECT status FROM Files WHERE name = 'a.jpg' AND isDeleted = 0");
    return status.size() == 1 ? status.front() : "unknown";
  }
  bool AwaitWaiting() {
    return Await([this] { return Status() == "1"; });
  }

  /// The status after the folder was listed once more.
  std::string LaterStatus() {
    Write(volume_.Path() + "/Holiday/Beach/" + std::to_string(++files_) + ".txt");
    EXPECT_THAT(AwaitCatalog(volume_.Path()), IsEmpty());
    return Status();
  }

  const Volume& TheVolume() const { return volume_; }

private:
  const Volume volume_{"A", "64m"};
  int files_ = 0;
};

TEST_F(RenditionAccessTest, APhotoThatBecomesPrivateIsRenderedAgain) {
  Start();
  ASSERT_EQ(chmod(Photo().c_str(), 0600), 0);
  EXPECT_TRUE(AwaitWaiting());
  // Merged databases keep it meanwhile.
  EXPECT_THAT(Query(TheVolume().Path(), "SELECT status FROM Transcodings"), ElementsAre("1"));
  Finish(0400);
  EXPECT_EQ(LaterStatus(), "3");
  ASSERT_EQ(chmod(Photo().c_str(), 0640), 0);
  EXPECT_TRUE(AwaitWaiting());
}

TEST_F(RenditionAccessTest, OtherChangesOfAPhotosModeDoNotMatter) {
  Start();
  ASSERT_EQ(chmod(Photo().c_str(), 0766), 0);
  EXPECT_EQ(LaterStatus(), "3");
}

TEST_F(RenditionAccessTest, PhotosBelowAFolderThatBecomesPrivateAreRenderedAgain) {
  Start();
  ASSERT_EQ(chmod((TheVolume().Path() + "/Holiday").c_str(), 0700), 0);
  EXPECT_TRUE(AwaitWaiting());
  Finish(0400);
  EXPECT_EQ(LaterStatus(), "3");
  ASSERT_EQ(chmod((TheVolume().Path() + "/Holiday").c_str(), 0755), 0);
  EXPECT_TRUE(AwaitWaiting());
}

TEST_F(RenditionAccessTest, AChangeWhileTheIndexerDoesNotRunIsNoticed) {
  Start();
  StopIndexer();
  ASSERT_EQ(chmod(Photo().c_str(), 0600), 0);
  StartIndexer();
  EXPECT_TRUE(AwaitWaiting());
}

TEST_F(RenditionAccessTest, TheModeDoesNotMatterWhereItCouldNotBeSet) {
  Start(0644);
  ASSERT_EQ(chmod(Photo().c_str(), 0600), 0);
  EXPECT_EQ(LaterStatus(), "3");
}

TEST_F(RenditionAccessTest, WhatIsNotARenditionDoesNotMatter) {
  Start();
  fs::remove(Rendition());
  EXPECT_EQ(LaterStatus(), "3");
  fs::create_symlink("/tmp/elsewhere", Rendition());
  EXPECT_EQ(LaterStatus(), "3");
  fs::remove(Rendition());
  fs::create_directory(Rendition());
  EXPECT_EQ(LaterStatus(), "3");
  fs::remove_all(TheVolume().Path() + "/.orva/renditions");
  EXPECT_EQ(LaterStatus(), "3");
}

TEST_F(RenditionAccessTest, APhotoThatCouldNotBeOpenedWaitsAgainWhenItsPermissionsChange) {
  Start();
  Fail("cannot be opened: Permission denied");
  EXPECT_EQ(LaterStatus(), "2");
  ASSERT_EQ(chmod(Photo().c_str(), 0640), 0);
  EXPECT_TRUE(AwaitWaiting());
  EXPECT_THAT(Query(TheVolume().Path(), "SELECT count(*) FROM Failures"), ElementsAre("0"));
  Fail("not an image, or damaged");
  ASSERT_EQ(chmod(Photo().c_str(), 0644), 0);
  EXPECT_EQ(LaterStatus(), "2");
}

TEST_F(RenditionAccessTest, APhotoWithAnotherOwnerIsRenderedAgain) {
  SKIP_WITHOUT_OTHER_USERS();
  Start();
  ASSERT_EQ(chown(Photo().c_str(), 1234, 2345), 0);
  EXPECT_TRUE(AwaitWaiting());
  // A file system where the owner cannot be set: it stays as it is.
  Finish(0444);
  EXPECT_EQ(LaterStatus(), "3");
}

TEST_F(RenditionAccessTest, TheGroupOfAFolderDecidesWhatTheGroupOfAPhotoMayRead) {
  SKIP_WITHOUT_OTHER_USERS();
  const std::string folder = TheVolume().Path() + "/Holiday/Beach";
  ASSERT_EQ(chown(folder.c_str(), 0, 2345), 0);
  ASSERT_EQ(chmod(folder.c_str(), 0750), 0);
  ASSERT_EQ(chown(Photo().c_str(), 0, 2345), 0);
  Start(0440);
  ASSERT_EQ(chown(Rendition().c_str(), 0, 2345), 0);
  EXPECT_EQ(LaterStatus(), "3");
  ASSERT_EQ(chown(folder.c_str(), 0, 3456), 0);
  EXPECT_TRUE(AwaitWaiting());
}

// --- The merged database -----------------------------------------------------------------------

TEST(Locator, AFileOfAnotherUserNamesNoMaster) {
  const std::string path = "/tmp/zophotodbmerger.conf";
  std::ofstream(path) << "zophotos_db_path=/shares/A/.zophotos/zophotos.db\n";
  EXPECT_EQ(indexer::Locator::Master(), "/shares/A");
  SKIP_WITHOUT_OTHER_USERS();
  ASSERT_EQ(chown(path.c_str(), 1234, 0), 0);
  EXPECT_EQ(indexer::Locator::Master(), std::nullopt);
}

/// A folder that is mounted at `mountPoint` while the object lives. It is created if it is missing,
/// and stays.
class PluggedFolder {
public:
  PluggedFolder(const std::string& folder, std::string mountPoint)
      : mountPoint_(std::move(mountPoint)) {
    fs::create_directories(folder);
    fs::create_directories(mountPoint_);
    if (mount(folder.c_str(), mountPoint_.c_str(), nullptr, MS_BIND, nullptr) != 0) {
      throw std::system_error(errno, std::generic_category(), mountPoint_);
    }
  }
  PluggedFolder(const PluggedFolder&) = delete;
  PluggedFolder& operator=(const PluggedFolder&) = delete;
  ~PluggedFolder() {
    umount2(mountPoint_.c_str(), MNT_DETACH);
    rmdir(mountPoint_.c_str());
  }

private:
  const std::string mountPoint_;
};

/// The indexer and the daemon, with a master volume that keeps its merged database. It is plugged
/// before the volumes of the tests, in the order of their names.
class IndexerAndDaemonTest : public IndexerTest {
protected:
  IndexerAndDaemonTest() : master_("Big", "150g") {}
  ~IndexerAndDaemonTest() override { StopDaemon(); }

  void Start() {
    StartServiceAndDaemon();
    StartIndexer();
  }

  void StartServiceAndDaemon() {
    StartService();
    StartDaemon();
  }

  void StartDaemon() {
    daemon_ = std::make_unique<DaemonProcess>("/tmp/daemon", "/tmp/daemon.out");
  }

  /// Ends all programs, the service first.
  void Stop() {
    StopIndexer();
    StopServiceAndDaemon();
  }

  void StopServiceAndDaemon() {
    Service().Signal(SIGTERM);
    Service().WaitForEnd();
    StopDaemon();
  }

  /// "file's name|volume" of all merged photos.
  static Lines Merged() {
    try {
      return Database("/shares/Big/.zophotos/zophotos.db")
          .Run("SELECT name, volume FROM Files ORDER BY name");
    } catch (const SQLite::Exception&) {
      return {};
    }
  }

  /// Finishes the photos of the volume and waits until they are listed. Returns the merged photos
  /// otherwise.
  Lines AwaitMerged(const std::string& volume, const Lines& names) {
    Lines expected;
    for (const std::string& name : names) {
      expected.push_back(name + "|" + volume + "/");
    }
    Lines differences = AwaitCatalog(volume);
    if (!differences.empty()) {
      return differences;
    }
    FinishPhotos(volume);
    Send("transcoded", volume);
    Await([&] { return Merged() == expected; });
    Lines merged = Merged();
    return merged == expected ? Lines() : merged;
  }

  /// Waits until the indexer remembers that all of the volume's catalog was announced.
  bool AwaitAllRemembered(const std::string& volume) {
    return Await([&volume] {
      try {
        Database state(std::string(STATE_DIRECTORY) + "/catalogs.db");
        return state.Run(
                   "SELECT max(newestStamp) FROM Catalogs WHERE master <> '-' AND mountPoint = '" +
                   volume + "/'") == Query(volume, "SELECT newestStamp FROM Identity");
      } catch (const SQLite::Exception&) {
        return false;
      }
    });
  }

  /// Waits until the indexer remembers the catalogs of the volume and of the master.
  bool AwaitRemembered() {
    return Await([] {
      try {
        Database state(std::string(STATE_DIRECTORY) + "/catalogs.db");
        return state.Run("SELECT count(DISTINCT mountPoint) FROM Catalogs "
                         "WHERE master <> '-'") == Lines{"2"};
      } catch (const SQLite::Exception&) {
        return false;
      }
    });
  }

private:
  void StopDaemon() {
    if (daemon_ && daemon_->IsRunning()) {
      kill(daemon_->Pid(), SIGKILL);
      daemon_->AwaitEnd();
    }
  }

  const Volume master_;
  std::unique_ptr<DaemonProcess> daemon_;
};

TEST_F(IndexerAndDaemonTest, DisksThatWereSwappedWhileNothingRanAreMergedFromTheBeginning) {
  {
    const Volume first("Disk", "64m");
    Write(first.Path() + "/first.jpg");
    Start();
    ASSERT_THAT(AwaitMerged(first.Path(), {"first.jpg"}), IsEmpty());
    Stop();
  }
  // The other disk has an older catalog, with smaller ids and stamps.
  const Volume second("Disk", "64m");
  Write(second.Path() + "/second.jpg");
  Start();
  EXPECT_THAT(AwaitMerged(second.Path(), {"second.jpg"}), IsEmpty());
  EXPECT_THAT(Events(second.Path()), Contains("Purged"));
}

TEST_F(IndexerAndDaemonTest, DisksThatWereSwappedTwiceAreMergedFromTheBeginning) {
  const std::string disk = "/shares/Disk";
  {
    const PluggedFolder first("/tmp/first", disk);
    Write(disk + "/first.jpg");
    Start();
    ASSERT_THAT(AwaitMerged(disk, {"first.jpg"}), IsEmpty());
    Stop();
  }
  {
    const PluggedFolder second("/tmp/second", disk);
    Write(disk + "/second.jpg");
    Start();
    ASSERT_THAT(AwaitMerged(disk, {"second.jpg"}), IsEmpty());
    ASSERT_TRUE(AwaitAllRemembered(disk));
    Stop();
  }
  {
    const PluggedFolder first("/tmp/first", disk);
    Write(disk + "/new.jpg");
    // The daemon starts so late that nothing can be announced as purged.
    StartService();
    StartIndexer();
    ASSERT_THAT(AwaitCatalog(disk), IsEmpty());
    FinishPhotos(disk);
    ASSERT_TRUE(Await([&] { return Count(Events(disk), "End") > 0; }));
    StopIndexer();
    StartDaemon();
    ASSERT_TRUE(Await([&] { return Count(Merged(), "new.jpg|" + disk + "/") == 1; }));
    StopServiceAndDaemon();
  }
  const PluggedFolder second("/tmp/second", disk);
  Start();
  EXPECT_THAT(AwaitMerged(disk, {"second.jpg"}), IsEmpty());
}

TEST_F(IndexerAndDaemonTest, AMasterFromABackupGetsTheRowsOfTheDisksThatAreThere) {
  const std::string master = "/shares/Big";
  const std::string disk = "/shares/Disk";
  const auto copy = [](const std::string& from, const std::string& to) {
    for (const auto& entry : fs::directory_iterator(from)) {
      fs::copy(entry, to + "/" + entry.path().filename().string(), fs::copy_options::recursive);
    }
  };
  {
    const PluggedFolder first("/tmp/first", disk);
    Write(disk + "/first.jpg");
    Start();
    ASSERT_THAT(AwaitMerged(disk, {"first.jpg"}), IsEmpty());
    ASSERT_TRUE(AwaitRemembered());
    Stop();
  }
  fs::create_directory("/tmp/backup");
  copy(master, "/tmp/backup");
  constexpr char STAMP[] = "SELECT newestStamp FROM Identity";
  const Lines backup = Query(master, STAMP);
  const PluggedFolder second("/tmp/second", disk);
  Write(disk + "/second.jpg");
  Start();
  ASSERT_THAT(AwaitMerged(disk, {"second.jpg"}), IsEmpty());
  // The indexer changes the master's catalog, so that it recognizes the backup.
  ASSERT_TRUE(Await([&] { return Query(master, STAMP) != backup; }));
  ASSERT_TRUE(AwaitAllRemembered(master));
  ASSERT_TRUE(AwaitAllRemembered(disk));
  Stop();
  for (const auto& entry : fs::directory_iterator(master)) {
    fs::remove_all(entry);
  }
  copy("/tmp/backup", master);
  Start();
  EXPECT_THAT(AwaitMerged(disk, {"second.jpg"}), IsEmpty());
}

TEST_F(IndexerAndDaemonTest, ACatalogFromABackupIsMergedFromTheBeginning) {
  const Volume volume("Disk", "64m");
  Write(volume.Path() + "/a.jpg");
  Start();
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg"}), IsEmpty());
  Stop();
  fs::copy_file(CatalogOf(volume.Path()), "/tmp/backup.db");
  Start();
  Write(volume.Path() + "/b.jpg");
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "b.jpg"}), IsEmpty());
  fs::remove(volume.Path() + "/a.jpg");
  ASSERT_TRUE(Await([&] { return Merged() == Lines{"b.jpg|/shares/Disk/"}; }));
  Stop();
  fs::remove(volume.Path() + "/b.jpg");
  fs::copy_file("/tmp/backup.db", CatalogOf(volume.Path()), fs::copy_options::overwrite_existing);
  Write(volume.Path() + "/c.jpg");
  Start();
  // Nothing in the catalog says that the merged database has b.jpg.
  EXPECT_THAT(AwaitMerged(volume.Path(), {"c.jpg"}), IsEmpty());
}

TEST_F(IndexerAndDaemonTest, ACatalogFromABackupThatWasUpdatedSinceIsMergedFromTheBeginning) {
  const Volume volume("Disk", "64m");
  Write(volume.Path() + "/a.jpg");
  Start();
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg"}), IsEmpty());
  ASSERT_TRUE(AwaitAllRemembered(volume.Path()));
  Stop();
  fs::copy_file(CatalogOf(volume.Path()), "/tmp/backup.db");
  Start();
  Write(volume.Path() + "/b.jpg");
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "b.jpg"}), IsEmpty());
  ASSERT_TRUE(AwaitAllRemembered(volume.Path()));
  Stop();
  fs::remove(volume.Path() + "/b.jpg");
  fs::copy_file("/tmp/backup.db", CatalogOf(volume.Path()), fs::copy_options::overwrite_existing);
  Write(volume.Path() + "/c.jpg");
  // The catalog gets new stamps before anything can be announced as purged.
  ASSERT_THAT(StartAndAwaitCatalog(volume.Path()), IsEmpty());
  Indexer().Signal(SIGKILL);
  Indexer().WaitForEnd();
  Service().Signal(SIGTERM);
  Service().WaitForEnd();
  Start();
  EXPECT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "c.jpg"}), IsEmpty());
}

TEST_F(IndexerAndDaemonTest, ACatalogFromABackupIsRecognizedAlthoughTheTranscoderWasFirst) {
  const Volume volume("Disk", "64m");
  Write(volume.Path() + "/a.jpg");
  Start();
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg"}), IsEmpty());
  Write(volume.Path() + "/waiting.jpg");
  ASSERT_THAT(AwaitCatalog(volume.Path()), IsEmpty());
  Stop();
  fs::copy_file(CatalogOf(volume.Path()), "/tmp/backup.db");
  Start();
  Write(volume.Path() + "/b.jpg");
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "b.jpg", "waiting.jpg"}), IsEmpty());
  ASSERT_TRUE(AwaitAllRemembered(volume.Path()));
  Stop();
  const auto newestStamp = [&volume] {
    return std::stoll(Query(volume.Path(), "SELECT newestStamp FROM Identity").at(0));
  };
  const long long remembered = newestStamp();
  fs::remove(volume.Path() + "/b.jpg");
  fs::copy_file("/tmp/backup.db", CatalogOf(volume.Path()), fs::copy_options::overwrite_existing);
  while (newestStamp() <= remembered) {
    FinishPhotos(volume.Path());
  }
  Start();
  EXPECT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "waiting.jpg"}), IsEmpty());
}

TEST_F(IndexerAndDaemonTest, ACatalogIsKnownAgainWhenTheClockStartsYearsLate) {
  const Volume volume("Disk", "64m");
  Write(volume.Path() + "/a.jpg");
  Start();
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg"}), IsEmpty());
  Send("end", volume.Path()); // the indexer reads the stamp that the photo has got
  Stop();
  const Lines identity = Query(volume.Path(), "SELECT identity FROM Identity");
  Write(volume.Path() + "/b.jpg");
  StartServiceAndDaemon();
  StartIndexerIn({"PROBE_CLOCK_OFFSET=-300000000"});
  EXPECT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "b.jpg"}), IsEmpty());
  EXPECT_EQ(Query(volume.Path(), "SELECT identity FROM Identity"), identity);
  EXPECT_THAT(ErrorLines(), Not(Contains(HasSubstr("renamed"))));
}

TEST_F(IndexerAndDaemonTest, ARestartOfAllProgramsPurgesNothing) {
  const Volume volume("Disk", "64m");
  Write(volume.Path() + "/a.jpg");
  Start();
  ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg"}), IsEmpty());
  ASSERT_TRUE(AwaitRemembered());
  Lines names = {"a.jpg"};
  for (const std::string name : {"b.jpg", "c.jpg", "d.jpg"}) {
    names.push_back(name);
    Stop();
    const long purged = Count(Events(volume.Path()), "Purged");
    Write(volume.Path() + "/" + name);
    Start();
    ASSERT_THAT(AwaitMerged(volume.Path(), names), IsEmpty());
    EXPECT_EQ(Count(Events(volume.Path()), "Purged"), purged);
  }
}

// --- The indexer's own state -------------------------------------------------------------------

/// The indexer with a state directory that cannot be used.
class IndexerWithoutStateTest : public IndexerAndDaemonTest {
protected:
  /// `repair` makes it usable.
  void ExpectThatItIsUsedWhenItIsRepaired(const std::function<void()>& repair) {
    const auto purges = [this] { return Count(Events("/shares/Disk"), "Purged"); };
    const auto errors = [this] {
      Lines lines = ErrorLines();
      std::erase_if(lines, [](const std::string& line) { return !line.starts_with("/tmp/state"); });
      return lines;
    };
    const Volume volume("Disk", "64m");
    Write(volume.Path() + "/a.jpg");
    Start();
    ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg"}), IsEmpty());
    ASSERT_TRUE(Await([&] { return purges() > 0; }));
    Write(volume.Path() + "/b.jpg");
    ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "b.jpg"}), IsEmpty());
    const long purged = purges();
    EXPECT_THAT(errors(), ElementsAre(HasSubstr("/tmp/state cannot be used")));

    repair();
    Write(volume.Path() + "/c.jpg");
    ASSERT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "b.jpg", "c.jpg"}), IsEmpty());
    ASSERT_TRUE(AwaitRemembered());
    StopIndexer();
    StartIndexer();
    Write(volume.Path() + "/d.jpg");
    EXPECT_THAT(AwaitMerged(volume.Path(), {"a.jpg", "b.jpg", "c.jpg", "d.jpg"}), IsEmpty());
    EXPECT_EQ(purges(), purged);
    EXPECT_EQ(errors().size(), 1U);
  }
};

TEST_F(IndexerWithoutStateTest, ItGoesOnWithoutADirectory) {
  Write(STATE_DIRECTORY); // a file, so that no directory can be made
  ExpectThatItIsUsedWhenItIsRepaired([] { fs::remove(STATE_DIRECTORY); });
}

TEST_F(IndexerWithoutStateTest, ItGoesOnWithADirectoryThatIsReadOnly) {
  fs::create_directory(STATE_DIRECTORY);
  ASSERT_EQ(mount("state", STATE_DIRECTORY, "tmpfs", MS_RDONLY, "size=1m"), 0);
  ExpectThatItIsUsedWhenItIsRepaired(
      [] { ASSERT_EQ(mount("state", STATE_DIRECTORY, "tmpfs", MS_REMOUNT, "size=1m"), 0); });
}

// --- Command line ------------------------------------------------------------------------------

TEST_F(IndexerTest, HasNoOptionsButHelpAndVersion) {
  const std::string program = ProgramPath("orva-indexer");
  EXPECT_EQ(test::Run({program, "--version"}).output, "orva-indexer " PROGRAM_VERSION "\n");
  const Outcome help = test::Run({program, "--help"});
  EXPECT_EQ(help.status, 0);
  EXPECT_THAT(help.output, HasSubstr("Exit status"));
  const Outcome wrong = test::Run({program, "now"});
  EXPECT_EQ(wrong.status, 2);
  EXPECT_THAT(wrong.output + wrong.error, HasSubstr("'now'\nTry 'orva-indexer --help'.\n"));
}

} // namespace
} // namespace orva::test

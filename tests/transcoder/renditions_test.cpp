#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include "CatalogSchema.h"
#include "Sql.h"
#include "orva-transcoder/Renderer.h"
#include "orva-transcoder/Volume.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"
#include "support/OtherUsers.h"

#include <gmock/gmock.h>

#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <ctime>
#include <sstream>
#include <thread>

namespace {

namespace catalog = orva::catalog;
namespace db = orva::db;
namespace test = orva::test;
namespace transcoder = orva::transcoder;
using namespace orva::test;
using testing::Contains;
using testing::HasSubstr;
namespace fs = std::filesystem;

class Renditions : public TranscoderTest {
protected:
  void CopyAll(const Lines& names) const {
    for (const std::string& name : names) {
      CopyPhoto(name);
    }
  }

  /// Of files with the ids 1 to `count`, which the catalog does not contain.
  void AddRemovals(int count) const {
    constexpr int PART = 5000; // a statement may take a limited number of steps
    for (int first = 1; first <= count; first += PART) {
      Query("WITH RECURSIVE n(id) AS (SELECT " + std::to_string(first) +
            " UNION ALL SELECT id + 1 FROM n LIMIT " + std::to_string(PART) +
            ") INSERT INTO Removals SELECT id FROM n");
    }
  }

  struct stat StatusOf(const std::string& path) const {
    struct stat status {};
    EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
    return status;
  }
};

TEST_F(Renditions, AreInFoldersOfAThousandById) {
  CopyAll({"a.jpg", "b.jpg"});
  AddAllWaiting({"a.jpg", "b.jpg"});
  Query("UPDATE Files SET id = 12345 WHERE path = 'b.jpg'");
  RenderAll();
  EXPECT_TRUE(fs::is_regular_file(At(".orva/renditions/0/1.jpg")));
  EXPECT_TRUE(fs::is_regular_file(At(".orva/renditions/12/12345.jpg")));
  EXPECT_EQ(StatusOf(At(".orva/renditions")).st_mode & 07777, 0755U);
  EXPECT_EQ(
      Query("SELECT sourceId, profile, status FROM Transcodings ORDER BY 1", 3),
      (Lines{"1|cb62bbdd389b48898f2e5244977cb2c5|1", "12345|cb62bbdd389b48898f2e5244977cb2c5|1"}));
}

TEST_F(Renditions, GetTheOwnerOfThePhotoAndItsPermissionToRead) {
  SKIP_WITHOUT_OTHER_USERS();
  CopyAll({"private.jpg", "group.jpg", "open.jpg"});
  chmod(At("private.jpg").c_str(), 0600);
  chmod(At("group.jpg").c_str(), 04770);
  ASSERT_EQ(chown(At("private.jpg").c_str(), 1234, 2345), 0);
  ASSERT_EQ(chown(At("group.jpg").c_str(), 1234, 2345), 0);
  AddAllWaiting({"private.jpg", "group.jpg", "open.jpg"});
  RenderAll();
  const struct stat isPrivate = StatusOf(Rendition("private.jpg"));
  EXPECT_EQ(isPrivate.st_uid, 1234U);
  EXPECT_EQ(isPrivate.st_gid, 2345U);
  EXPECT_EQ(isPrivate.st_mode & 07777, 0400U);
  EXPECT_EQ(StatusOf(Rendition("group.jpg")).st_mode & 07777, 0440U);
  EXPECT_EQ(StatusOf(Rendition("open.jpg")).st_mode & 07777, 0444U);
}

TEST_F(Renditions, OfAPhotoThatBecomesPrivateBecomesPrivate) {
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  RenderAll();
  ASSERT_EQ(StatusOf(Rendition("a.jpg")).st_mode & 07777, 0444U);
  chmod(At("a.jpg").c_str(), 0600);
  AddWaiting("a.jpg"); // the indexer does so
  RenderAll();
  EXPECT_EQ(StatusOf(Rendition("a.jpg")).st_mode & 07777, 0400U);
}

TEST_F(Renditions, OfPhotosInAPrivateFolderArePrivate) {
  fs::create_directories(At("private/below"));
  fs::create_directories(At("group/below"));
  CopyPhoto("private/below/a.jpg");
  CopyPhoto("group/below/a.jpg");
  chmod(At("private").c_str(), 0700);
  chmod(At("group").c_str(), 0750);
  AddAllWaiting({"private/below/a.jpg", "group/below/a.jpg"});
  RenderAll();
  EXPECT_EQ(StatusOf(Rendition("private/below/a.jpg")).st_mode & 07777, 0400U);
  EXPECT_EQ(StatusOf(Rendition("group/below/a.jpg")).st_mode & 07777, 0440U);
}

TEST_F(Renditions, AFailedPhotoIsNotTriedAgainUntilItChanges) {
  WriteBytes(At("a.jpg"), "no image");
  CopyPhoto("b.jpg");
  AddWaiting("a.jpg");
  RenderAll();
  const long long stamp = Number("SELECT lastUpdatedDate FROM Transcodings");
  AddWaiting("b.jpg");
  RenderAll();
  EXPECT_EQ(Number("SELECT lastUpdatedDate FROM Transcodings WHERE sourceId = 1"), stamp);
  fs::remove(At("a.jpg"));
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  RenderAll();
  EXPECT_EQ(StateOf("a.jpg"), "finished");
}

TEST_F(Renditions, APhotoThatCannotBeOpenedFails) {
  KillTranscoder();
  StartTranscoder({"setpriv", "--bounding-set", "-dac_override,-dac_read_search"});
  CopyPhoto("a.jpg");
  chmod(At("a.jpg").c_str(), 0);
  AddWaiting("a.jpg");
  RenderAll();
  EXPECT_EQ(StateOf("a.jpg"), "failed: cannot be opened: Permission denied");
}

TEST_F(Renditions, AFailedChangeRemovesTheOldRendition) {
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  RenderAll();
  ASSERT_TRUE(fs::exists(Rendition("a.jpg")));
  WriteBytes(At("a.jpg"), "no image any more");
  AddWaiting("a.jpg");
  RenderAll();
  EXPECT_THAT(StateOf("a.jpg"), HasSubstr("failed"));
  EXPECT_TRUE(Await([this] { return !fs::exists(RenditionOf(1)); }));
}

TEST_F(Renditions, OfVanishedPhotosAreRemoved) {
  CopyAll({"a.jpg", "b.jpg"});
  AddAllWaiting({"a.jpg", "b.jpg"});
  RenderAll();
  fs::remove(At("a.jpg"));
  AddRemoved("a.jpg");
  // This one is back.
  Query("INSERT INTO Removals(fileId) VALUES(2)");
  Announce("end");
  EXPECT_TRUE(Await([this] { return Number("SELECT count(*) FROM Removals") == 0; }));
  EXPECT_FALSE(fs::exists(RenditionOf(1)));
  EXPECT_TRUE(fs::exists(RenditionOf(2)));
}

TEST_F(Renditions, OfManyVanishedPhotosAreRemovedInPieces) {
  const Volume other("B", "100m");
  const std::string disk = Root();
  fs::create_directory("/shares/C");
  ASSERT_EQ(mount(disk.c_str(), "/shares/C", nullptr, MS_BIND, nullptr), 0);
  AddAllWaiting({}); // makes the catalog
  AddRemovals(400000);
  TranscoderTest::Announce("plugged", "/shares/C");
  UseRoot(other.Path());
  CopyPhoto("b.jpg");
  AddWaiting("b.jpg");
  RenderAll();
  EXPECT_EQ(StateOf("b.jpg"), "finished");
  UseRoot(disk);
  const long long left = Number("SELECT count(*) FROM Removals");
  EXPECT_GT(left, 0);
  EXPECT_TRUE(Await([&] { return Number("SELECT count(*) FROM Removals") < left; }));
  EXPECT_TRUE(Await([] { return umount2("/shares/C", 0) == 0; })) << errno;
  EXPECT_GT(Number("SELECT count(*) FROM Removals"), 0);
}

TEST_F(Renditions, AreRemovedUntilNoneOfAVanishedPhotoIsLeft) {
  KillTranscoder();
  AddAllWaiting({});
  AddRemovals(25000);
  WriteBytes(RenditionOf(1), "of a vanished photo");
  WriteBytes(RenditionOf(25000), "of a vanished photo");
  orva::transcoder::Volume volume(Root() + '/', catalog::VolumeRoot::Kind::Mount);
  volume.Look();
  std::size_t pieces = 1;
  for (; volume.HasVanished(); ++pieces) {
    volume.RemoveVanished();
  }
  EXPECT_GE(pieces, 3U);
  EXPECT_EQ(Number("SELECT count(*) FROM Removals"), 0);
  EXPECT_FALSE(fs::exists(RenditionOf(1)));
  EXPECT_FALSE(fs::exists(RenditionOf(25000)));
}

TEST_F(Renditions, AreComparedWithTheCatalogWhenTheVolumeAppears) {
  const Lines names = {"a.jpg", "b.jpg", "c.jpg", "d.jpg", "e.jpg"};
  CopyAll(names);
  AddAllWaiting(names);
  Query("UPDATE Files SET id = 5001 WHERE path = 'e.jpg'");
  RenderAll();
  KillTranscoder();

  fs::remove(Rendition("a.jpg"));
  WriteBytes(Rendition("b.jpg"), "");
  fs::remove(Rendition("c.jpg"));
  ASSERT_EQ(mkfifo(Rendition("c.jpg").c_str(), 0600), 0);
  fs::remove_all(At(".orva/renditions/5"));
  const std::string all = At(".orva/renditions");
  WriteBytes("/tmp/outside", "outside");
  fs::create_symlink("/tmp/outside", all + "/0/77.jpg");
  WriteBytes(all + "/0/4.jpg.new", "temporary");
  WriteBytes(all + "/0/999.jpg", "of nothing");
  WriteBytes(all + "/0/04.jpg", "not as we write it");
  WriteBytes(all + "/0/folder/kept", "kept");
  WriteBytes(all + "/3/3000.jpg", "of nothing");
  WriteBytes(all + "/photos/kept", "kept");
  WriteBytes(all + "/07/kept", "kept");
  WriteBytes(all + "/file", "a file");
  fs::create_directory("/tmp/elsewhere");
  WriteBytes("/tmp/elsewhere/9000.jpg", "outside");
  fs::create_directory_symlink("/tmp/elsewhere", all + "/9");
  const auto kept = fs::last_write_time(Rendition("d.jpg"));

  StartTranscoder();
  ASSERT_TRUE(Await([&] { return !fs::exists(all + "/3"); })); // comes last
  ASSERT_TRUE(Await([this] { return Waiting() == 0; }));
  for (const std::string& name : names) {
    EXPECT_EQ(StateOf(name), "finished") << name;
    EXPECT_EQ(HeaderOf(Rendition(name)).width, 600) << name;
  }
  EXPECT_EQ(fs::last_write_time(Rendition("d.jpg")), kept);
  for (const char* const gone :
       {"/0/77.jpg", "/0/4.jpg.new", "/0/999.jpg", "/0/04.jpg", "/file", "/9"}) {
    EXPECT_FALSE(fs::exists(fs::symlink_status(all + gone))) << gone;
  }
  for (const char* const stays : {"/0/folder/kept", "/photos/kept", "/07/kept"}) {
    EXPECT_TRUE(fs::exists(all + stays)) << stays;
  }
  EXPECT_EQ(ReadBytes("/tmp/outside"), "outside");
  EXPECT_EQ(ReadBytes("/tmp/elsewhere/9000.jpg"), "outside");
}

TEST_F(Renditions, FoldersOfNoPhotoAreExaminedInPieces) {
  KillTranscoder();
  AddAllWaiting({});
  constexpr long long FOLDERS = 3;
  for (long long i = 0; i < FOLDERS; ++i) {
    WriteBytes(RenditionOf(1000 * i), "of nothing");
  }
  orva::transcoder::Volume volume(Root() + '/', catalog::VolumeRoot::Kind::Mount);
  volume.Look();
  // A slow medium: each file takes longer than a piece of work may take.
  const auto isInBatch = [](long long) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(250);
    while (std::chrono::steady_clock::now() < end) {
    }
    return false;
  };
  std::size_t pieces = 0;
  for (; volume.HasUncheckedRenditions(); ++pieces) {
    volume.CheckRenditions(isInBatch);
  }
  EXPECT_GE(pieces, FOLDERS);
  EXPECT_TRUE(fs::is_empty(At(".orva/renditions")));
}

TEST_F(Renditions, APhotoThatDiffersFromTheCatalogWaitsForTheIndexer) {
  CopyAll({"a.jpg", "b.jpg"});
  AddAllWaiting({"a.jpg", "b.jpg"});
  WriteBytes(At("a.jpg"), "changed, and the catalog does not know");
  Announce("scanned");
  ASSERT_TRUE(Await([this] { return StateOf("b.jpg") == "finished"; }));
  EXPECT_TRUE(AwaitSent("\"End\""));
  EXPECT_EQ(StateOf("a.jpg"), "waiting");
  fs::remove(At("a.jpg"));
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  RenderAll();
  EXPECT_EQ(StateOf("a.jpg"), "finished");
}

TEST_F(Renditions, APhotoThatIsReplacedWhileItIsRenderedIsRenderedAgain) {
  MakeSlowPhoto(At("a.png"));
  AddWaiting("a.png");
  Announce("scanned");
  ASSERT_TRUE(Await([] { return Status().find("\"rendering\":true") != std::string::npos; }));
  fs::remove(At("a.png"));
  CopyPhoto("a.png");
  AddWaiting("a.png");
  RenderAll();
  EXPECT_EQ(HeaderOf(Rendition("a.png")).width, 600);
}

TEST_F(Renditions, APhotoThatVanishesWhileItIsRenderedLeavesNoRendition) {
  MakeSlowPhoto(At("a.png"));
  AddWaiting("a.png");
  Announce("scanned");
  ASSERT_TRUE(Await([] { return Status().find("\"rendering\":true") != std::string::npos; }));
  fs::remove(At("a.png"));
  AddRemoved("a.png");
  Announce("end");
  ASSERT_TRUE(Await([] { return Status().find("\"rendering\":true") == std::string::npos; }));
  EXPECT_TRUE(Await([this] { return Number("SELECT count(*) FROM Removals") == 0; }));
  EXPECT_FALSE(fs::exists(RenditionOf(1)));
}

TEST_F(Renditions, AShortQueueIsSharedOutAmongTheProcessors) {
  MakePhoto("/tmp/photo.jpg", 2000, 1500);
  Lines names;
  for (int i = 0; i < 40; ++i) {
    names.push_back(std::to_string(i) + ".jpg");
  }
  CopyAll(names);
  AddAllWaiting(names);
  Announce("scanned");
  // The programs stop, so the first batch does not end.
  std::string programs;
  ASSERT_TRUE(Await([&programs] {
    programs = test::Run({"pidof", "vipsthumbnail"}).output;
    return !programs.empty();
  }));
  const auto signal = [&programs](int number) {
    std::istringstream ids(programs);
    for (pid_t id = 0; ids >> id;) {
      EXPECT_EQ(kill(id, number), 0);
    }
  };
  signal(SIGSTOP);
  const unsigned processors = std::max(std::thread::hardware_concurrency(), 1U);
  const std::string first = std::string(RUNTIME) + "/staging/1/in";
  EXPECT_EQ(std::distance(fs::directory_iterator(first), fs::directory_iterator()),
            std::max(40 / processors, 10U));
  signal(SIGCONT);
  RenderAll();
  for (const std::string& name : names) {
    EXPECT_EQ(StateOf(name), "finished");
  }
}

TEST_F(Renditions, StampsThatAreAheadOfTheClockAreWaitedFor) {
  CopyAll({"a.jpg", "b.jpg"});
  AddAllWaiting({"a.jpg", "b.jpg"});
  fs::rename(At("b.jpg"), At("later"));
  Query("UPDATE Identity SET newestStamp = strftime('%s', 'now') + 5");
  Announce("scanned");
  ASSERT_TRUE(Await([this] { return StateOf("a.jpg") == "finished"; }));
  fs::rename(At("later"), At("b.jpg"));
  RenderAll();
  EXPECT_LE(Number("SELECT newestStamp FROM Identity"), std::time(nullptr) + 3);
}

TEST_F(Renditions, NothingIsWrittenWhileTheCatalogIsLocked) {
  using orva::transcoder::Volume;
  KillTranscoder();
  CopyPhoto("a.jpg");
  const long long id = AddWaiting("a.jpg");
  Volume volume(Root() + '/', catalog::VolumeRoot::Kind::Mount);
  volume.Look();
  orva::transcoder::PrepareStaging("/tmp/staging");
  const auto batch =
      volume.Stage("/tmp/staging/1", {.photos = 1, .space = 1 << 20, .most = 1 << 20},
                   [](long long) { return false; });
  ASSERT_TRUE(batch);
  orva::transcoder::Render(*batch);
  {
    const auto other = catalog::OpenCatalog(Root());
    const db::Transaction lock(*other, catalog::BUSY_TIMEOUT);
    EXPECT_EQ(volume.Store({batch.get()}), Volume::Stored::Later);
    EXPECT_FALSE(fs::exists(RenditionOf(id)));
  }
  EXPECT_EQ(volume.Store({batch.get()}), Volume::Stored::Done);
  EXPECT_TRUE(fs::exists(RenditionOf(id)));
  EXPECT_EQ(StateOf("a.jpg"), "finished");
}

TEST_F(Renditions, TheVolumeCanBeUnmountedBetweenTwoPiecesOfWork) {
  MakeSlowPhoto(At("a.png"));
  AddWaiting("a.png");
  Announce("scanned");
  ASSERT_TRUE(Await([] { return Status().find("\"rendering\":true") != std::string::npos; }));
  // The photo is being rendered, and nothing of the volume is open.
  EXPECT_TRUE(Await([this] { return umount2(Root().c_str(), 0) == 0; })) << errno;
  ASSERT_TRUE(Await([] { return Status() == "{\"volumes\":[]}\n"; })) << Status();
  EXPECT_TRUE(fs::is_empty(Root()));
  EXPECT_TRUE(Await([] { return fs::is_empty(std::string(RUNTIME) + "/staging"); }));
}

TEST_F(Renditions, AVolumeThatIsUnmountedWhileMessagesWaitIsNoError) {
  AddAllWaiting({});
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("\"End\""));
  // It may be stopped while it looks at the volume: then again.
  ASSERT_TRUE(Await([this] {
    Transcoder().Signal(SIGSTOP);
    Announce("scanned");
    const bool isUnmounted = umount2(Root().c_str(), 0) == 0;
    Transcoder().Signal(SIGCONT);
    return isUnmounted;
  })) << errno;
  ASSERT_TRUE(Await([] { return Status() == "{\"volumes\":[]}\n"; })) << Status();
  EXPECT_THAT(Logged(), testing::IsEmpty());
}

TEST_F(Renditions, ACatalogThatIsBeingMadeIsNoError) {
  // As another program sees it between the file's first page and the commit of the tables.
  fs::create_directories(At(".orva"));
  {
    const db::VolumeDB catalog(Root(), true);
    catalog::SelectNumber(catalog, "PRAGMA journal_mode = WAL");
  }
  ASSERT_GT(fs::file_size(At(".orva/orva.db")), 0U);
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("\"End\""));
  EXPECT_THAT(Logged(), testing::IsEmpty());
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  RenderAll();
  EXPECT_TRUE(fs::exists(Rendition("a.jpg")));
}

TEST_F(Renditions, NothingIsWrittenWhereNothingIsMounted) {
  fs::create_directories("/shares/Bare");
  UseRoot("/shares/Bare");
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  Announce("plugged");
  Announce("scanned");
  // Another volume is looked at later.
  EXPECT_TRUE(AwaitLogged("/shares/Bare: nothing is mounted there"));
  EXPECT_FALSE(fs::exists("/shares/Bare/.orva/renditions"));
  Announce("unplugged");
  AnnounceDirectory("/shares/Bare");
  RenderAll();
  EXPECT_TRUE(fs::exists(Rendition("a.jpg")));
}

TEST_F(Renditions, TheFolderOfTheVolumesIsNoVolume) {
  UseRoot("/shares");
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  AnnounceDirectory("/shares");
  EXPECT_TRUE(AwaitLogged("/shares/: not rendered: the volumes are below it"));
  UseRoot(TheVolume().Path());
  CopyPhoto("b.jpg");
  AddWaiting("b.jpg");
  RenderAll();
  EXPECT_FALSE(fs::exists("/shares/.orva/renditions"));
}

TEST_F(Renditions, APhotoWhosePathIsTooLongFails) {
  std::string path;
  for (int folder = 0; folder < 30; ++folder) {
    path += std::string(200, 'x') + '/';
  }
  AddWaiting(path + "a.jpg");
  Announce("scanned");
  EXPECT_TRUE(Await([&] { return Waiting() == 0; }));
  EXPECT_EQ(StateOf(path + "a.jpg"), "failed: cannot be opened: File name too long");
}

TEST_F(Renditions, AreMadeAgainWhenTheirFolderWasRemoved) {
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  RenderAll();
  Announce("end");
  ASSERT_TRUE(fs::exists(Rendition("a.jpg")));
  CopyPhoto("b.jpg");
  AddWaiting("b.jpg");
  RenderAll(); // the folder was seen now
  fs::remove_all(At(".orva/renditions"));
  Announce("end");
  EXPECT_TRUE(
      Await([this] { return fs::exists(Rendition("a.jpg")) && fs::exists(Rendition("b.jpg")); }));
  EXPECT_TRUE(Await([this] { return Waiting() == 0; }));
}

TEST_F(Renditions, AVolumeThatBecomesFullIsReportedOnceAndTriedAgain) {
  // There is enough space for one rendition, but not for all.
  RunChecked({"vips", "gaussnoise", "/tmp/noise.v", "1500", "1500", "--sigma", "90"});
  RunChecked({"vips", "cast", "/tmp/noise.v", "/tmp/noise.jpg", "uchar"});
  Lines names;
  for (int i = 0; i < 40; ++i) {
    names.push_back(std::to_string(i) + ".jpg");
    fs::copy_file("/tmp/noise.jpg", At(names.back()));
  }
  AddAllWaiting(names);
  TheVolume().Resize(TheVolume().Used() + (5 << 20));
  Announce("scanned");
  ASSERT_TRUE(Await([this] {
    return testing::Matches(Contains(HasSubstr("No space left on device")))(Logged());
  })) << testing::PrintToString(Logged());
  EXPECT_GT(Waiting(), 0);
  TheVolume().Resize(1e9);
  RenderAll();
  for (const std::string& name : names) {
    EXPECT_EQ(HeaderOf(Rendition(name)).width, 1024);
  }
}

TEST_F(Renditions, AFullVolumeIsReportedOnceAndTriedAgain) {
  // The free space is enough for the catalog.
  RunChecked({"vips", "gaussnoise", "/tmp/noise.v", "1000", "1000", "--sigma", "90"});
  RunChecked({"vips", "cast", "/tmp/noise.v", At("a.png"), "uchar"});
  AddWaiting("a.png");
  TheVolume().Resize(TheVolume().Used() + (256 << 10));
  for (int i = 0; i < 3; ++i) {
    Announce("scanned");
  }
  ASSERT_TRUE(Await([this] {
    return testing::Matches(Contains(HasSubstr("No space left on device")))(Logged());
  })) << testing::PrintToString(Logged());
  TheVolume().Resize(1e9);
  RenderAll();
  EXPECT_EQ(StateOf("a.png"), "finished");
  const Lines logged = Logged();
  EXPECT_EQ(
      std::ranges::count_if(
          logged, [](const std::string& line) { return line.find("No space") < line.size(); }),
      1);
}

TEST_F(Renditions, AFullVolumeIsTriedAgainWhenSomeSpaceHasBecomeFree) {
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  std::ofstream(At("filler")) << std::string(8 << 20, 'x');
  TheVolume().Resize(TheVolume().Used() + (256 << 10));
  using Clock = transcoder::Volume::Clock;
  transcoder::Volume volume(Root() + '/', catalog::VolumeRoot::Kind::Mount);
  const transcoder::BatchLimits limits{
      .photos = 1, .bytes = 1 << 20, .space = 1 << 20, .most = 1 << 20};
  const auto stage = [&] {
    return volume.Stage("/tmp/batch", limits, [](long long) { return false; });
  };
  volume.Look();
  EXPECT_EQ(stage(), nullptr);
  for (int check = 0; check < 2; ++check) {
    const auto next = volume.LookAgainAt();
    ASSERT_TRUE(next);
    EXPECT_LT(*next, Clock::now() + std::chrono::seconds(5));
    ASSERT_TRUE(Await([&] { return Clock::now() >= *next; }));
    volume.LookAgain();
    EXPECT_FALSE(volume.HasWork());
  }
  fs::remove(At("filler"));
  ASSERT_TRUE(Await([&] {
    if (volume.LookAgainAt() && Clock::now() >= *volume.LookAgainAt()) {
      volume.LookAgain();
    }
    return volume.HasWork();
  }));
  EXPECT_NE(stage(), nullptr);
  EXPECT_EQ(
      std::ranges::count_if(
          Logged(), [](const std::string& line) { return line.find("No space") < line.size(); }),
      1);
}

TEST_F(Renditions, AReadOnlyVolumeIsReportedOnceAndTriedAgain) {
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  TheVolume().MakeReadOnly();
  Announce("scanned");
  Announce("scanned");
  ASSERT_TRUE(
      Await([this] { return testing::Matches(Contains(HasSubstr("is read-only")))(Logged()); }));
  TheVolume().MakeWritable();
  RenderAll();
  const Lines logged = Logged();
  EXPECT_EQ(
      std::ranges::count_if(
          logged, [](const std::string& line) { return line.find("read-only") < line.size(); }),
      1);
}

} // namespace

// What readers see of the snapshot while the merged database changes.

#include "SlowFile.h"
#include "SnapshotTest.h"

#include "system/Deadline.h"

#include <gmock/gmock.h>

#include <sys/mount.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <sstream>
#include <thread>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using State = web::SnapshotStatus::State;

const std::string B = "/shares/B/";

class ChangingSnapshot : public SnapshotTest {
protected:
  void SetUp() override {
    merged_.emplace(MERGED);
    a_ = merged_->AddVolume(A);
    Start();
  }

  std::optional<MergedFile> merged_;
  std::int64_t a_ = 0;
};

TEST_F(ChangingSnapshot, IsEmptyAndReadableBeforeTheFirstUpdate) {
  EXPECT_THAT(Names(), IsEmpty());
  EXPECT_THAT(reader_->Volumes(), IsEmpty());
  EXPECT_EQ(snapshot_->Status().state, State::Building);
}

TEST_F(ChangingSnapshot, ShowsPhotosNewestFirst) {
  merged_->AddFile(a_, "old.jpg", 100, A);
  merged_->AddFile(a_, "newest.jpg", 300, A);
  merged_->AddFile(a_, "before 1970.jpg", -5, A);
  merged_->AddFile(a_, "new.jpg", 200, A);
  EXPECT_TRUE(Update());
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  EXPECT_THAT(Names(), ElementsAre("newest.jpg", "new.jpg", "old.jpg", "before 1970.jpg"));
  const web::Photo photo = reader_->Photos({}, std::nullopt, 1).at(0);
  EXPECT_EQ(photo.path, "/shares/A/newest.jpg");
  EXPECT_EQ(photo.volume, A);
  EXPECT_EQ(photo.folder, a_);
  EXPECT_EQ(photo.modified, 300);
  EXPECT_EQ(reader_->Find(photo.id), photo);
  EXPECT_EQ(reader_->Find(photo.id + 1), std::nullopt);
}

TEST_F(ChangingSnapshot, PhotosOfTheSameTimeAreOrderedByTheirRows) {
  for (const char* const name : {"1.jpg", "2.jpg", "3.jpg"}) {
    merged_->AddFile(a_, name, 100, A);
  }
  Update();
  EXPECT_THAT(Names(), ElementsAre("3.jpg", "2.jpg", "1.jpg"));
}

TEST_F(ChangingSnapshot, TellsThatItBuildsBeforeItDoes) {
  std::vector<State> states;
  const auto tell = [&] { states.push_back(snapshot_->Status().state); };
  EXPECT_TRUE(snapshot_->Update({}, tell));
  EXPECT_THAT(states, ElementsAre(State::Building));
  merged_->AddFile(a_, "1.jpg", 100, A);
  EXPECT_TRUE(snapshot_->Update({}, tell));
  EXPECT_THAT(states, SizeIs(1));
}

TEST_F(ChangingSnapshot, AnUpdateWithoutAChangeChangesNothing) {
  merged_->AddFile(a_, "1.jpg", 100, A);
  EXPECT_TRUE(Update());
  const std::int64_t version = reader_->Version();
  EXPECT_FALSE(snapshot_->Update());
  EXPECT_EQ(reader_->Version(), version);
}

TEST_F(ChangingSnapshot, ACommitThatShowsNothingIsNoChange) {
  Update();
  const std::int64_t version = reader_->Version();
  merged_->Run("UPDATE Status SET mdate = 2000");
  EXPECT_FALSE(Update());
  EXPECT_EQ(reader_->Version(), version);
}

TEST_F(ChangingSnapshot, FollowsTheMergedDatabase) {
  const std::int64_t first = merged_->AddFile(a_, "1.jpg", 100, A);
  Update();
  const std::int64_t version = reader_->Version();
  const std::int64_t folder = merged_->AddFolder(a_, "/shares/A/Trip/", A);
  merged_->AddFile(folder, "2.jpg", 50, A);
  EXPECT_TRUE(Update());
  EXPECT_GT(reader_->Version(), version);
  EXPECT_THAT(Names(), ElementsAre("1.jpg", "2.jpg"));
  merged_->RemoveFile(first);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("2.jpg"));
  merged_->RemoveFolder(folder);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), IsEmpty());
  EXPECT_FALSE(reader_->FindFolder(folder));
}

TEST_F(ChangingSnapshot, AReplacedPhotoIsNoticedAlthoughTheCountStays) {
  const std::int64_t first = merged_->AddFile(a_, "1.jpg", 100, A);
  Update();
  merged_->Run("BEGIN");
  merged_->RemoveFile(first);
  merged_->AddFile(a_, "2.jpg", 200, A);
  merged_->Run("COMMIT");
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("2.jpg"));
}

TEST_F(ChangingSnapshot, ShowsTheProgressOfVolumes) {
  merged_->SetStatistics(A, 3, 10, 77);
  Update();
  const web::VolumeRow row{
      .mountPoint = A, .transcoded = 3, .total = 10, .mergedUpTo = 77, .isGone = false};
  EXPECT_THAT(reader_->Volumes(), ElementsAre(row));
  merged_->SetStatistics(A, 4, 10, 78);
  EXPECT_TRUE(Update());
  EXPECT_EQ(reader_->Volumes().at(0).transcoded, 4);
}

TEST_F(ChangingSnapshot, AVolumeThatLeftIsGone) {
  merged_->AddFile(a_, "1.jpg", 100, A);
  const std::int64_t b = merged_->AddVolume(B);
  merged_->AddFile(b, "2.jpg", 200, B);
  Update();
  merged_->RemoveVolume(B);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  EXPECT_FALSE(reader_->Volumes().at(0).isGone);
  EXPECT_TRUE(reader_->Volumes().at(1).isGone);
  EXPECT_THAT(Names(InVolume(B)), IsEmpty());
}

TEST_F(ChangingSnapshot, FiltersByVolumeFolderTimeAndWordsTogether) {
  const std::int64_t b = merged_->AddVolume(B);
  const std::int64_t trip = merged_->AddFolder(a_, "/shares/A/Trip/", A);
  merged_->AddFile(a_, "beach 1.jpg", 100, A);
  merged_->AddFile(trip, "beach 2.jpg", 200, A);
  merged_->AddFile(trip, "city.jpg", 300, A);
  merged_->AddFile(b, "beach 3.jpg", 400, B);
  Update();
  EXPECT_THAT(Names(InVolume(A)), ElementsAre("city.jpg", "beach 2.jpg", "beach 1.jpg"));
  EXPECT_THAT(Names(InVolume("/shares/C/")), IsEmpty());
  EXPECT_THAT(Names(WithWords("beach")), ElementsAre("beach 3.jpg", "beach 2.jpg", "beach 1.jpg"));
  EXPECT_THAT(Names(WithWords("BEA trip")), ElementsAre("beach 2.jpg"));
  web::Filter filter = InVolume(A);
  filter.words = "beach";
  EXPECT_THAT(Names(filter), ElementsAre("beach 2.jpg", "beach 1.jpg"));
  filter.folder = trip;
  EXPECT_THAT(Names(filter), ElementsAre("beach 2.jpg"));
  filter = {};
  filter.times = {200, 300};
  EXPECT_THAT(Names(filter), ElementsAre("city.jpg", "beach 2.jpg"));
  filter.words = "beach";
  EXPECT_THAT(Names(filter), ElementsAre("beach 2.jpg"));
  filter.times = {300, 200};
  EXPECT_THAT(Names(filter), IsEmpty());
}

TEST_F(ChangingSnapshot, WordsOfTheMountPointCount) {
  const std::string camera = "/shares/Cam\xC3\xA9ra 2/";
  const std::int64_t other = merged_->AddVolume(camera);
  const std::int64_t trip = merged_->AddFolder(a_, "/shares/A/Camping/", A);
  merged_->AddFile(a_, "1.jpg", 100, A);
  merged_->AddFile(trip, "2.jpg", 200, A);
  merged_->AddFile(other, "3.jpg", 300, camera);
  Update();
  EXPECT_THAT(Names(WithWords("shares")), ElementsAre("3.jpg", "2.jpg", "1.jpg"));
  EXPECT_THAT(Names(WithWords("/SHARES/A/Camping/2.jpg")), ElementsAre("2.jpg"));
  EXPECT_THAT(Names(WithWords("camera")), ElementsAre("3.jpg"));
  EXPECT_THAT(Names(WithWords("cam")), ElementsAre("3.jpg", "2.jpg"));
  EXPECT_THAT(Names(WithWords("camera 2")), ElementsAre("3.jpg"));
  EXPECT_THAT(Names(WithWords("camera 1")), IsEmpty());
  EXPECT_THAT(Names(WithWords("shares x")), IsEmpty());
  web::Filter filter = InVolume(camera);
  filter.words = "cam";
  EXPECT_THAT(Names(filter), ElementsAre("3.jpg"));
  filter.words = "a";
  EXPECT_THAT(Names(filter), IsEmpty());
  filter = InVolume(A);
  filter.words = "a";
  EXPECT_THAT(Names(filter), ElementsAre("2.jpg", "1.jpg"));
  merged_->AddFile(merged_->AddVolume("/shares/New/"), "new.jpg", 1, "/shares/New/");
  Update();
  EXPECT_THAT(Names(WithWords("new shares")), ElementsAre("new.jpg"));
}

TEST_F(ChangingSnapshot, ADatabaseThatStaysLockedIsAFailureUntilItIsNot) {
  merged_->AddFile(a_, "1.jpg", 100, A);
  Update();
  merged_->AddFile(a_, "2.jpg", 200, A);
  merged_->Run("BEGIN EXCLUSIVE");
  EXPECT_FALSE(Update());
  EXPECT_EQ(snapshot_->Status().state, State::Current); // as during a merge
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  while (snapshot_->Status().state == State::Current && std::chrono::steady_clock::now() < end) {
    Update();
  }
  EXPECT_EQ(snapshot_->Status().state, State::Failed);
  EXPECT_THAT(snapshot_->Status().reason, HasSubstr("is locked"));
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  merged_->Run("COMMIT");
  EXPECT_TRUE(Update());
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  EXPECT_THAT(Names(), ElementsAre("2.jpg", "1.jpg"));
}

TEST_F(ChangingSnapshot, TimesOutsideOf32BitsFindWhatIsInside) {
  merged_->AddFile(a_, "first.jpg", -2'147'483'648, A);
  merged_->AddFile(a_, "last.jpg", 2'147'483'647, A);
  Update();
  web::Filter filter;
  filter.times = {INT64_MIN, INT64_MAX};
  EXPECT_THAT(Names(filter), ElementsAre("last.jpg", "first.jpg"));
  filter.times = {4'000'000'000, 5'000'000'000};
  EXPECT_THAT(Names(filter), IsEmpty());
  filter.times = {-5'000'000'000, -4'000'000'000};
  EXPECT_THAT(Names(filter), IsEmpty());
}

TEST_F(ChangingSnapshot, PagesFollowEachOtherInBothDirections) {
  for (int i = 0; i < 10; ++i) {
    merged_->AddFile(a_, std::to_string(i) + ".jpg", i, A);
  }
  Update();
  const auto first = reader_->Photos({}, std::nullopt, 3);
  EXPECT_THAT(NamesOf(first), ElementsAre("9.jpg", "8.jpg", "7.jpg"));
  const auto second = reader_->Photos({}, first.back().id, 3);
  EXPECT_THAT(NamesOf(second), ElementsAre("6.jpg", "5.jpg", "4.jpg"));
  EXPECT_EQ(reader_->PhotosAfter({}, second.front().id, 3), first);
  EXPECT_THAT(NamesOf(reader_->PhotosAfter({}, second.back().id, 1)), ElementsAre("5.jpg"));
  EXPECT_THAT(reader_->PhotosAfter({}, first.front().id, 3), IsEmpty());
  EXPECT_THAT(reader_->PhotosAfter({}, INT64_MAX, 3), IsEmpty());
  EXPECT_THAT(reader_->Photos({}, INT64_MIN, 3), IsEmpty());
  EXPECT_THAT(NamesOf(reader_->PhotosAfter(WithWords("jpg"), second.back().id, 2)),
              ElementsAre("6.jpg", "5.jpg"));
}

TEST_F(ChangingSnapshot, ShowsTheFolderTree) {
  const std::int64_t trips = merged_->AddFolder(a_, "/shares/A/Trips/", A);
  const std::int64_t rome = merged_->AddFolder(trips, "/shares/A/Trips/Rome/", A);
  merged_->AddFile(rome, "1.jpg", 1, A);
  Update();
  const web::Folder top{.id = 1,
                        .parent = -1,
                        .path = "/shares/",
                        .volume = "<DUMMY>",
                        .hasFolders = true,
                        .hasPhotos = false};
  EXPECT_THAT(reader_->Folders(-1, {}, 10), ElementsAre(top));
  const web::Folder last{.id = rome,
                         .parent = trips,
                         .path = "/shares/A/Trips/Rome/",
                         .volume = A,
                         .hasFolders = false,
                         .hasPhotos = true};
  EXPECT_THAT(reader_->Folders(trips, {}, 10), ElementsAre(last));
  EXPECT_THAT(reader_->Folders(trips, last, 10), IsEmpty());
  EXPECT_EQ(reader_->FindFolder(rome), last);
  std::vector<std::int64_t> ids;
  for (const web::Folder& folder : reader_->Ancestors(rome)) {
    ids.push_back(folder.id);
  }
  EXPECT_THAT(ids, ElementsAre(1, a_, trips));
}

TEST_F(ChangingSnapshot, AFolderWhoseParentWasRemovedMovesToTheNextOne) {
  const std::int64_t trips = merged_->AddFolder(a_, "/shares/A/Trips/", A);
  const std::int64_t rome = merged_->AddFolder(trips, "/shares/A/Trips/Rome/", A);
  Update();
  merged_->RemoveFolder(trips);
  Update();
  EXPECT_EQ(reader_->FindFolder(rome).value().parent, a_);
}

TEST_F(ChangingSnapshot, MonthsAreThoseThatHavePhotosInLocalTime) {
  setenv("TZ", "Europe/Berlin", 1);
  tzset();
  const auto at = [](const char* text) {
    std::tm time{};
    strptime(text, "%Y-%m-%d %H:%M:%S", &time);
    return static_cast<std::int64_t>(timegm(&time));
  };
  const std::int64_t b = merged_->AddVolume(B);
  merged_->AddFile(a_, "1.jpg", at("2019-12-31 23:30:00"), A); // January there
  merged_->AddFile(a_, "2.jpg", at("2019-12-31 22:30:00"), A);
  merged_->AddFile(b, "3.jpg", at("2020-07-31 21:59:59"), B);
  merged_->AddFile(b, "4.jpg", at("1966-02-01 00:00:00"), B);
  Update();
  using web::Month;
  EXPECT_THAT(reader_->Months({}),
              ElementsAre(Month{2020, 7}, Month{2020, 1}, Month{2019, 12}, Month{1966, 2}));
  EXPECT_THAT(reader_->Months(InVolume(B)), ElementsAre(Month{2020, 7}, Month{1966, 2}));
  EXPECT_THAT(reader_->Months(InVolume("/shares/C/")), IsEmpty());
}

TEST_F(ChangingSnapshot, AnotherMasterReplacesEverything) {
  merged_->AddFile(a_, "old.jpg", 1, A);
  Update();
  const std::int64_t version = reader_->Version();
  path_ = "/tmp/other/zophotos.db";
  MergedFile other(path_);
  other.AddFile(other.AddVolume(B), "new.jpg", 1, B);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("new.jpg"));
  EXPECT_GT(reader_->Version(), version);
}

TEST_F(ChangingSnapshot, AnotherFileAtTheSamePathReplacesEverything) {
  merged_->AddFile(a_, "old.jpg", 1, A);
  Update();
  {
    MergedFile other("/tmp/other/zophotos.db");
    other.AddFile(other.AddVolume(A), "new.jpg", 1, A);
  }
  fs::rename("/tmp/other/zophotos.db", MERGED);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("new.jpg"));
}

// Pages that are still open have the ids of the former database.
TEST_F(ChangingSnapshot, AnIdNeverMeansThePhotoOfAnotherDatabase) {
  for (const char* const name : {"1.jpg", "2.jpg", "3.jpg"}) {
    merged_->AddFile(a_, name, 100, A);
  }
  Update();
  const auto former = reader_->Photos({}, std::nullopt, 10);
  path_ = "/tmp/other/zophotos.db";
  {
    MergedFile other(path_);
    const std::int64_t folder = other.AddVolume(A);
    for (const char* const name : {"3.jpg", "1.jpg", "2.jpg"}) {
      other.AddFile(folder, name, 100, A);
    }
  }
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("2.jpg", "1.jpg", "3.jpg"));
  for (const web::Photo& photo : former) {
    EXPECT_EQ(reader_->Find(photo.id), std::nullopt) << photo.name;
  }
  // The same with another file at the same path.
  const auto second = reader_->Photos({}, std::nullopt, 10);
  fs::rename(MERGED, path_);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("3.jpg", "2.jpg", "1.jpg"));
  for (const web::Photo& photo : second) {
    EXPECT_EQ(reader_->Find(photo.id), std::nullopt) << photo.name;
  }
}

TEST_F(ChangingSnapshot, IdsStayWhenTheSnapshotIsBuiltAgain) {
  for (const char* const name : {"1.jpg", "2.jpg", "3.jpg"}) {
    merged_->AddFile(a_, name, 100, A);
  }
  Update();
  const auto before = reader_->Photos({}, std::nullopt, 10);
  reader_.reset();
  snapshot_.reset();
  fs::remove_all(CACHE);
  Start();
  Update();
  EXPECT_EQ(reader_->Photos({}, std::nullopt, 10), before);
  merged_->RemoveFile(2);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("3.jpg", "1.jpg"));
}

TEST_F(ChangingSnapshot, IsEmptyWithoutAMergedDatabase) {
  merged_->AddFile(a_, "1.jpg", 1, A);
  Update();
  path_.clear();
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), IsEmpty());
  EXPECT_EQ(snapshot_->Status().state, State::NoDatabase);
  EXPECT_EQ(snapshot_->Status().reason, "no merged database");
  EXPECT_FALSE(snapshot_->Update());
  path_ = "/tmp/nothing/zophotos.db";
  EXPECT_FALSE(snapshot_->Update());
  EXPECT_EQ(snapshot_->Status().state, State::NoDatabase);
  path_ = MERGED;
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
}

TEST_F(ChangingSnapshot, ALockedDatabaseIsReadLater) {
  merged_->AddFile(a_, "1.jpg", 1, A);
  Update();
  merged_->Run("BEGIN EXCLUSIVE");
  merged_->AddFile(a_, "2.jpg", 2, A);
  EXPECT_FALSE(snapshot_->Update());
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  EXPECT_EQ(snapshot_->Status().state, State::Current);
  merged_->Run("COMMIT");
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("2.jpg", "1.jpg"));
}

// A merge that wants to commit waits for the lock.
TEST_F(ChangingSnapshot, OfASlowDiskLocksTheDatabaseForAShortTimeOnly) {
  merged_->Run("BEGIN");
  for (int i = 0; i < 30'000; ++i) {
    merged_->AddFile(a_, "Photo_" + std::to_string(i) + ".jpg", i, A);
  }
  for (int i = 0; i < 300; ++i) {
    merged_->AddFolder(a_, A + std::to_string(i) + std::string(4000, 'x') + '/', A);
    merged_->SetStatistics("/shares/" + std::to_string(i) + std::string(4000, 'x') + '/', 1, 1, 1);
  }
  merged_->Run("COMMIT");
  const SlowFile slow(MERGED);
  for (const char* const change : {"first", "second"}) {
    merged_->AddFile(a_, std::string(change) + ".jpg", 50'000, A);
    const int before = slow.Reads();
    EXPECT_TRUE(snapshot_->Update());
    EXPECT_LT(300, slow.Reads() - before) << change;
    EXPECT_GT(50, slow.MostReadsLocked()) << change;
  }
  EXPECT_THAT(Names(WithWords("second")), ElementsAre("second.jpg"));
}

TEST_F(ChangingSnapshot, KeepsTheMergedDatabaseClosed) {
  merged_->AddFile(a_, "1.jpg", 1, A);
  Update();
  merged_.reset();
  for (const auto& entry : fs::directory_iterator("/proc/self/fd")) {
    std::error_code error;
    EXPECT_THAT(fs::read_symlink(entry.path(), error).string(),
                ::testing::Not(HasSubstr("merged")));
  }
}

TEST_F(ChangingSnapshot, ManyChangesMakeANewFile) {
  merged_->AddFile(a_, "1.jpg", 1, A);
  Update();
  const std::string file = snapshot_->File();
  merged_->Run("BEGIN");
  for (int i = 0; i < 25'000; ++i) {
    merged_->AddFile(a_, "Photo_" + std::to_string(i) + ".jpg", 1000 + i, A);
  }
  merged_->Run("COMMIT");
  EXPECT_TRUE(Update());
  EXPECT_NE(snapshot_->File(), file);
  EXPECT_FALSE(fs::exists(file));
  EXPECT_EQ(Names().front(), "Photo_24999.jpg");
  EXPECT_THAT(Names(WithWords("photo 2499")), SizeIs(11));
  merged_->Run("DELETE FROM Files WHERE name < 'Photo_9'");
  EXPECT_TRUE(Update());
  EXPECT_THAT(ReadAll(*snapshot_), ::testing::Eq(ReadAll(*BuildAnother())));
}

/// A snapshot that many updates have changed, each of them less than a new one would be faster.
class RenewedSnapshot : public ChangingSnapshot {
protected:
  /// Adds photos that are newer than all others, and follows.
  void AddPhotos(int count) {
    merged_->Run("BEGIN");
    for (const int end = photos_ + count; photos_ < end; ++photos_) {
      merged_->AddFile(a_, NameOf(photos_), 1000 + photos_, A);
    }
    merged_->Run("COMMIT");
    snapshot_->Update({}, [this] { ++builds_; });
  }

  static std::string NameOf(int photo) { return "Photo_" + std::to_string(photo) + ".jpg"; }

  std::string Newest() { return reader_->Photos({}, std::nullopt, 1).front().name; }

  /// Until one photo more begins a renewal.
  void ChangeMuch() {
    AddPhotos(1);
    builds_ = 0;
    AddPhotos(10'000);
    AddPhotos(10'000);
  }

  static std::ptrdiff_t Snapshots() {
    return std::ranges::count_if(fs::directory_iterator(CACHE), [](const auto& entry) {
      return entry.path().extension() == ".db";
    });
  }

  /// Begins a renewal, and waits until it has a file. The next update after its end removes that,
  /// or uses it.
  void AwaitRenewal() {
    snapshot_->Update();
    while (Snapshots() == 1) {
      std::this_thread::yield();
    }
  }

  int photos_ = 0;
  int builds_ = 0; ///< for which readers have to wait
};

TEST_F(RenewedSnapshot, IsFollowedUntilTheNewOneIsThere) {
  ChangeMuch();
  const std::string file = snapshot_->File();
  do {
    AddPhotos(1);
    ASSERT_EQ(Newest(), NameOf(photos_ - 1));
    ASSERT_EQ(snapshot_->Status().state, State::Current);
  } while (snapshot_->File() == file);
  EXPECT_EQ(builds_, 0);
  EXPECT_EQ(Snapshots(), 1);
  EXPECT_EQ(ReadAll(*snapshot_), ReadAll(*BuildAnother()));
  EXPECT_FALSE(Update());
}

TEST_F(RenewedSnapshot, IsLeftForAnotherDatabase) {
  ChangeMuch();
  merged_->AddFile(a_, "last.jpg", 1'000'000, A);
  AwaitRenewal();
  path_ = "/tmp/other/zophotos.db";
  MergedFile other(path_);
  other.AddFile(other.AddVolume(B), "new.jpg", 1, B);
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("new.jpg"));
  EXPECT_EQ(Snapshots(), 1);
  path_.clear();
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), IsEmpty());
}

/// In a file system of its own.
class RenewedSnapshotOnASmallDisk : public RenewedSnapshot {
protected:
  RenewedSnapshotOnASmallDisk() {
    fs::create_directories(CACHE);
    EXPECT_EQ(mount("cache", CACHE.c_str(), "tmpfs", 0, "size=64m,nr_inodes=64,mode=700"), 0);
  }
  ~RenewedSnapshotOnASmallDisk() override {
    reader_.reset();
    snapshot_.reset();
    EXPECT_EQ(umount(CACHE.c_str()), 0);
  }
};

TEST_F(RenewedSnapshotOnASmallDisk, IsNotRenewedWithoutSpace) {
  ChangeMuch();
  constexpr std::uintmax_t ENOUGH_TO_FOLLOW = 1 << 20;
  const auto available = fs::space(CACHE).available;
  ASSERT_GT(available, ENOUGH_TO_FOLLOW);
  std::ofstream(CACHE + "/ballast") << std::string(available - ENOUGH_TO_FOLLOW, '1');
  for (int i = 0; i < 10; ++i) {
    AddPhotos(1);
    EXPECT_EQ(Newest(), NameOf(photos_ - 1));
    EXPECT_EQ(Snapshots(), 1);
  }
  EXPECT_EQ(builds_, 0);
}

TEST_F(RenewedSnapshotOnASmallDisk, StaysAsItIsIfTheNewOneCannotBeWritten) {
  ChangeMuch();
  int inodes = 0;
  while (std::ofstream(CACHE + "/inode-" + std::to_string(inodes))) {
    ++inodes;
  }
  ASSERT_GT(inodes, 0);
  std::ostringstream log;
  std::streambuf* const former = std::cerr.rdbuf(log.rdbuf());
  while (log.str().empty()) {
    AddPhotos(1);
    EXPECT_EQ(Newest(), NameOf(photos_ - 1));
  }
  std::cerr.rdbuf(former);
  EXPECT_THAT(log.str(), HasSubstr("cannot renew the snapshot: "));
  EXPECT_EQ(builds_, 0);
  EXPECT_EQ(snapshot_->Status().state, State::Current);
}

TEST_F(ChangingSnapshot, AStoppedUpdateIsMadeLater) {
  merged_->AddFile(a_, "1.jpg", 1, A);
  std::stop_source stop;
  stop.request_stop();
  EXPECT_FALSE(snapshot_->Update(stop.get_token()));
  EXPECT_THAT(Names(), IsEmpty());
  Update();
  merged_->AddFile(a_, "2.jpg", 2, A);
  EXPECT_FALSE(snapshot_->Update(stop.get_token()));
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  EXPECT_TRUE(Update());
  EXPECT_THAT(Names(), ElementsAre("2.jpg", "1.jpg"));
}

} // namespace
} // namespace orva::test

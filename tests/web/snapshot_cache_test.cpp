// The directory of the snapshot: what is found there at the start, and after a crash or kill.

#include "SnapshotTest.h"

#include <gmock/gmock.h>

#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <thread>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class CachedSnapshot : public SnapshotTest {
protected:
  void SetUp() override {
    merged_.emplace(MERGED);
    folder_ = merged_->AddVolume(A);
    merged_->AddFile(folder_, "1.jpg", 1, A);
  }

  /// Makes the directory as the program does.
  static void MakeCache() {
    fs::create_directories(CACHE);
    fs::permissions(CACHE, fs::perms::owner_all);
  }

  /// Why the program refuses a directory.
  std::string Refusal(const std::string& path) {
    try {
      const web::Snapshot snapshot(path, FindPath());
    } catch (const std::runtime_error& error) {
      return error.what();
    }
    return "none";
  }

  /// The files in the directory.
  static std::vector<std::string> Files() {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(CACHE)) {
      names.push_back(entry.path().filename().string());
    }
    std::ranges::sort(names);
    return names;
  }

  void Stop() {
    reader_.reset();
    snapshot_.reset();
  }

  /// The path of the present snapshot, which no process uses any more.
  std::string Leave() {
    Start();
    Update();
    std::string file = snapshot_->File();
    Stop();
    return file;
  }

  /// Starts again and expects that the snapshot is built again.
  void ExpectRebuilt() {
    Start();
    EXPECT_THAT(Names(), IsEmpty());
    EXPECT_TRUE(Update());
    EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  }

  std::optional<MergedFile> merged_;
  std::int64_t folder_ = 0;
};

TEST_F(CachedSnapshot, IsForItsOwnerOnly) {
  Start();
  struct stat status {};
  ASSERT_EQ(stat(CACHE.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777U, 0700U);
}

TEST_F(CachedSnapshot, ADirectoryThatOtherUsersMayUseIsRefusedAndLeftAlone) {
  for (const mode_t mode : {01777U, 0755U, 0710U}) {
    MakeCache();
    ASSERT_EQ(chmod(CACHE.c_str(), mode), 0);
    EXPECT_EQ(Refusal(CACHE), "cannot use the cache directory /tmp/cache: other users may use it; "
                              "name a directory that does not exist yet or has mode 0700");
    struct stat status {};
    ASSERT_EQ(stat(CACHE.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, mode);
    EXPECT_THAT(Files(), IsEmpty());
    fs::remove(CACHE);
  }
}

TEST_F(CachedSnapshot, IsReadAgainWithoutReadingAnUnchangedDatabase) {
  const std::string file = Leave();
  Start();
  EXPECT_EQ(snapshot_->File(), file);
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  EXPECT_FALSE(Update());
  EXPECT_EQ(snapshot_->File(), file);
  EXPECT_EQ(snapshot_->Status().state, web::SnapshotStatus::State::Current);
}

TEST_F(CachedSnapshot, ContinuesAfterChangesInTheMeantime) {
  const std::string file = Leave();
  merged_->AddFile(folder_, "2.jpg", 2, A);
  Start();
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  EXPECT_TRUE(Update());
  EXPECT_EQ(snapshot_->File(), file);
  EXPECT_THAT(Names(), ElementsAre("2.jpg", "1.jpg"));
}

TEST_F(CachedSnapshot, TheVersionGrowsOverRestarts) {
  Start();
  Update();
  const std::int64_t version = reader_->Version();
  Stop();
  fs::remove_all(CACHE);
  Start();
  Update();
  EXPECT_GT(reader_->Version(), version);
}

TEST_F(CachedSnapshot, ASecondProcessIsRefused) {
  Start();
  EXPECT_EQ(Refusal(CACHE), "cannot use the cache directory /tmp/cache: another process uses it");
}

TEST_F(CachedSnapshot, ADirectoryThatCannotBeUsedIsAnError) {
  EXPECT_EQ(Refusal("/tmp/missing/cache"),
            "cannot use the cache directory /tmp/missing/cache: No such file or directory");
  EXPECT_EQ(Refusal("/dev/null"), "cannot use the cache directory /dev/null: Not a directory");
  MakeCache();
  fs::create_symlink("/tmp/elsewhere", CACHE + "/lock");
  EXPECT_THROW(web::Snapshot(CACHE, FindPath()), std::runtime_error);
  EXPECT_FALSE(fs::exists("/tmp/elsewhere"));
}

TEST_F(CachedSnapshot, LeavesOtherFilesAlone) {
  MakeCache();
  fs::create_directories(CACHE + "/snapshot-2025-01-01/photos");
  fs::create_directories(CACHE + "/snapshot-1.db");
  std::ofstream(CACHE + "/text") << "text";
  fs::create_symlink("text", CACHE + "/snapshot-2.db");
  fs::create_symlink("missing", CACHE + "/snapshot-3.db-wal");
  const std::vector<std::string> others{
      "letter.txt",          "snapshot-",          "snapshot-.db",      "snapshot-notes.txt",
      "snapshot-04.db",      "snapshot-5.db.old",  "snapshot-6.db-bak", "snapshot-7.db-walrus",
      "my-snapshot-8.db",    "snapshot-9",         "snapshot--1.db",    "snapshot-10.db-",
      "snapshot-11.db-wal2", "snapshot-2025.jpeg", "snapshot-12.DB"};
  for (const std::string& name : others) {
    std::ofstream(CACHE + '/' + name) << "text";
  }
  Leave();
  Start();
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
  Stop();
  EXPECT_THAT(Files(), ::testing::IsSupersetOf(others));
  EXPECT_TRUE(fs::is_directory(CACHE + "/snapshot-2025-01-01/photos"));
  EXPECT_TRUE(fs::is_directory(CACHE + "/snapshot-1.db"));
  EXPECT_TRUE(fs::is_symlink(CACHE + "/snapshot-2.db"));
  EXPECT_TRUE(fs::is_symlink(CACHE + "/snapshot-3.db-wal"));
  EXPECT_EQ(fs::file_size(CACHE + "/text"), 4U);
}

TEST_F(CachedSnapshot, WhatIsNoSnapshotIsRemoved) {
  MakeCache();
  std::ofstream(CACHE + "/snapshot-4.db") << std::string(100'000, 'x');
  std::ofstream(CACHE + "/snapshot-5.db") << "";
  std::ofstream(CACHE + "/snapshot-8.db-wal") << "wal";
  std::ofstream(CACHE + "/snapshot-8.db-shm") << "shm";
  std::ofstream(CACHE + "/snapshot-10.db-journal") << "journal";
  fs::copy_file(MERGED, CACHE + "/snapshot-9.db");
  ExpectRebuilt();
  Stop();
  EXPECT_EQ(Files().size(), 2U); // the lock and the snapshot
}

TEST_F(CachedSnapshot, OneOfAnotherVersionIsReplaced) {
  SQLite::Database(Leave(), SQLite::OPEN_READWRITE).exec("PRAGMA user_version = 77");
  ExpectRebuilt();
}

TEST_F(CachedSnapshot, OneOfAnotherStartOfTheSystemIsReplaced) {
  SQLite::Database(Leave(), SQLite::OPEN_READWRITE).exec("UPDATE State SET boot = 'other'");
  ExpectRebuilt();
}

TEST_F(CachedSnapshot, AnIncompleteOneIsReplaced) {
  SQLite::Database(Leave(), SQLite::OPEN_READWRITE).exec("UPDATE State SET isComplete = 0");
  ExpectRebuilt();
}

TEST_F(CachedSnapshot, ATruncatedOneIsReplaced) {
  const std::string file = Leave();
  fs::resize_file(file, 4096);
  Start();
  Update();
  try {
    Names();
  } catch (const std::exception&) {
  }
  Update();
  EXPECT_THAT(Names(), ElementsAre("1.jpg"));
}

TEST_F(CachedSnapshot, ADamagedPageIsNoticedByReadersAndReplaced) {
  merged_->Run("BEGIN");
  for (int i = 0; i < 2'000; ++i) {
    merged_->AddFile(folder_, "Photo_" + std::to_string(i) + ".jpg", i, A);
  }
  merged_->Run("COMMIT");
  const std::string file = Leave();
  const auto size = fs::file_size(file);
  for (std::uintmax_t page = 2; page < size / 4096; ++page) {
    std::fstream bytes(file, std::ios::in | std::ios::out | std::ios::binary);
    bytes.seekp(static_cast<std::streamoff>(page * 4096));
    bytes << std::string(4096, '\xA5');
  }
  Start();
  for (int i = 0; i < 5; ++i) {
    Update();
    try {
      ReadAll(*snapshot_);
      Names(WithWords("photo"));
    } catch (const std::exception&) {
    }
  }
  EXPECT_EQ(snapshot_->Status().state, web::SnapshotStatus::State::Current);
  EXPECT_EQ(ReadAll(*snapshot_), ReadAll(*BuildAnother()));
  EXPECT_EQ(Names(WithWords("photo 1999")).size(), 1U);
}

TEST_F(CachedSnapshot, ReadersOfTheFormerFileContinueWithTheNewOne) {
  Start();
  Update();
  web::SnapshotReader former(*snapshot_);
  EXPECT_EQ(former.Photos({}, std::nullopt, 10).size(), 1U);
  path_ = "/tmp/other/zophotos.db";
  MergedFile other(path_);
  Update();
  EXPECT_THAT(former.Photos({}, std::nullopt, 10), IsEmpty());
}

/// Readers in threads see states that agree in themselves while the snapshot changes and is
/// replaced.
TEST_F(CachedSnapshot, ReadersInThreadsSeeConsistentStates) {
  Start();
  Update();
  std::atomic<int> reads = 0;
  std::vector<std::jthread> threads;
  threads.reserve(3);
  for (int i = 0; i < 3; ++i) {
    threads.emplace_back([&](const std::stop_token& stop) {
      web::SnapshotReader reader(*snapshot_);
      std::int64_t version = 0;
      while (!stop.stop_requested()) {
        const std::size_t searched = reader.Photos(WithWords("jpg"), std::nullopt, 1000).size();
        EXPECT_TRUE(searched == 1 || searched % 10 == 0) << searched;
        const std::int64_t next = reader.Version();
        EXPECT_GE(next, version);
        version = next;
        ++reads;
      }
    });
  }
  for (int round = 0; round < 30; ++round) {
    merged_->Run("BEGIN");
    merged_->Run("DELETE FROM Files");
    for (int i = 0; i < 10 * (round % 5); ++i) {
      merged_->AddFile(folder_, std::to_string(i) + ".jpg", i, A);
    }
    merged_->Run("COMMIT");
    if (round % 7 == 6) {
      fs::copy_file(MERGED, "/tmp/merged/copy");
      merged_.reset();
      fs::rename("/tmp/merged/copy", MERGED);
      merged_.emplace(MERGED);
    }
    Update();
    for (const int before = reads; reads < before + 5;) {
      std::this_thread::yield();
    }
  }
}

/// Kills a process that builds or updates the snapshot after `microseconds`. Returns whether it was
/// still at work.
bool KillAfter(long microseconds, const std::function<void()>& work) {
  const pid_t child = fork();
  if (child == 0) {
    timer_t timer{};
    sigevent event{};
    event.sigev_notify = SIGEV_SIGNAL;
    event.sigev_signo = SIGKILL;
    const itimerspec after{.it_interval = {},
                           .it_value = {.tv_sec = microseconds / 1'000'000,
                                        .tv_nsec = microseconds % 1'000'000 * 1000}};
    if (timer_create(CLOCK_MONOTONIC, &event, &timer) == 0 &&
        timer_settime(timer, 0, &after, nullptr) == 0) {
      work();
    }
    _exit(0);
  }
  int status = 0;
  waitpid(child, &status, 0);
  return WIFSIGNALED(status);
}

TEST_F(CachedSnapshot, IsCompleteAfterAKillAtAnyInstantOfTheBuild) {
  merged_->Run("BEGIN");
  for (int i = 0; i < 3'000; ++i) {
    merged_->AddFile(folder_, "Photo_" + std::to_string(i) + ".jpg", i, A);
  }
  merged_->Run("COMMIT");
  const Shown expected = ReadAll(*BuildAnother());
  long delay = 100;
  for (bool isKilled = true; isKilled; delay += delay / 4) {
    isKilled = KillAfter(delay, [this] { web::Snapshot(CACHE, FindPath()).Update(); });
    Start();
    EXPECT_THAT(Names().size(), ::testing::AnyOf(0U, 1000U));
    Update();
    ASSERT_EQ(ReadAll(*snapshot_), expected) << delay;
    Stop();
    fs::remove_all(CACHE);
  }
}

TEST_F(CachedSnapshot, ContinuesAfterAKillAtAnyInstantOfAnUpdate) {
  Leave();
  long delay = 100;
  int number = 0;
  for (bool isKilled = true; isKilled; delay += delay / 4) {
    merged_->Run("BEGIN");
    merged_->Run("DELETE FROM Files WHERE file_id % 3 = 0");
    for (int i = 0; i < 300; ++i) {
      ++number;
      merged_->AddFile(folder_, "Photo_" + std::to_string(number) + ".jpg", number, A);
    }
    merged_->Run("COMMIT");
    isKilled = KillAfter(delay, [this] { web::Snapshot(CACHE, FindPath()).Update(); });
    Start();
    Update();
    ASSERT_EQ(ReadAll(*snapshot_), ReadAll(*BuildAnother())) << delay;
    Stop();
  }
}

} // namespace
} // namespace orva::test

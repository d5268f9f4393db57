#include "FaultVfs.h"

#include "Database.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <memory>
#include <stdexcept>
#include <string>

namespace orva::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using Effect = FaultPlan::Effect;

class FaultVfsTest : public ::testing::Test {
protected:
  FaultVfsTest() {
    std::filesystem::remove("/tmp/test.db");
    Database(PATH, true).Run("CREATE TABLE t(a)");
  }

  static void Insert(const std::string& pragma = "PRAGMA synchronous = FULL") {
    const Database database(PATH);
    database.Run(pragma);
    database.Run("INSERT INTO t VALUES(1)");
  }

  static std::vector<std::string> Rows() { return Database(PATH).Run("SELECT a FROM t"); }

  /// Inserts a row in a process of its own, which ends at a request of the plan, or after all of
  /// them where the plan has none. Returns its exit status.
  static int InsertApart(const FaultPlan& plan,
                         const std::string& pragma = "PRAGMA synchronous = FULL") {
    const pid_t child = fork();
    if (child == 0) {
      const FaultVfs faults(plan);
      Insert(pragma);
      if (plan.nth == 0) {
        faults.Crash();
      }
      _exit(0);
    }
    int status = 0;
    waitpid(child, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  /// A power loss at the first deletion.
  static FaultPlan LossOf(const std::string& files) {
    return {.files = PATH,
            .requests = {Request::Delete},
            .nth = 1,
            .effect = Effect::PowerLoss,
            .lost = files};
  }

  static constexpr const char* PATH = "/tmp/test.db";
  inline static const FaultPlan LOSS_OF_NAMES = {
      .files = PATH, .effect = Effect::PowerLoss, .losesNames = true};
};

TEST_F(FaultVfsTest, WithoutAnErrorItOnlyCounts) {
  const FaultVfs faults({.files = "test.db", .requests = {Request::Open, Request::Delete}});
  Insert();
  EXPECT_EQ(3, faults.Seen()); // the database and its journal, and the deletion of the journal
  EXPECT_EQ(0, faults.Failed());
}

TEST_F(FaultVfsTest, TheChosenRequestFailsOnce) {
  const FaultVfs faults(
      {.files = "test.db", .requests = {Request::Open}, .nth = 2, .code = SQLITE_CANTOPEN});
  EXPECT_THROW(Insert(), std::runtime_error);
  EXPECT_EQ(1, faults.Failed());
  EXPECT_NO_THROW(Insert());
  EXPECT_EQ(1, faults.Failed());
}

TEST_F(FaultVfsTest, AllFollowingRequestsFailPermanently) {
  {
    const FaultVfs faults({.files = "test.db",
                           .requests = {Request::Lock},
                           .nth = 1,
                           .code = SQLITE_BUSY,
                           .permanent = true});
    EXPECT_THROW(Insert(), std::runtime_error);
    EXPECT_THROW(Insert(), std::runtime_error);
    EXPECT_GE(faults.Failed(), 2);
  }
  EXPECT_NO_THROW(Insert());
}

TEST_F(FaultVfsTest, OtherFilesAreNotAffected) {
  const FaultVfs faults(
      {.files = "other.db", .requests = {Request::Open}, .nth = 1, .code = SQLITE_CANTOPEN});
  EXPECT_NO_THROW(Insert());
  EXPECT_EQ(0, faults.Seen());
}

TEST_F(FaultVfsTest, AWriteThatCrashesWritesItsFirstHalf) {
  const std::string journal = std::string(PATH) + "-journal";
  EXPECT_EQ(
      FaultVfs::CRASHED,
      InsertApart(
          {.files = journal, .requests = {Request::Write}, .nth = 1, .effect = Effect::Crash}));
  EXPECT_NE(0U, std::filesystem::file_size(journal));
}

// When a transaction deletes its journal at its end, everything is written and synced.

TEST_F(FaultVfsTest, APowerLossKeepsWhatWasSynced) {
  EXPECT_EQ(FaultVfs::CRASHED, InsertApart(LossOf("-journal")));
  EXPECT_THAT(Rows(), IsEmpty()); // rolled back by the journal
}

TEST_F(FaultVfsTest, APowerLossLosesWhatWasNotSynced) {
  EXPECT_EQ(FaultVfs::CRASHED, InsertApart(LossOf("-journal"), "PRAGMA synchronous = OFF"));
  EXPECT_THAT(Rows(), ElementsAre("1")); // without a journal
}

// After its last request the journal is deleted, and the directory was synced at most when the
// journal was created.

TEST_F(FaultVfsTest, APowerLossUndoesADeletionWhoseDirectoryWasNotSynced) {
  EXPECT_EQ(FaultVfs::CRASHED, InsertApart(LOSS_OF_NAMES));
  EXPECT_THAT(Rows(), IsEmpty()); // rolled back by the journal
}

TEST_F(FaultVfsTest, APowerLossKeepsADeletionWhoseDirectoryWasSynced) {
  EXPECT_EQ(FaultVfs::CRASHED, InsertApart(LOSS_OF_NAMES, "PRAGMA synchronous = EXTRA"));
  EXPECT_THAT(Rows(), ElementsAre("1"));
}

TEST_F(FaultVfsTest, APowerLossUndoesACreationWhoseDirectoryWasNotSynced) {
  for (const bool losesNames : {false, true}) {
    const std::string journal = std::string(PATH) + "-journal";
    std::filesystem::remove(journal);
    FaultPlan plan = LOSS_OF_NAMES;
    plan.losesNames = losesNames;
    plan.requests = {Request::Sync};
    plan.nth = 1; // that of the journal, whose first one includes the directory
    EXPECT_EQ(FaultVfs::CRASHED, InsertApart(plan));
    EXPECT_EQ(!losesNames, std::filesystem::exists(journal));
  }
}

} // namespace
} // namespace orva::test

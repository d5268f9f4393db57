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

  /// Inserts a row in a process of its own, which ends at a request of a kind, or behind all of
  /// them where the plan names none. Returns its exit status.
  static int InsertApart(const FaultPlan& plan,
                         const std::string& pragma = "PRAGMA synchronous = FULL") {
    const pid_t child = fork();
    if (child == 0) {
      const FaultVfs faults(plan);
      Insert(pragma);
      if (plan.nth == 0) {
        faults.Stop();
      }
      _exit(0);
    }
    int status = 0;
    waitpid(child, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  /// A loss of power at the first deletion.
  static FaultPlan LossOf(const std::string& files) {
    return {.files = PATH,
            .requests = {Request::Delete},
            .nth = 1,
            .effect = Effect::PowerLoss,
            .lost = files};
  }

  static constexpr const char* PATH = "/tmp/test.db";
  inline static const FaultPlan LOSS_OF_NAMES = {
      .files = PATH, .effect = Effect::PowerLoss, .takesNames = true};
};

TEST_F(FaultVfsTest, WithoutAnErrorItOnlyCounts) {
  const FaultVfs faults({.files = "test.db", .requests = {Request::Open, Request::Delete}});
  Insert();
  EXPECT_EQ(3, faults.Seen()); // the database and its journal, which goes at the end
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

TEST_F(FaultVfsTest, TheRequestsThatFollowFailForGood) {
  {
    const FaultVfs faults({.files = "test.db",
                           .requests = {Request::Lock},
                           .nth = 1,
                           .code = SQLITE_BUSY,
                           .forGood = true});
    EXPECT_THROW(Insert(), std::runtime_error);
    EXPECT_THROW(Insert(), std::runtime_error);
    EXPECT_GE(faults.Failed(), 2);
  }
  EXPECT_NO_THROW(Insert());
}

TEST_F(FaultVfsTest, OtherFilesAreLeftAlone) {
  const FaultVfs faults(
      {.files = "other.db", .requests = {Request::Open}, .nth = 1, .code = SQLITE_CANTOPEN});
  EXPECT_NO_THROW(Insert());
  EXPECT_EQ(0, faults.Seen());
}

TEST_F(FaultVfsTest, AWriteThatIsStoppedLeavesItsFirstHalf) {
  const std::string journal = std::string(PATH) + "-journal";
  EXPECT_EQ(
      FaultVfs::STOPPED,
      InsertApart(
          {.files = journal, .requests = {Request::Write}, .nth = 1, .effect = Effect::Stop}));
  EXPECT_NE(0U, std::filesystem::file_size(journal));
}

// Where a transaction ends, with the deletion of its journal, all is written and synced.

TEST_F(FaultVfsTest, APowerLossSparesWhatWasSynced) {
  EXPECT_EQ(FaultVfs::STOPPED, InsertApart(LossOf("-journal")));
  EXPECT_THAT(Rows(), IsEmpty()); // by the journal
}

TEST_F(FaultVfsTest, APowerLossTakesWhatWasNotSynced) {
  EXPECT_EQ(FaultVfs::STOPPED, InsertApart(LossOf("-journal"), "PRAGMA synchronous = OFF"));
  EXPECT_THAT(Rows(), ElementsAre("1")); // no journal that says otherwise
}

// Where it ends behind its last request, the journal is deleted, and the directory synced at the
// most when the journal was made.

TEST_F(FaultVfsTest, APowerLossTakesADeletionWhoseDirectoryWasNotSynced) {
  EXPECT_EQ(FaultVfs::STOPPED, InsertApart(LOSS_OF_NAMES));
  EXPECT_THAT(Rows(), IsEmpty()); // by the journal
}

TEST_F(FaultVfsTest, APowerLossSparesADeletionWhoseDirectoryWasSynced) {
  EXPECT_EQ(FaultVfs::STOPPED, InsertApart(LOSS_OF_NAMES, "PRAGMA synchronous = EXTRA"));
  EXPECT_THAT(Rows(), ElementsAre("1"));
}

TEST_F(FaultVfsTest, APowerLossTakesACreationWhoseDirectoryWasNotSynced) {
  for (const bool takesNames : {false, true}) {
    const std::string journal = std::string(PATH) + "-journal";
    std::filesystem::remove(journal);
    FaultPlan plan = LOSS_OF_NAMES;
    plan.takesNames = takesNames;
    plan.requests = {Request::Sync};
    plan.nth = 1; // the journal's, whose first also is the directory's
    EXPECT_EQ(FaultVfs::STOPPED, InsertApart(plan));
    EXPECT_EQ(!takesNames, std::filesystem::exists(journal));
  }
}

} // namespace
} // namespace orva::test

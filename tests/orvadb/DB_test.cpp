#include "TestDB.h"

#include "system/Database.h"

#include "orvadb/DB.h"
#include "orvadb/Statement.h"

#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <type_traits>

namespace orva::db {
namespace {

namespace fs = std::filesystem;
using test::Database;
using test::TestDB;
using test::Thrown;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

static_assert(std::has_virtual_destructor_v<DB>);
static_assert(!std::is_copy_constructible_v<DB>);

/// A folder for databases.
class DBTest : public testing::Test {
protected:
  DBTest() {
    fs::remove_all("/tmp/db");
    fs::create_directory("/tmp/db");
  }

  const std::string path = "/tmp/db/test.db";
};

TEST_F(DBTest, ANewObjectIsClosed) {
  const TestDB db;
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_EQ(db.GetPath(), "");
}

TEST_F(DBTest, TheBaseHasNoPrefixAndPublishesNothing) {
  const TestDB db(path);
  EXPECT_EQ(db.GetPrefix(), "");
  db.UpdateStatus("key", "value");
  EXPECT_THAT(db.Rows("SELECT name FROM sqlite_master"), IsEmpty());
}

TEST_F(DBTest, OpenCreatesAnEmptyDatabaseAndRemembersItsPath) {
  const TestDB db(path);
  EXPECT_EQ(db.GetPath(), path);
  EXPECT_TRUE(fs::is_regular_file(path));
  Statement(db, "CREATE TABLE t(a)").Execute();
  EXPECT_THAT(Database(path).Run("SELECT name FROM sqlite_master"), ElementsAre("t"));
}

TEST_F(DBTest, OpenKeepsAnExistingDatabase) {
  Database(path, true).exec("CREATE TABLE t(a); INSERT INTO t VALUES('kept')");
  EXPECT_THAT(TestDB(path).Rows("SELECT a FROM t"), ElementsAre("kept"));
}

TEST_F(DBTest, NamesThatLookLikeUrisArePlainFiles) {
  for (const std::string name : {"a?mode=ro", "a#b", "a%41", "file:x", ":memory:", "\xff"}) {
    TestDB db("/tmp/db/" + name);
    db.Rows("CREATE TABLE t(a)");
    EXPECT_TRUE(fs::is_regular_file("/tmp/db/" + name)) << name;
  }
}

TEST_F(DBTest, OpenOnAnOpenObjectGivesAFreshConnectionOnTheNewFile) {
  TestDB db(path);
  db.Rows("CREATE TABLE t(a)");
  Statement(db, "INSERT INTO t VALUES(1)").Execute();
  fs::remove(path);
  db.Open(path);
  EXPECT_THAT(db.Rows("SELECT name FROM sqlite_master"), IsEmpty());
  EXPECT_THAT(db.Compiled(), IsEmpty());
  EXPECT_TRUE(fs::exists(path));
  EXPECT_THROW(Statement(db, "INSERT INTO t VALUES(1)"), std::string);
}

TEST_F(DBTest, OpenOnAnOpenObjectMayChangeTheFile) {
  TestDB db(path);
  db.Rows("CREATE TABLE first(a)");
  db.Open("/tmp/db/other.db");
  EXPECT_EQ(db.GetPath(), "/tmp/db/other.db");
  EXPECT_THAT(db.Rows("SELECT name FROM sqlite_master"), IsEmpty());
}

TEST_F(DBTest, OpenAcceptsItsOwnPath) {
  TestDB db(path);
  db.Rows("CREATE TABLE t(a)");
  db.Open(db.GetPath());
  EXPECT_EQ(db.GetPath(), path);
  EXPECT_THAT(db.Rows("SELECT name FROM sqlite_master"), ElementsAre("t"));
}

TEST_F(DBTest, CloseEndsTheConnectionAndMayBeRepeated) {
  TestDB db;
  db.Close();
  db.Open(path);
  Statement(db, "CREATE TABLE t(a)").Execute();
  db.Close();
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_EQ(db.GetPath(), "");
  db.Close();
  db.Open(path);
  EXPECT_THAT(db.Rows("SELECT name FROM sqlite_master"), ElementsAre("t"));
}

/// Descriptors of this process on the files below /tmp/db.
int OpenFiles() {
  int count = 0;
  for (const auto& entry : fs::directory_iterator("/proc/self/fd")) {
    std::error_code gone; // the iterator's own
    count += fs::read_symlink(entry, gone).string().starts_with("/tmp/db/") ? 1 : 0;
  }
  return count;
}

TEST_F(DBTest, OpenAndDestructionCloseEveryFile) {
  {
    TestDB db(path);
    db.Rows("CREATE TABLE t(a)");
    Statement(db, "SELECT a FROM t").Step();
    EXPECT_GT(OpenFiles(), 0);
    db.Open("/tmp/db/other.db");
  }
  EXPECT_EQ(OpenFiles(), 0);
}

TEST_F(DBTest, AFailedOpenLeavesTheObjectClosed) {
  TestDB db(path);
  EXPECT_THROW(db.Open("/tmp/db/none/test.db"), std::string);
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_EQ(db.GetPath(), "");
  EXPECT_THAT(Thrown([&] { Statement(db, "SELECT 1", "Caller.cpp", 12); }),
              AllOf(StartsWith("Caller.cpp:12: "), HasSubstr("SELECT 1")));
  db.Open(path);
  EXPECT_THAT(db.Rows("SELECT 1"), ElementsAre("1"));
}

TEST_F(DBTest, TheMessageOfAFailedOpenNamesTheFileAndTheReason) {
  EXPECT_THAT(Thrown([] { TestDB("/tmp/db/none/test.db"); }),
              AllOf(HasSubstr("unable to open database file"),
                    HasSubstr("extended code " + std::to_string(SQLITE_CANTOPEN)),
                    HasSubstr("/tmp/db/none/test.db")));
}

TEST_F(DBTest, OpenFollowsNoLinkToAFile) {
  Database(path, true).exec("CREATE TABLE t(a)");
  fs::create_symlink(path, "/tmp/db/link.db");
  EXPECT_THROW(TestDB("/tmp/db/link.db"), std::string);
}

TEST_F(DBTest, OpenCreatesNothingThroughADanglingLink) {
  fs::create_symlink("/tmp/db/target.db", "/tmp/db/link.db");
  EXPECT_THROW(TestDB("/tmp/db/link.db"), std::string);
  EXPECT_FALSE(fs::exists("/tmp/db/target.db"));
}

TEST_F(DBTest, OpenFollowsNoLinkToAFolder) {
  fs::create_directory("/tmp/db/folder");
  fs::create_symlink("/tmp/db/folder", "/tmp/db/link");
  EXPECT_THROW(TestDB("/tmp/db/link/test.db"), std::string);
  EXPECT_TRUE(fs::is_empty("/tmp/db/folder"));
}

TEST_F(DBTest, OpenRefusesSpecialFilesWithoutWaiting) {
  ASSERT_EQ(mkfifo("/tmp/db/fifo", 0666), 0);
  EXPECT_THAT(Thrown([] { TestDB("/tmp/db/fifo"); }), HasSubstr("'/tmp/db/fifo'"));
  EXPECT_THROW(TestDB("/tmp/db"), std::string);
  EXPECT_THROW(TestDB("/dev/null"), std::string);
}

TEST_F(DBTest, OpenRefusesAFileThatIsNotADatabase) {
  std::ofstream(path) << std::string(4096, 'x');
  EXPECT_THAT(Thrown([&] { const TestDB db(path); }),
              HasSubstr("file is not a database (extended code 26)"));
}

TEST_F(DBTest, KeepsTheDefaultJournalFullSynchronisationAndNoForeignKeys) {
  const TestDB db(path);
  EXPECT_THAT(db.Rows("PRAGMA journal_mode"), ElementsAre("delete"));
  EXPECT_THAT(db.Rows("PRAGMA synchronous"), ElementsAre("2"));
  EXPECT_THAT(db.Rows("PRAGMA foreign_keys"), ElementsAre("0"));
}

TEST_F(DBTest, AConnectionWaitsASecondForLocks) {
  EXPECT_THAT(TestDB(path).Rows("PRAGMA busy_timeout"), ElementsAre("1000"));
}

TEST_F(DBTest, AReadOnlyConnectionNeverCreatesAndNeverWrites) {
  TestDB db;
  EXPECT_THROW(db.Open(path, TestDB::Access::ReadOnly, 7, false), std::string);
  EXPECT_FALSE(fs::exists(path));

  Database(path, true).exec("CREATE TABLE t(a)");
  db.Open(path, TestDB::Access::ReadOnly, 7, false);
  EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("7"));
  EXPECT_THAT(Thrown([&] { Statement(db, "INSERT INTO t VALUES(1)").Execute(); }),
              HasSubstr("attempt to write a readonly database"));
}

} // namespace
} // namespace orva::db

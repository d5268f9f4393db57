#include "TestDB.h"

#include "system/Database.h"

#include "orvadb/DB.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include "orvautil/FileDescriptor.h"

#include "support/OtherUsers.h"
#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <vector>

namespace orva::db {
namespace {

namespace fs = std::filesystem;
using test::Database;
using test::TestDB;
using test::Thrown;
using testing::ElementsAre;
using testing::HasSubstr;

/// The failure of `action`; empty when it succeeds.
std::string Failure(const std::function<void()>& action) {
  try {
    action();
  } catch (const std::string& failure) {
    return failure;
  }
  return {};
}

/// A database that an untrusted program has made.
class UntrustedDatabaseTest : public testing::Test {
protected:
  UntrustedDatabaseTest() {
    fs::remove_all("/tmp/db");
    fs::create_directory("/tmp/db");
    Database(path, true).exec("CREATE TABLE t(a, b)");
  }

  void Make(const std::string& sql) const { Database(path).exec(sql); }

  /// The failure of a statement on it; empty when there is none.
  std::string FailureOf(const std::string& sql) const {
    return Failure([&] {
      const TestDB db(path);
      Statement(db, sql.c_str()).Execute();
    });
  }

  /// Why the table is refused; empty when it is accepted.
  std::string Refusal(bool writable = true) const {
    TestDB db;
    db.Open(path, writable ? TestDB::Access::ReadWrite : TestDB::Access::ReadOnly, 7, false);
    return Failure([&] { db.RejectComputedColumns("t"); });
  }

  const std::string path = "/tmp/db/test.db";
};

TEST_F(UntrustedDatabaseTest, TriggersDoNotRun) {
  Make(
      "CREATE TRIGGER more AFTER INSERT ON t BEGIN INSERT INTO t VALUES('by the trigger', 0); END");
  EXPECT_EQ(FailureOf("INSERT INTO t VALUES(1, 2)"), "");
  EXPECT_THAT(Database(path).Run("SELECT a FROM t"), ElementsAre("1"));
}

TEST_F(UntrustedDatabaseTest, ViewsAreNotRead) {
  Make("CREATE VIEW v AS SELECT a FROM t");
  EXPECT_THAT(FailureOf("SELECT * FROM v"), HasSubstr("access to view \"v\" prohibited"));
}

TEST_F(UntrustedDatabaseTest, VirtualTablesAreNotRead) {
  Make("CREATE VIRTUAL TABLE v USING fts5(a)");
  EXPECT_NE(FailureOf("SELECT * FROM v"), "");
}

TEST_F(UntrustedDatabaseTest, ChecksAreNotEvaluated) {
  Make("CREATE TABLE checked(a CHECK(a = 'never'))");
  EXPECT_EQ(FailureOf("INSERT INTO checked VALUES(1)"), "");
}

TEST_F(UntrustedDatabaseTest, VeryLongValuesAreNotRead) {
  Make("INSERT INTO t VALUES(1, zeroblob(16777216)), (2, zeroblob(17000000))");
  EXPECT_THAT(FailureOf("SELECT a, b FROM t"), HasSubstr("string or blob too big"));
}

TEST_F(UntrustedDatabaseTest, EndlessStatementIsInterrupted) {
  EXPECT_THAT(FailureOf("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) "
                        "SELECT count(*) FROM n"),
              HasSubstr("more work than a database of this size can need (extended code 9)"));
}

TEST_F(UntrustedDatabaseTest, ReadingPagesCountsAsWork) {
  Make("INSERT INTO t VALUES(zeroblob(100000), 0)");
  const std::string count = "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE "
                            "i < 100000) SELECT count(*) FROM n, t WHERE ";
  EXPECT_EQ(FailureOf(count + "b < i"), "");
  EXPECT_THAT(FailureOf(count + "a < i"), HasSubstr("more work than"));
}

/// Takes some ten million steps of a table of three thousand rows.
const std::string EXPENSIVE = "SELECT count(*) FROM t x, t y WHERE +x.a = +y.b";

/// Fills the table for EXPENSIVE.
const std::string THREE_THOUSAND = "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n "
                                   "WHERE i < 3000) INSERT INTO t SELECT i, -i FROM n";

/// Makes the file large, without making EXPENSIVE read more.
const std::string TEN_MEGABYTES =
    "CREATE TABLE large(a); INSERT INTO large VALUES(zeroblob(10000000))";

TEST_F(UntrustedDatabaseTest, ContentThatWasReadAllowsMoreWork) {
  Make(THREE_THOUSAND);
  Make(TEN_MEGABYTES);
  const TestDB db(path);
  const auto count = [&] { Statement(db, EXPENSIVE.c_str()).Execute(); };
  EXPECT_THAT(Failure(count), HasSubstr("more work than"));
  Statement(db, "SELECT a FROM large").Execute();
  EXPECT_EQ(Failure(count), "");
}

TEST_F(UntrustedDatabaseTest, ContentThatWasReadTwiceCountsOnce) {
  Make(THREE_THOUSAND);
  Make("CREATE TABLE large(a); INSERT INTO large VALUES(zeroblob(3000000))");
  const TestDB db(path);
  db.Rows("PRAGMA cache_size = 10");
  for (int i = 0; i < 10; ++i) {
    Statement(db, "SELECT a FROM large").Execute();
  }
  EXPECT_GE(db.BytesRead(), 3'000'000);
  EXPECT_LE(db.BytesRead(), static_cast<long long>(fs::file_size(path)));
}

TEST_F(UntrustedDatabaseTest, HolesAreNotContentThatWasRead) {
  Make(THREE_THOUSAND);
  const auto size = static_cast<long long>(fs::file_size(path));
  fs::resize_file(path, 1LL << 40);
  const TestDB db(path);
  EXPECT_THAT(Failure([&] { Statement(db, EXPENSIVE.c_str()).Execute(); }),
              HasSubstr("more work than"));
  EXPECT_LE(db.BytesRead(), size);
}

TEST_F(UntrustedDatabaseTest, ContentThatIsReadAgainAndAgainInASparseFileDoesNotAllowMoreWork) {
  Make("CREATE TABLE large(a); INSERT INTO large VALUES(zeroblob(14000000))");
  fs::resize_file(path, 1LL << 40);
  EXPECT_THAT(FailureOf("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) "
                        "SELECT count(*) FROM n, large WHERE a < i"),
              HasSubstr("more work than"));
}

TEST_F(UntrustedDatabaseTest, ContentOfTheLogCountsAsRead) {
  Database writer(path);
  writer.exec("PRAGMA journal_mode = WAL");
  writer.exec(THREE_THOUSAND);
  const TestDB db(path);
  Statement(db, "SELECT a FROM t").Execute();
  EXPECT_GT(db.BytesRead(), 4 * 4096);
}

TEST_F(UntrustedDatabaseTest, RowsThatTheConnectionHasChangedMayTakeMoreWork) {
  const TestDB db(path);
  db.Rows("BEGIN");
  db.Rows(THREE_THOUSAND);
  for (int i = 0; i < 10; ++i) {
    db.Rows("UPDATE t SET a = a + 1");
  }
  EXPECT_NO_THROW(Statement(db, EXPENSIVE.c_str()).Execute());
}

TEST_F(UntrustedDatabaseTest, EachStatementHasItsOwnLimit) {
  const TestDB db(path);
  for (int i = 0; i < 20; ++i) {
    Statement(db,
              "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 100000) "
              "SELECT count(*) FROM n")
        .Execute();
  }
}

TEST_F(UntrustedDatabaseTest, StoredValuesAreAccepted) {
  Make("CREATE INDEX plain ON t(a, b)");
  int column = 0;
  for (const char* const value : {"0", "-1.5", "'plain text'", "NULL"}) {
    Make("ALTER TABLE t ADD COLUMN c" + std::to_string(column++) + " DEFAULT " + value);
  }
  EXPECT_EQ(Refusal(), "");
  Make("DROP TABLE t");
  EXPECT_EQ(Refusal(), "") << "a missing table has no computed columns";
}

TEST_F(UntrustedDatabaseTest, GeneratedColumnsAreRefused) {
  Make("DROP TABLE t; CREATE TABLE t(a, b AS (a || a))");
  EXPECT_THAT(Refusal(), HasSubstr("generated column in table t of '/tmp/db/test.db'"));
  EXPECT_THAT(Refusal(false), HasSubstr("generated column"));
  Make("DROP TABLE t; CREATE TABLE t(a, b AS (a || a) STORED)");
  EXPECT_THAT(Refusal(), HasSubstr("generated column"));
}

TEST_F(UntrustedDatabaseTest, ComputedDefaultsAndIndexesAreRefusedOnlyForWriting) {
  for (const char* const sql :
       {"ALTER TABLE t ADD COLUMN c DEFAULT ('a' || 'b')", "CREATE INDEX i ON t(a || b)",
        "CREATE INDEX i ON t(a) WHERE b LIKE '%'",
        "CREATE INDEX \"it's \"\"quoted\"\"\" ON t(abs(a))"}) {
    Make("DROP TABLE t; CREATE TABLE t(a, b)");
    Make(sql);
    EXPECT_NE(Refusal(), "") << sql;
    EXPECT_EQ(Refusal(false), "") << sql;
  }
}

TEST_F(UntrustedDatabaseTest, TooManyIndexesAreRefused) {
  for (int i = 0; i < 33; ++i) {
    EXPECT_EQ(Refusal(), "") << i;
    Make("CREATE INDEX i" + std::to_string(i) + " ON t(a)");
  }
  EXPECT_THAT(Refusal(), HasSubstr("too many indexes"));
}

/// A number as journals have it.
std::string BigEndian(std::uint32_t number) {
  std::string bytes;
  for (int shift = 24; shift >= 0; shift -= 8) {
    bytes.push_back(static_cast<char>(number >> static_cast<unsigned>(shift)));
  }
  return bytes;
}

/// A journal that names a super-journal, which SQLite reads before it rolls back and deletes after.
std::string JournalNaming(const std::string& super) {
  std::uint32_t checksum = 0;
  for (const char byte : super) {
    checksum += static_cast<std::uint32_t>(byte);
  }
  return std::string(512, 'x') + BigEndian(1) + super +
         BigEndian(static_cast<std::uint32_t>(super.size())) + BigEndian(checksum) +
         "\xd9\xd5\x05\xf9\x20\xa1\x63\xd7";
}

TEST_F(UntrustedDatabaseTest, JournalThatNamesAnotherFileIsNotRolledBack) {
  const std::string journal = JournalNaming("/tmp/db/victim");
  for (const bool exists : {true, false}) {
    std::ofstream(path + "-journal") << journal;
    if (exists) {
      std::ofstream("/tmp/db/victim") << "/tmp/db/another-journal";
    }
    EXPECT_THAT(FailureOf("SELECT a FROM t"),
                HasSubstr("'/tmp/db/test.db-journal' names another file"));
    EXPECT_EQ(fs::exists("/tmp/db/victim"), exists);
    EXPECT_EQ(fs::file_size(path + "-journal"), journal.size());
    fs::remove("/tmp/db/victim");
  }
}

/// A file that SQLite opens, the database or one of its logs.
class SideFileTest : public UntrustedDatabaseTest, public testing::WithParamInterface<std::string> {
protected:
  SideFileTest() {
    if (GetParam() == "-wal" || GetParam() == "-shm") {
      Make("PRAGMA journal_mode = WAL");
    }
    fs::remove(Name());
  }

  std::string Name() const { return path + GetParam(); }

  /// Expects that the file is not used, for `reason`, and is still there.
  void ExpectRefused(const std::string& reason) const {
    EXPECT_THAT(FailureOf("INSERT INTO t VALUES(1, 2)"), HasSubstr("'" + Name() + "' " + reason));
    EXPECT_TRUE(fs::exists(fs::symlink_status(Name())));
  }
};

TEST_P(SideFileTest, LinkIsNotFollowed) {
  std::ofstream("/tmp/db/victim") << "precious";
  for (const std::string target : {"/tmp/db/victim", "/tmp/db/absent"}) {
    fs::create_symlink(target, Name());
    EXPECT_NE(FailureOf("INSERT INTO t VALUES(1, 2)"), "");
    EXPECT_EQ(fs::file_size("/tmp/db/victim"), 8U);
    EXPECT_FALSE(fs::exists("/tmp/db/absent"));
    fs::remove(Name());
  }
}

TEST_P(SideFileTest, FifoIsNotWaitedFor) {
  ASSERT_EQ(mkfifo(Name().c_str(), 0666), 0);
  ExpectRefused("is not a regular file");
}

TEST_P(SideFileTest, DirectoryIsRefused) {
  fs::create_directory(Name());
  ExpectRefused("is not a regular file");
}

TEST_P(SideFileTest, FileWithAnotherNameIsNotUsed) {
  std::ofstream("/tmp/db/victim") << "precious";
  fs::create_hard_link("/tmp/db/victim", Name());
  ExpectRefused("has another name");
}

class LogFileTest : public SideFileTest {};

TEST_P(LogFileTest, FileOfAnotherUserIsNotUsed) {
  std::ofstream(Name()) << "theirs";
  SKIP_WITHOUT_OTHER_USERS();
  ASSERT_EQ(chown(Name().c_str(), 1, 1), 0);
  ExpectRefused("belongs to another user");
  EXPECT_EQ(fs::file_size(Name()), 6U);
}

TEST_P(SideFileTest, MountIsNotUsed) {
  std::ofstream("/tmp/db/victim") << "precious";
  std::ofstream(Name()) << "x";
  ASSERT_EQ(mount("/tmp/db/victim", Name().c_str(), nullptr, MS_BIND, nullptr), 0);
  ExpectRefused("is a mount of its own");
  ASSERT_EQ(umount(Name().c_str()), 0);
  EXPECT_EQ(fs::file_size("/tmp/db/victim"), 8U);
}

std::string NameOf(const testing::TestParamInfo<std::string>& tested) {
  return tested.param.empty() ? "database" : tested.param.substr(1);
}

INSTANTIATE_TEST_SUITE_P(Names, SideFileTest, testing::Values("", "-journal", "-wal", "-shm"),
                         NameOf);
INSTANTIATE_TEST_SUITE_P(Names, LogFileTest, testing::Values("-journal", "-wal", "-shm"), NameOf);

TEST_F(UntrustedDatabaseTest, JournalThatNamesAnotherFileOfTheDatabaseDoesNotHaveItDeleted) {
  for (const char* const suffix : {"", "-wal", "-shm"}) {
    std::ofstream(path + "-journal") << JournalNaming(path + suffix);
    if (*suffix != '\0') {
      std::ofstream(path + suffix) << "precious";
    }
    FailureOf("SELECT a FROM t");
    EXPECT_TRUE(fs::exists(path + suffix)) << suffix;
    fs::remove(path + "-journal");
    fs::remove(path + "-wal");
    fs::remove(path + "-shm");
  }
}

TEST_F(UntrustedDatabaseTest, FileFoundAtTheNameOfALogKeepsItsOwnerAndMode) {
  std::ofstream(path + "-journal") << "private";
  fs::permissions(path + "-journal", fs::perms::owner_read);
  const util::FileDescriptor found(open((path + "-journal").c_str(), O_RDONLY));
  SKIP_WITHOUT_OTHER_USERS();
  ASSERT_EQ(chown(path.c_str(), 1, 1), 0);
  FailureOf("SELECT a FROM t");
  FailureOf("INSERT INTO t VALUES(1, 2)");
  struct stat status {};
  ASSERT_EQ(fstat(found.Get(), &status), 0);
  EXPECT_EQ(status.st_uid, geteuid());
  EXPECT_EQ(status.st_mode & 07777U, 0400U);
}

TEST_F(UntrustedDatabaseTest, FileWithAnotherNameIsRead) {
  fs::create_hard_link(path, "/tmp/db/snapshot");
  TestDB db;
  db.Open(path, TestDB::Access::ReadOnly, 7, false);
  EXPECT_NO_THROW(Statement(db, "SELECT a FROM t").Execute());
}

TEST_F(UntrustedDatabaseTest, DatabaseOfAnotherUserIsWrittenWithALogOfTheSameUser) {
  SKIP_WITHOUT_OTHER_USERS();
  ASSERT_EQ(chown(path.c_str(), 1, 1), 0);
  EXPECT_EQ(FailureOf("INSERT INTO t VALUES(1, 2)"), "");
  std::ofstream(path + "-journal") << "x";
  EXPECT_EQ(chown((path + "-journal").c_str(), 1, 1), 0);
  EXPECT_EQ(FailureOf("INSERT INTO t VALUES(1, 2)"), "");
  EXPECT_FALSE(fs::exists(path + "-journal"));
}

TEST_F(UntrustedDatabaseTest, LinkInTheDirectorysPlaceIsNotFollowed) {
  fs::rename("/tmp/db", "/tmp/elsewhere");
  fs::create_directory_symlink("/tmp/elsewhere", "/tmp/db");
  EXPECT_NE(Failure([&] { const TestDB db(path); }), "");
  fs::remove("/tmp/db");
  fs::remove_all("/tmp/elsewhere");
}

TEST_F(UntrustedDatabaseTest, DirectoryThatWasReplacedIsNotWritten) {
  const TestDB db(path);
  Statement(db, "SELECT a FROM t").Execute();
  fs::rename("/tmp/db", "/tmp/elsewhere");
  fs::create_directory("/tmp/db");
  EXPECT_NE(Failure([&] { Statement(db, "INSERT INTO t VALUES(1, 2)").Execute(); }), "");
  EXPECT_TRUE(fs::is_empty("/tmp/db"));
  fs::remove_all("/tmp/elsewhere");
}

TEST_F(UntrustedDatabaseTest, LeaseIsWaitedForWithinBounds) {
  const std::string journal = path + "-journal";
  const util::FileDescriptor holder(open(journal.c_str(), O_RDWR | O_CREAT, 0644));
  std::signal(SIGIO, SIG_IGN);
  ASSERT_EQ(fcntl(holder.Get(), F_SETLEASE, F_WRLCK), 0);
  write(holder.Get(), "x", 1);
  EXPECT_NE(FailureOf("INSERT INTO t VALUES(1, 2)"), "");
  EXPECT_EQ(fcntl(holder.Get(), F_SETLEASE, F_UNLCK), 0);
}

TEST_F(UntrustedDatabaseTest, OtherConnectionsOfTheProcessAreNotConcerned) {
  const TestDB db(path);
  fs::create_directory("/tmp/db/other");
  Database other("/tmp/db/other/test.db", true);
  other.exec("CREATE TABLE t(a); BEGIN; INSERT INTO t VALUES(1); COMMIT");
  EXPECT_FALSE(fs::exists("/tmp/db/other/test.db-journal"));
}

TEST_F(UntrustedDatabaseTest, AfterAFailureATransactionReadsNothingMore) {
  Make(THREE_THOUSAND);
  TestDB db;
  db.Open(path, TestDB::Access::ReadOnly, 7, false);
  Transaction transaction(db, 1000);
  const std::string endless =
      "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) SELECT count(*) FROM n";
  EXPECT_NE(Statement(db, endless.c_str()).Step(), Statement::ROW);
  EXPECT_NE(Statement(db, "SELECT a FROM t").Step(), Statement::ROW);
  EXPECT_THAT(Thrown([&] { transaction.Commit(); }), HasSubstr("more work than"));
}

/// Creation of a database.
class CreateTest : public testing::Test {
protected:
  CreateTest() {
    fs::remove_all("/tmp/db");
    fs::create_directory("/tmp/db");
  }

  void Create() {
    db.Create(path, [this] { db.Rows("CREATE TABLE t(a)"); });
  }

  static std::vector<std::string> Files() {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator("/tmp/db")) {
      names.push_back(entry.path().filename());
    }
    return names;
  }

  const std::string path = "/tmp/db/test.db";
  TestDB db;
};

TEST_F(CreateTest, LeavesTheCompleteDatabaseAndNothingElse) {
  Create();
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_THAT(Files(), ElementsAre("test.db"));
  EXPECT_THAT(TestDB(path).Rows("SELECT name FROM sqlite_master"), ElementsAre("t"));
}

TEST_F(CreateTest, ThePathIsFreeUntilTheDatabaseIsComplete) {
  db.Create(path, [this] {
    EXPECT_THAT(Files(), ElementsAre("test.db.new"));
    EXPECT_EQ(db.GetPath(), path + ".new");
  });
}

TEST_F(CreateTest, FailureLeavesNothing) {
  EXPECT_THROW(db.Create(path,
                         [this] {
                           db.Rows("CREATE TABLE t(a)");
                           throw std::string("stopped");
                         }),
               std::string);
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_THAT(Files(), testing::IsEmpty());
}

TEST_F(CreateTest, FilesThatACrashHasLeftAreRemovedFirst) {
  Database(path + ".new", true).exec("CREATE TABLE t(a); CREATE TABLE more(a)");
  for (const char* const left : {".new-journal", ".new-wal", ".new-shm", "-journal", "-wal"}) {
    std::ofstream(path + left) << "left";
  }
  Create();
  EXPECT_THAT(Files(), ElementsAre("test.db"));
  EXPECT_THAT(TestDB(path).Rows("SELECT name FROM sqlite_master"), ElementsAre("t"));
}

TEST_F(CreateTest, LinkAtTheTemporaryNameIsNotFollowed) {
  std::ofstream("/tmp/victim") << "untouched";
  fs::create_symlink("/tmp/victim", path + ".new");
  Create();
  EXPECT_EQ(fs::file_size("/tmp/victim"), 9U);
  EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(path)));
}

TEST_F(CreateTest, LogOfAFormerDatabaseThatIsNotAFileIsRefused) {
  fs::create_directory(path + "-journal");
  EXPECT_THROW(Create(), std::string);
  EXPECT_THAT(Files(), ElementsAre("test.db-journal"));
}

} // namespace
} // namespace orva::db

#include "TestDB.h"

#include "system/Database.h"

#include "orvadb/DB.h"
#include "orvadb/Statement.h"

#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <string>

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
    const TestDB db(path);
    return Failure([&] { Statement(db, sql.c_str()).Execute(); });
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

TEST_F(UntrustedDatabaseTest, LargeDatabaseMayTakeMoreWork) {
  Make(THREE_THOUSAND);
  EXPECT_THAT(FailureOf(EXPENSIVE), HasSubstr("more work than"));
  Make("CREATE TABLE large(a); INSERT INTO large VALUES(zeroblob(10000000))");
  EXPECT_EQ(FailureOf(EXPENSIVE), "");
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

TEST_F(UntrustedDatabaseTest, FileThatHasGrownMayTakeMoreWork) {
  Make(THREE_THOUSAND);
  const TestDB db(path);
  Make("CREATE TABLE large(a); INSERT INTO large VALUES(zeroblob(10000000))");
  const auto count = [&] { Statement(db, EXPENSIVE.c_str()).Execute(); };
  EXPECT_THROW(count(), std::string);
  db.MeasureFile();
  EXPECT_NO_THROW(count());
}

/// The end of a journal that names a super-journal, which SQLite deletes after a rollback.
const std::string SUPER_JOURNAL_MARK = "\xd9\xd5\x05\xf9\x20\xa1\x63\xd7";

TEST_F(UntrustedDatabaseTest, JournalThatNamesAnotherFileIsNotRolledBack) {
  std::ofstream(path + "-journal") << "/tmp/db/victim and more" << SUPER_JOURNAL_MARK;
  TestDB db;
  EXPECT_THAT(Thrown([&] { db.Open(path); }),
              HasSubstr("'/tmp/db/test.db-journal' names another file"));
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_EQ(db.GetPath(), "");
}

TEST_F(UntrustedDatabaseTest, JournalWithTheMarkElsewhereIsAccepted) {
  for (const std::string& content : {SUPER_JOURNAL_MARK + "x", SUPER_JOURNAL_MARK.substr(1)}) {
    std::ofstream(path + "-journal") << content;
    EXPECT_NO_THROW(TestDB db(path)) << content.size();
  }
}

TEST_F(UntrustedDatabaseTest, FileWithAnotherNameIsReadButNotWritten) {
  fs::create_hard_link(path, "/tmp/db/snapshot");
  TestDB db;
  EXPECT_THAT(Thrown([&] { db.Open(path); }), HasSubstr("'/tmp/db/test.db' has another name"));
  EXPECT_NO_THROW(db.Open(path, TestDB::Access::ReadOnly, 7, false));

  std::ofstream("/tmp/db/other") << "other content";
  fs::create_hard_link("/tmp/db/other", path + "-shm");
  EXPECT_THAT(Thrown([&] { db.Open(path, TestDB::Access::ReadOnly, 7, false); }),
              HasSubstr("'/tmp/db/test.db-shm' has another name"));
}

TEST_F(UntrustedDatabaseTest, HolesDoNotRaiseTheSize) {
  fs::resize_file(path, 1LL << 40);
  const TestDB db(path);
  EXPECT_LT(db.MeasureFile(), 5 << 20);
}

TEST_F(UntrustedDatabaseTest, SizeIncludesTheLog) {
  Database writer(path);
  writer.exec("PRAGMA journal_mode = WAL; CREATE TABLE more(a)");
  const TestDB db(path);
  EXPECT_EQ(db.MeasureFile(),
            static_cast<long long>(fs::file_size(path) + fs::file_size(path + "-wal")));
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

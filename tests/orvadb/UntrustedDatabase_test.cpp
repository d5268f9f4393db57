#include "Raw.h"

#include "orvadb/DB.h"
#include "orvadb/Statement.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>

namespace orva::db {
namespace {

namespace fs = std::filesystem;
using test::Query;
using test::Raw;
using test::TestDB;
using test::Thrown;
using testing::ElementsAre;
using testing::HasSubstr;

/// A database that somebody else has made.
class UntrustedDatabaseTest : public testing::Test {
protected:
  UntrustedDatabaseTest() {
    fs::remove_all("/tmp/db");
    fs::create_directory("/tmp/db");
    Query(Raw(path), "CREATE TABLE t(a, b)");
  }

  void Made(const std::string& sql) const { Query(Raw(path), sql); }

  /// The failure of a statement on it; empty when there is none.
  std::string FailureOf(const std::string& sql) const {
    const TestDB db(path);
    try {
      Statement(db, sql.c_str(), __FILE__, __LINE__).Execute(__FILE__, __LINE__);
    } catch (const std::string& failure) {
      return failure;
    }
    return {};
  }

  /// Why the values of the table are not trusted; empty when they are.
  std::string Refusal(bool writable = true) const {
    TestDB db;
    db.Open(path, writable ? TestDB::Access::ReadWrite : TestDB::Access::ReadOnly, 7, false);
    try {
      db.RejectComputedColumns("t");
    } catch (const std::string& failure) {
      return failure;
    }
    return {};
  }

  const std::string path = "/tmp/db/test.db";
};

TEST_F(UntrustedDatabaseTest, TriggersDoNotRun) {
  Made(
      "CREATE TRIGGER more AFTER INSERT ON t BEGIN INSERT INTO t VALUES('by the trigger', 0); END");
  EXPECT_EQ(FailureOf("INSERT INTO t VALUES(1, 2)"), "");
  EXPECT_THAT(Query(Raw(path), "SELECT a FROM t"), ElementsAre("1"));
}

TEST_F(UntrustedDatabaseTest, ViewsAreNoTables) {
  Made("CREATE VIEW v AS SELECT a FROM t");
  EXPECT_THAT(FailureOf("SELECT * FROM v"), HasSubstr("access to view \"v\" prohibited"));
}

TEST_F(UntrustedDatabaseTest, VirtualTablesAreNoTables) {
  Made("CREATE VIRTUAL TABLE v USING fts5(a)");
  EXPECT_NE(FailureOf("SELECT * FROM v"), "");
}

TEST_F(UntrustedDatabaseTest, ChecksAreNotMade) {
  Made("CREATE TABLE checked(a CHECK(a = 'never'))");
  EXPECT_EQ(FailureOf("INSERT INTO checked VALUES(1)"), "");
}

TEST_F(UntrustedDatabaseTest, ValuesLongerThanAnyNameAreNotRead) {
  Made("INSERT INTO t VALUES(1, zeroblob(16777216)), (2, zeroblob(17000000))");
  EXPECT_THAT(FailureOf("SELECT a, b FROM t"), HasSubstr("string or blob too big"));
}

TEST_F(UntrustedDatabaseTest, EndlessStatementIsInterrupted) {
  EXPECT_THAT(FailureOf("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) "
                        "SELECT count(*) FROM n"),
              HasSubstr("more work than a database of this size can need (extended code 9)"));
}

TEST_F(UntrustedDatabaseTest, FetchingPagesIsWorkToo) {
  Made("INSERT INTO t VALUES(zeroblob(100000), 0)");
  const std::string count = "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE "
                            "i < 100000) SELECT count(*) FROM n, t WHERE ";
  EXPECT_EQ(FailureOf(count + "b < i"), "");
  EXPECT_THAT(FailureOf(count + "a < i"), HasSubstr("more work than"));
}

/// Takes some ten million steps of a table of three thousand rows.
const std::string DEAR = "SELECT count(*) FROM t x, t y WHERE +x.a = +y.b";

/// Fills the table for it.
const std::string THREE_THOUSAND = "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n "
                                   "WHERE i < 3000) INSERT INTO t SELECT i, -i FROM n";

TEST_F(UntrustedDatabaseTest, LargeDatabaseMayTakeMoreWork) {
  Made(THREE_THOUSAND);
  EXPECT_THAT(FailureOf(DEAR), HasSubstr("more work than"));
  Made("CREATE TABLE large(a); INSERT INTO large VALUES(zeroblob(10000000))");
  EXPECT_EQ(FailureOf(DEAR), "");
}

TEST_F(UntrustedDatabaseTest, RowsThatTheConnectionHasChangedMayTakeMoreWork) {
  const TestDB db(path);
  db.Rows("BEGIN");
  db.Rows(THREE_THOUSAND);
  for (int i = 0; i < 10; ++i) {
    db.Rows("UPDATE t SET a = a + 1");
  }
  EXPECT_NO_THROW(Statement(db, DEAR.c_str(), __FILE__, __LINE__).Execute(__FILE__, __LINE__));
}

TEST_F(UntrustedDatabaseTest, EachStatementHasItsOwnLimit) {
  const TestDB db(path);
  for (int i = 0; i < 20; ++i) {
    Statement(db,
              "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 100000) "
              "SELECT count(*) FROM n",
              __FILE__, __LINE__)
        .Execute(__FILE__, __LINE__);
  }
}

TEST_F(UntrustedDatabaseTest, StoredValuesAreTaken) {
  Made("CREATE INDEX plain ON t(a, b)");
  int column = 0;
  for (const char* const value : {"0", "-1.5", "'plain text'", "NULL"}) {
    Made("ALTER TABLE t ADD COLUMN c" + std::to_string(column++) + " DEFAULT " + value);
  }
  EXPECT_EQ(Refusal(), "");
  Made("DROP TABLE t");
  EXPECT_EQ(Refusal(), "") << "a table that is not there computes nothing";
}

TEST_F(UntrustedDatabaseTest, GeneratedColumnsAreRefused) {
  Made("DROP TABLE t; CREATE TABLE t(a, b AS (a || a))");
  EXPECT_THAT(Refusal(), HasSubstr("generated column in table t of '/tmp/db/test.db'"));
  EXPECT_THAT(Refusal(false), HasSubstr("generated column"));
  Made("DROP TABLE t; CREATE TABLE t(a, b AS (a || a) STORED)");
  EXPECT_THAT(Refusal(), HasSubstr("generated column"));
}

TEST_F(UntrustedDatabaseTest, WhatIsComputedOnWritingIsRefusedOnlyWhereRowsAreWritten) {
  for (const char* const sql :
       {"ALTER TABLE t ADD COLUMN c DEFAULT ('a' || 'b')", "CREATE INDEX i ON t(a || b)",
        "CREATE INDEX i ON t(a) WHERE b LIKE '%'",
        "CREATE INDEX \"it's \"\"dear\"\"\" ON t(abs(a))"}) {
    Made("DROP TABLE t; CREATE TABLE t(a, b)");
    Made(sql);
    EXPECT_NE(Refusal(), "") << sql;
    EXPECT_EQ(Refusal(false), "") << sql;
  }
}

TEST_F(UntrustedDatabaseTest, MoreIndicesThanARowIsWorthAreRefused) {
  for (int i = 0; i < 33; ++i) {
    EXPECT_EQ(Refusal(), "") << i;
    Made("CREATE INDEX i" + std::to_string(i) + " ON t(a)");
  }
  EXPECT_THAT(Refusal(), HasSubstr("too many indexes"));
}

TEST_F(UntrustedDatabaseTest, FileThatHasGrownMayTakeMoreWork) {
  Made(THREE_THOUSAND);
  const TestDB db(path);
  Made("CREATE TABLE large(a); INSERT INTO large VALUES(zeroblob(10000000))");
  const auto count = [&] {
    Statement(db, DEAR.c_str(), __FILE__, __LINE__).Execute(__FILE__, __LINE__);
  };
  EXPECT_THROW(count(), std::string);
  db.MeasureFile();
  EXPECT_NO_THROW(count());
}

/// What ends a journal after whose use SQLite deletes the file whose name stands before.
const std::string SUPER_JOURNAL_MARK = "\xd9\xd5\x05\xf9\x20\xa1\x63\xd7";

TEST_F(UntrustedDatabaseTest, JournalThatNamesAnotherFileIsNotUndone) {
  std::ofstream(path + "-journal") << "/tmp/db/victim and more" << SUPER_JOURNAL_MARK;
  TestDB db;
  EXPECT_THAT(Thrown([&] { db.Open(path); }),
              HasSubstr("'/tmp/db/test.db-journal' names another file"));
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_EQ(db.GetPath(), "");
}

TEST_F(UntrustedDatabaseTest, JournalWithTheMarkElsewhereIsAnyJournal) {
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

  std::ofstream("/tmp/db/dear") << "somebody's";
  fs::create_hard_link("/tmp/db/dear", path + "-shm");
  EXPECT_THAT(Thrown([&] { db.Open(path, TestDB::Access::ReadOnly, 7, false); }),
              HasSubstr("'/tmp/db/test.db-shm' has another name"));
}

TEST_F(UntrustedDatabaseTest, HolesCountForLittle) {
  fs::resize_file(path, 1LL << 40);
  const TestDB db(path);
  EXPECT_LT(db.MeasureFile(), 5 << 20);
}

TEST_F(UntrustedDatabaseTest, SizeCountsTheLogToo) {
  const Raw writer(path);
  Query(writer, "PRAGMA journal_mode = WAL; CREATE TABLE more(a)");
  const TestDB db(path);
  EXPECT_EQ(db.MeasureFile(),
            static_cast<long long>(fs::file_size(path) + fs::file_size(path + "-wal")));
}

/// Making a database.
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

TEST_F(CreateTest, LeavesTheWholeDatabaseAndNothingElse) {
  Create();
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_THAT(Files(), ElementsAre("test.db"));
  EXPECT_THAT(TestDB(path).Rows("SELECT name FROM sqlite_master"), ElementsAre("t"));
}

TEST_F(CreateTest, ThereIsNothingAtThePathWhileItIsMade) {
  db.Create(path, [this] {
    EXPECT_THAT(Files(), ElementsAre("test.db.new"));
    EXPECT_EQ(db.GetPath(), path + ".new");
  });
}

TEST_F(CreateTest, FailureLeavesNothing) {
  EXPECT_THROW(db.Create(path,
                         [this] {
                           db.Rows("CREATE TABLE t(a)");
                           throw std::string("no more");
                         }),
               std::string);
  EXPECT_EQ(db.Handle(), nullptr);
  EXPECT_THAT(Files(), testing::IsEmpty());
}

TEST_F(CreateTest, WhatAStopHasLeftGoesFirst) {
  Query(Raw(path + ".new"), "CREATE TABLE t(a); CREATE TABLE more(a)");
  for (const char* const left : {".new-journal", ".new-wal", ".new-shm", "-journal", "-wal"}) {
    std::ofstream(path + left) << "left";
  }
  Create();
  EXPECT_THAT(Files(), ElementsAre("test.db"));
  EXPECT_THAT(TestDB(path).Rows("SELECT name FROM sqlite_master"), ElementsAre("t"));
}

TEST_F(CreateTest, LinkAtTheOtherNameIsNotFollowed) {
  std::ofstream("/tmp/victim") << "untouched";
  fs::create_symlink("/tmp/victim", path + ".new");
  Create();
  EXPECT_EQ(fs::file_size("/tmp/victim"), 9U);
  EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(path)));
}

TEST_F(CreateTest, LogOfAFormerDatabaseThatIsNoFileIsRefused) {
  fs::create_directory(path + "-journal");
  EXPECT_THROW(Create(), std::string);
  EXPECT_THAT(Files(), ElementsAre("test.db-journal"));
}

} // namespace
} // namespace orva::db

#include "orvadb/Rows.h"

#include "TestDB.h"

#include "system/Database.h"

#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <limits>
#include <string>
#include <vector>

namespace orva::db {
namespace {

using namespace std::string_literals;
namespace fs = std::filesystem;
using test::Database;
using test::TestDB;
using test::Thrown;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

struct Row {
  long long id = 0;
  std::string name{};
  long long time = 0;
};

class TestRows final : public Rows {
public:
  explicit TestRows(std::vector<Row> rows) : rows_(std::move(rows)) {}

  bool Next() noexcept override { return next_++ < rows_.size(); }

  Value Get(Column column) const noexcept override {
    const Row& row = rows_[next_ - 1];
    switch (column) {
    case ID:
      return row.id;
    case NAME:
      return row.name;
    case TIME:
      break;
    }
    return row.time;
  }

private:
  std::vector<Row> rows_;
  std::size_t next_ = 0;
};

/// Ids that need no memory, from 1.
class ManyRows final : public Rows {
public:
  explicit ManyRows(long long count) : count_(count) {}

  bool Next() noexcept override { return id_++ < count_; }
  Value Get(Column /*column*/) const noexcept override { return id_; }

private:
  long long count_;
  long long id_ = 0;
};

/// Rows that are the ids of the rows that the same statement has inserted.
class InsertedIds final : public Rows {
public:
  InsertedIds(const DB& db, int count) : db_(db), count_(count) {}

  bool Next() noexcept override {
    last_ = db_.LastInsertId();
    return count_-- > 0;
  }
  Value Get(Column /*column*/) const noexcept override { return last_; }

private:
  const DB& db_;
  int count_;
  long long last_ = 0;
};

class RowsTest : public testing::Test {
protected:
  RowsTest() {
    fs::remove_all("/tmp/db");
    fs::create_directory("/tmp/db");
    Database(path, true).exec("CREATE TABLE t(id INTEGER PRIMARY KEY, name TEXT, time)");
  }

  void Make(const std::string& sql) const { Database(path).exec(sql); }

  static void Insert(const DB& db, Rows& rows) {
    Statement(db, "INSERT INTO t SELECT id, name, time FROM temp.input", rows).Execute();
  }

  const std::string path = "/tmp/db/test.db";
};

TEST_F(RowsTest, AreReadInTheirOrderWithTheirTypes) {
  const TestDB db(path);
  TestRows rows({{7, "b", -1}, {-3, "a", std::numeric_limits<long long>::min()}, {7, "", 0}});
  Statement query(db,
                  "SELECT id || '|' || quote(name) || '|' || quote(time) || '|' || "
                  "typeof(id) FROM temp.input",
                  rows);
  std::vector<std::string> read;
  while (query.Fetch()) {
    read.push_back(query.GetText(0));
  }
  EXPECT_THAT(read, ElementsAre("7|'b'|-1|integer", "-3|'a'|-9223372036854775808|integer",
                                "7|''|0|integer"));
}

TEST_F(RowsTest, NoRowsAreAnEmptyTable) {
  const TestDB db(path);
  TestRows none({});
  Insert(db, none);
  EXPECT_THAT(db.Rows("SELECT id FROM t"), IsEmpty());
}

TEST_F(RowsTest, TextsKeepNulAndInvalidBytesAndMayBeEmpty) {
  const TestDB db(path);
  TestRows rows({{1, "a\0b"s, 0}, {2, "", 0}, {3, "\xff\xfe"s, 0}});
  Insert(db, rows);
  EXPECT_THAT(db.Rows("SELECT hex(name) || '|' || typeof(name) FROM t"),
              ElementsAre("610062|text", "|text", "FFFE|text"));
  TestRows same({{0, "a\0b"s, 0}, {0, "", 0}});
  Statement found(db, "SELECT count(*) FROM t WHERE name IN (SELECT name FROM temp.input)", same);
  ASSERT_TRUE(found.Fetch());
  EXPECT_EQ(2, found.GetInt(0));
}

TEST_F(RowsTest, NextRowIsAskedForAfterTheOneBeforeWasInserted) {
  const TestDB db(path);
  InsertedIds ids(db, 4);
  Statement(db, "INSERT INTO t(name) SELECT id FROM temp.input", ids).Execute();
  EXPECT_THAT(db.Rows("SELECT id || name FROM t"), ElementsAre("10", "21", "32", "43"));
}

TEST_F(RowsTest, KeptStatementReadsTheRowsOfItsUse) {
  const TestDB db(path);
  for (int id = 1; id <= 3; ++id) {
    TestRows rows({{id, "n", 0}});
    Insert(db, rows);
  }
  EXPECT_THAT(db.Rows("SELECT id FROM t"), ElementsAre("1", "2", "3"));
  EXPECT_EQ(1U, db.Compiled().size());
}

TEST_F(RowsTest, TableWorksAgainAfterARollback) {
  const TestDB db(path);
  for (int id = 1; id <= 3; ++id) {
    const Transaction rolledBack(db, 1'000);
    TestRows rows({{id, "n", 0}});
    Insert(db, rows);
    EXPECT_THAT(db.Rows("SELECT id FROM t"), ElementsAre(std::to_string(id)));
  }
  TestRows rows({{4, "n", 0}});
  Insert(db, rows);
  EXPECT_THAT(db.Rows("SELECT id FROM t"), ElementsAre("4"));
}

TEST_F(RowsTest, TableWorksAgainAfterTheSchemaHasChanged) {
  const TestDB db(path);
  TestRows first({{1, "n", 0}});
  Insert(db, first);
  Make("CREATE INDEX later ON t(name)");
  TestRows second({{2, "n", 0}});
  Insert(db, second);
  EXPECT_THAT(db.Rows("SELECT id FROM t"), ElementsAre("1", "2"));
}

TEST_F(RowsTest, TableWorksInADatabaseThatIsOpenedAgain) {
  TestDB db(path);
  for (int id = 1; id <= 2; ++id) {
    TestRows rows({{id, "n", 0}});
    Insert(db, rows);
    db.Open(path);
  }
  EXPECT_THAT(db.Rows("SELECT id FROM t"), ElementsAre("1", "2"));
}

TEST_F(RowsTest, RefusedRowLeavesNothingOfItsStatement) {
  const TestDB db(path);
  TestRows rows({{1, "n", 0}, {2, "n", 0}, {1, "n", 0}});
  EXPECT_THAT(Thrown([&] { Insert(db, rows); }), HasSubstr("UNIQUE constraint failed"));
  EXPECT_THAT(db.Rows("SELECT id FROM t"), IsEmpty());
}

TEST_F(RowsTest, LeaveNoTraceInTheFile) {
  {
    const TestDB db(path);
    TestRows rows({{1, "n", 0}});
    Insert(db, rows);
  }
  EXPECT_THAT(Database(path).Run("SELECT name FROM sqlite_schema"), ElementsAre("t"));
}

// Untrusted databases.

TEST_F(RowsTest, TableOfTheFileWithTheSameNameIsNotRead) {
  Make("CREATE TABLE input(id, name, time); INSERT INTO input VALUES(9, 'file', 9)");
  const TestDB db(path);
  TestRows rows({{1, "n", 0}});
  Insert(db, rows);
  EXPECT_THAT(db.Rows("SELECT id || name FROM t"), ElementsAre("1n"));
  EXPECT_THAT(Database(path).Run("SELECT * FROM input"), ElementsAre("9|file|9"));
}

TEST_F(RowsTest, OrdinaryStatementsCannotReadTheTable) {
  const TestDB db(path);
  TestRows rows({{1, "n", 0}});
  Insert(db, rows);
  EXPECT_THAT(Thrown([&] { const Statement reads(db, "SELECT * FROM temp.input"); }),
              HasSubstr("input"));
}

/// A database whose table `t` is a virtual one of a module.
class VirtualTableTest : public RowsTest, public testing::WithParamInterface<const char*> {
protected:
  VirtualTableTest() {
    Make("DROP TABLE t");
    Make("PRAGMA writable_schema = ON; INSERT INTO sqlite_schema VALUES('table', 't', 't', 0, "
         "'CREATE VIRTUAL TABLE t USING " +
         std::string(GetParam()) + "')");
  }
};

TEST_P(VirtualTableTest, IsRefusedBeforeAndAfterRowsWereUsed) {
  const TestDB db(path);
  const auto read = [&] { Statement(db, "SELECT * FROM t").Fetch(); };
  const auto change = [&] { Statement(db, "DELETE FROM t WHERE name = 'a'").Execute(); };
  EXPECT_NE("", Thrown(read));
  EXPECT_NE("", Thrown(change));
  {
    TestRows rows({{1, "n", 0}});
    Statement query(db, "SELECT id FROM temp.input", rows);
    EXPECT_TRUE(query.Fetch());
  }
  EXPECT_NE("", Thrown(read));
  EXPECT_NE("", Thrown(change));
}

TEST_P(VirtualTableTest, IsRefusedByStatementsWithRows) {
  const TestDB db(path);
  for (const char* const sql : {"SELECT * FROM t WHERE rowid IN (SELECT id FROM temp.input)",
                                "DELETE FROM t WHERE rowid IN (SELECT id FROM temp.input)",
                                "INSERT INTO t SELECT id, name, time FROM temp.input"}) {
    TestRows rows({{1, "n", 0}});
    EXPECT_NE("", Thrown([&] { Statement(db, sql, rows).Execute(); })) << sql;
  }
}

INSTANTIATE_TEST_SUITE_P(Modules, VirtualTableTest,
                         testing::Values("orva_input", "orva_input(id, name, time)",
                                         "fts5(id, name, time)", "rtree(id, name, time)",
                                         "json_each", "dbstat", "generate_series", "missing"));

// The limit of work.

TEST_F(RowsTest, MillionRowsAreNotTooMuchWork) {
  const TestDB db(path);
  {
    ManyRows rows(1'000'000);
    Statement(db, "INSERT INTO t(id) SELECT id FROM temp.input", rows).Execute();
  }
  EXPECT_THAT(db.Rows("SELECT count(*) FROM t"), ElementsAre("1000000"));
  ManyRows rows(1'000'000);
  Statement(db, "DELETE FROM t WHERE id IN (SELECT id FROM temp.input)", rows).Execute();
  EXPECT_THAT(db.Rows("SELECT count(*) FROM t"), ElementsAre("0"));
}

const char* const ENDLESS =
    "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) SELECT "
    "count(*) FROM n, temp.input";

TEST_F(RowsTest, EndlessStatementWithRowsIsInterrupted) {
  const TestDB db(path);
  TestRows rows({{1, "n", 0}});
  EXPECT_THAT(Thrown([&] { Statement(db, ENDLESS, rows).Execute(); }),
              HasSubstr("more work than a database of this size can need"));
}

TEST_F(RowsTest, RowsOfOneStatementDoNotAllowTheNextMoreWork) {
  const TestDB db(path);
  {
    ManyRows rows(100'000);
    Statement count(db, "SELECT count(*) FROM temp.input", rows);
    EXPECT_TRUE(count.Fetch());
  }
  // Less than the rows above would allow, and more than one row does.
  const char* const expensive =
      "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 4000000) "
      "SELECT count(*) FROM n";
  EXPECT_THAT(Thrown([&] { Statement(db, expensive).Execute(); }), HasSubstr("more work than"));
}

} // namespace
} // namespace orva::db

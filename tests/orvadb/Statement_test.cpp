#include "TestDB.h"

#include "system/Database.h"

#include "orvadb/Connection.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <functional>
#include <limits>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

namespace orva::db {
namespace {

namespace fs = std::filesystem;
using test::Database;
using test::TestDB;
using test::Thrown;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;
using testing::StartsWith;

/// A database with a table of one column.
class StatementTest : public testing::Test {
protected:
  StatementTest() {
    fs::remove_all("/tmp/statement");
    fs::create_directory("/tmp/statement");
    db.Open(path);
    db.Rows("CREATE TABLE t(a)");
  }

  Statement Make(const char* sql) const { return {db, sql}; }

  void Execute(const char* sql) const { Make(sql).Execute(); }

  /// Runs of each compiled statement of the connection.
  std::vector<int> Runs() const {
    std::vector<int> runs;
    for (sqlite3_stmt* const each : db.Compiled()) {
      runs.push_back(sqlite3_stmt_status(each, SQLITE_STMTSTATUS_RUN, 0));
    }
    return runs;
  }

  const std::string path = "/tmp/statement/test.db";
  TestDB db;
};

TEST_F(StatementTest, StepGivesRowsAndThenDone) {
  db.Rows("INSERT INTO t VALUES(1), (2)");
  Statement select = Make("SELECT a FROM t ORDER BY a");
  EXPECT_EQ(select.Step(), 100);
  EXPECT_EQ(select.GetInt(0), 1);
  EXPECT_EQ(select.Step(), 100);
  EXPECT_EQ(select.GetInt(0), 2);
  EXPECT_EQ(select.Step(), 101);
}

TEST_F(StatementTest, StepReturnsTheCodeOfAFailureAndThrowsNothing) {
  db.Rows("CREATE UNIQUE INDEX i ON t(a); INSERT INTO t VALUES(1)");
  EXPECT_EQ(Make("INSERT INTO t VALUES(1)").Step(), SQLITE_CONSTRAINT);
}

TEST_F(StatementTest, FetchReturnsWhetherARowIsReady) {
  db.Rows("INSERT INTO t VALUES(1)");
  Statement select = Make("SELECT a FROM t");
  EXPECT_TRUE(select.Fetch());
  EXPECT_FALSE(select.Fetch());
}

TEST_F(StatementTest, ExecuteRunsToCompletion) {
  db.Rows("CREATE TABLE u(a); INSERT INTO t VALUES(1), (2), (3)");
  Execute("INSERT INTO u SELECT a FROM t RETURNING a");
  EXPECT_THAT(Database(path).Run("SELECT a FROM u"), ElementsAre("1", "2", "3"));
}

// Errors.

TEST_F(StatementTest, AnErrorCarriesPlaceMessageExtendedCodeAndSql) {
  db.Rows("CREATE UNIQUE INDEX i ON t(a); INSERT INTO t VALUES(1)");
  Statement insert(db, "INSERT INTO t VALUES(1)", "Prepared.cpp", 1);
  const std::string expected = "Caller.cpp:34: UNIQUE constraint failed: t.a (extended code 2067) "
                               "in \"INSERT INTO t VALUES(1)\"";
  EXPECT_EQ(Thrown([&] { insert.Execute("Caller.cpp", 34); }), expected);
  Statement again(db, "INSERT INTO t VALUES(1)", "Prepared.cpp", 2);
  EXPECT_EQ(Thrown([&] { again.Fetch("Caller.cpp", 34); }), expected);
}

TEST_F(StatementTest, AnErrorNamesTheCallersPlaceByDefault) {
  const auto prepare = [&] { const Statement statement(db, "SELEKT"); };
  const std::string place = __FILE__ + (":" + std::to_string(__LINE__ - 1)) + ": ";
  EXPECT_THAT(Thrown(prepare), StartsWith(place));
}

TEST_F(StatementTest, SqlThatCannotBePreparedIsThrown) {
  EXPECT_EQ(Thrown([&] { Statement(db, "SELECT nonsense FROM t", "Caller.cpp", 5); }),
            "Caller.cpp:5: no such column: nonsense (extended code 1) in "
            "\"SELECT nonsense FROM t\"");
  EXPECT_THROW(Make("SELEKT"), std::string);
  EXPECT_THROW(Make("SELECT * FROM absent"), std::string);
  EXPECT_THAT(db.Compiled(), IsEmpty());
}

TEST_F(StatementTest, BindingAMissingParameterIsThrown) {
  Statement select = Make("SELECT ?");
  const std::string expected =
      "Caller.cpp:9: column index out of range (extended code 25) in \"SELECT ?\"";
  EXPECT_EQ(Thrown([&] { select.BindInt(0, 1, "Caller.cpp", 9); }), expected);
  EXPECT_EQ(Thrown([&] { select.BindInt64(2, 1, "Caller.cpp", 9); }), expected);
  EXPECT_EQ(Thrown([&] { select.BindText(2, "x", "Caller.cpp", 9); }), expected);
  EXPECT_EQ(Thrown([&] { select.BindTime(2, 1, "Caller.cpp", 9); }), expected);
}

TEST_F(StatementTest, AFailedExecuteLeavesTheTextUsable) {
  db.Rows("CREATE UNIQUE INDEX i ON t(a); INSERT INTO t VALUES(1)");
  EXPECT_THROW(Execute("INSERT INTO t VALUES(1)"), std::string);
  db.Rows("DELETE FROM t");
  EXPECT_NO_THROW(Execute("INSERT INTO t VALUES(1)"));
}

// Values.

TEST_F(StatementTest, ParametersCountFromOneAndColumnsFromZero) {
  Statement select = Make("SELECT ?, ?, ?, ?");
  select.BindInt(1, -5);
  select.BindInt64(2, 1LL << 40);
  select.BindText(3, "text");
  select.BindTime(4, 1L << 33);
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetInt(0), -5);
  EXPECT_EQ(select.GetInt64(1), 1LL << 40);
  EXPECT_EQ(select.GetText(2), "text");
  EXPECT_EQ(select.GetTime(3), 1L << 33);
}

TEST_F(StatementTest, TheLimitsOfIntegersAreKept) {
  Statement select = Make("SELECT ?, ?, ?, ?");
  select.BindInt(1, std::numeric_limits<int>::min());
  select.BindInt64(2, std::numeric_limits<long long>::min());
  select.BindInt64(3, std::numeric_limits<long long>::max());
  select.BindTime(4, -1);
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetInt(0), std::numeric_limits<int>::min());
  EXPECT_EQ(select.GetInt64(1), std::numeric_limits<long long>::min());
  EXPECT_EQ(select.GetInt64(2), std::numeric_limits<long long>::max());
  EXPECT_EQ(select.GetTime(3), -1);
}

TEST_F(StatementTest, GetIntGivesTheLow32BitsWithTheirSign) {
  Statement select = Make("SELECT 4294967297, 2147483648, -4294967298, 4294967296");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetInt(0), 1);
  EXPECT_EQ(select.GetInt(1), std::numeric_limits<int>::min());
  EXPECT_EQ(select.GetInt(2), -2);
  EXPECT_EQ(select.GetInt(3), 0);
}

TEST_F(StatementTest, GetBoolIsTrueForAnyNonZeroInteger) {
  Statement select = Make("SELECT 0, 1, -1, 4294967296, NULL");
  ASSERT_TRUE(select.Fetch());
  EXPECT_FALSE(select.GetBool(0));
  EXPECT_TRUE(select.GetBool(1));
  EXPECT_TRUE(select.GetBool(2));
  EXPECT_TRUE(select.GetBool(3));
  EXPECT_FALSE(select.GetBool(4));
}

TEST_F(StatementTest, TimesAndIntegersAreStoredAsIntegersAndTextsAsTexts) {
  Statement select = Make("SELECT typeof(?), typeof(?), typeof(?), typeof(?)");
  select.BindInt(1, 1);
  select.BindInt64(2, 1);
  select.BindTime(3, 1);
  select.BindText(4, "1");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetText(0), "integer");
  EXPECT_EQ(select.GetText(1), "integer");
  EXPECT_EQ(select.GetText(2), "integer");
  EXPECT_EQ(select.GetText(3), "text");
}

TEST_F(StatementTest, TextsAreBoundWithTheirNulBytes) {
  const std::string zeros("a\0b\0", 4);
  {
    Statement insert = Make("INSERT INTO t VALUES(?)");
    insert.BindText(1, zeros);
    insert.Execute();
  }
  Statement select = Make("SELECT a, hex(a) FROM t");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetText(0), zeros);
  EXPECT_EQ(select.GetText(1), "61006200");
}

TEST_F(StatementTest, BindTextCopiesTheText) {
  Statement select = Make("SELECT ?");
  std::string text(1000, 'x');
  select.BindText(1, text);
  text.assign(1000, 'y');
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetText(0), std::string(1000, 'x'));
}

TEST_F(StatementTest, AnEmptyTextIsATextAndNullReadsAsEmpty) {
  Statement select = Make("SELECT typeof(?), ?, NULL");
  select.BindText(1, "");
  select.BindText(2, "");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetText(0), "text");
  EXPECT_EQ(select.GetText(1), "");
  EXPECT_EQ(select.GetText(2), "");
  EXPECT_EQ(select.GetInt(2), 0);
  EXPECT_EQ(select.GetTime(2), 0);
}

TEST_F(StatementTest, InvalidUtf8IsKept) {
  Statement select = Make("SELECT ?");
  select.BindText(1, "\xff\xc3/\x80");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetText(0), "\xff\xc3/\x80");
}

TEST_F(StatementTest, NumbersReadAsTexts) {
  Statement select = Make("SELECT 42");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetText(0), "42");
}

// Kept statements.

TEST_F(StatementTest, TheSameTextIsCompiledOnce) {
  for (int i = 0; i < 5; ++i) {
    // Each time at another place.
    const std::string sql = std::string("INSERT INTO t ") + "VALUES(1)";
    Execute(sql.c_str());
  }
  EXPECT_THAT(Runs(), ElementsAre(5));
  EXPECT_THAT(db.Rows("SELECT count(*) FROM t"), ElementsAre("5"));
}

TEST_F(StatementTest, ATextInUseIsCompiledAgain) {
  db.Rows("INSERT INTO t VALUES(1), (2)");
  {
    Statement outer = Make("SELECT a FROM t ORDER BY a");
    ASSERT_TRUE(outer.Fetch());
    {
      Statement inner = Make("SELECT a FROM t ORDER BY a");
      ASSERT_TRUE(inner.Fetch());
      EXPECT_THAT(db.Compiled(), SizeIs(2));
      EXPECT_EQ(inner.GetInt(0), 1);
      ASSERT_TRUE(outer.Fetch());
      EXPECT_EQ(outer.GetInt(0), 2);
      EXPECT_EQ(inner.GetInt(0), 1);
    }
    EXPECT_FALSE(outer.Fetch());
  }
  EXPECT_THAT(db.Compiled(), SizeIs(1));
  Execute("SELECT a FROM t ORDER BY a");
  EXPECT_THAT(db.Compiled(), SizeIs(1));
}

TEST_F(StatementTest, TheOuterUseOfATextMayEndBeforeTheInner) {
  auto outer = std::make_unique<Statement>(db, "SELECT 1");
  auto inner = std::make_unique<Statement>(db, "SELECT 1");
  outer.reset();
  EXPECT_TRUE(inner->Fetch());
  {
    const Statement third = Make("SELECT 1");
    EXPECT_THAT(db.Compiled(), SizeIs(2));
    inner.reset();
  }
  EXPECT_THAT(db.Compiled(), SizeIs(1));
}

TEST_F(StatementTest, AUsedStatementKeepsNoBindings) {
  {
    Statement select = Make("SELECT typeof(?)");
    select.BindText(1, "bound");
    ASSERT_TRUE(select.Fetch());
  }
  Statement select = Make("SELECT typeof(?)");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetText(0), "null");
  EXPECT_THAT(db.Compiled(), SizeIs(1));
}

TEST_F(StatementTest, AUsedStatementHoldsNoLock) {
  db.Rows("INSERT INTO t VALUES(1), (2)");
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  {
    Statement select = Make("SELECT a FROM t");
    ASSERT_TRUE(select.Fetch());
    EXPECT_EQ(other.tryExec("INSERT INTO t VALUES(3)"), SQLITE_BUSY)
        << "a reader keeps writers out";
  }
  EXPECT_EQ(other.tryExec("INSERT INTO t VALUES(3)"), SQLITE_OK);
}

TEST_F(StatementTest, AUsedStatementStartsAgainFromTheBeginning) {
  db.Rows("INSERT INTO t VALUES(1), (2)");
  for (int i = 0; i < 2; ++i) {
    Statement select = Make("SELECT a FROM t ORDER BY a");
    ASSERT_TRUE(select.Fetch());
    EXPECT_EQ(select.GetInt(0), 1);
  }
}

TEST_F(StatementTest, KeptStatementsFollowTheSchema) {
  Execute("SELECT * FROM t");
  Execute("ALTER TABLE t ADD COLUMN b DEFAULT 7");
  db.Rows("INSERT INTO t(a) VALUES(1)");
  Statement select = Make("SELECT * FROM t");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetInt(1), 7);
}

TEST_F(StatementTest, KeptStatementsDoNotPreventDroppingTheirTable) {
  Execute("SELECT * FROM t");
  Execute("DROP TABLE t");
  EXPECT_THROW(Make("SELECT * FROM t"), std::string);
}

TEST_F(StatementTest, KeptStatementsDoNotPreventVacuum) {
  db.Rows("INSERT INTO t VALUES(1), (2)");
  {
    Statement select = Make("SELECT a FROM t");
    ASSERT_TRUE(select.Fetch()); // and left unfinished
  }
  Execute("INSERT INTO t VALUES(3)");
  EXPECT_NO_THROW(Execute("VACUUM"));
  EXPECT_NO_THROW(Execute("VACUUM"));
  Execute("INSERT INTO t VALUES(3)");
  EXPECT_THAT(db.Rows("SELECT count(*) FROM t"), ElementsAre("4"));
}

TEST_F(StatementTest, KeptStatementsFollowTheSchemaOfAnotherProgram) {
  Execute("SELECT * FROM t");
  Database(path).exec("DROP TABLE t; CREATE TABLE t(x, y); INSERT INTO t VALUES(8, 9)");
  Statement select = Make("SELECT * FROM t");
  ASSERT_TRUE(select.Fetch());
  EXPECT_EQ(select.GetInt(1), 9);
}

/// Uses statements on a connection and records the results.
class Uses {
public:
  /// With `repeated` a text is the same in each use. Otherwise it has a different number of blanks
  /// at its end each time, so that no kept statement is used.
  Uses(const TestDB& db, bool repeated) : db_(db), repeated_(repeated) {}

  /// Makes a statement. Records its failure.
  std::unique_ptr<Statement> Make(const std::string& sql) {
    texts_.push_back(sql + std::string(repeated_ ? 0 : texts_.size(), ' '));
    try {
      return std::make_unique<Statement>(db_, texts_.back().c_str(), "Caller.cpp", 1);
    } catch (const std::string& error) {
      results.push_back(sql + ": " + error.substr(0, error.find(" in \"")));
      return nullptr;
    }
  }

  /// Makes a statement and runs it. Records the code of its last step.
  void Run(const std::string& sql) {
    if (const auto statement = Make(sql)) {
      int code = Statement::ROW;
      while (code == Statement::ROW) {
        code = statement->Step();
      }
      results.push_back(sql + ": " + std::to_string(code));
    }
  }

  std::vector<std::string> results;

private:
  const TestDB& db_;
  bool repeated_;
  std::deque<std::string> texts_;
};

/// A change of the schema between uses of the same texts.
struct Change {
  const char* name;
  std::function<void(const TestDB&, Uses&)> make;
};

void PrintTo(const Change& change, std::ostream* stream) {
  *stream << change.name;
}

class StatementAfterChangeTest : public StatementTest, public testing::WithParamInterface<Change> {
protected:
  // The first two fail before column a is renamed. A failure makes kept statements unusable.
  const std::vector<std::string> texts = {"SELECT b FROM t", "UPDATE t SET b = 2",
                                          "SELECT a FROM t", "SELECT * FROM u",
                                          "INSERT INTO t(a) VALUES(1)"};

  /// Runs all texts, makes the change, makes a statement of `first`, and runs all texts twice.
  std::vector<std::string> ResultsOfUses(const std::string& first, bool repeated) {
    db.Close();
    fs::remove(path);
    db.Open(path);
    db.Rows("CREATE TABLE t(a); CREATE TABLE u(a)");
    Uses uses(db, repeated);
    const auto runAll = [&] { std::ranges::for_each(texts, [&](auto& sql) { uses.Run(sql); }); };
    runAll();
    GetParam().make(db, uses);
    uses.Make(first);
    runAll();
    runAll();
    return uses.results;
  }
};

TEST_P(StatementAfterChangeTest, KeptStatementsBehaveAsNewOnes) {
  for (const std::string& first : texts) {
    EXPECT_EQ(ResultsOfUses(first, true), ResultsOfUses(first, false)) << first;
  }
}

void OtherProgramRuns(const char* sql) {
  Database("/tmp/statement/test.db").exec(sql);
}

INSTANTIATE_TEST_SUITE_P(
    Schema, StatementAfterChangeTest,
    testing::Values(
        Change{"Dropped", [](auto&, Uses& uses) { uses.Run("DROP TABLE t"); }},
        Change{"Renamed",
               [](auto&, Uses& uses) { uses.Run("ALTER TABLE t RENAME COLUMN a TO b"); }},
        Change{"DroppedByAStatementInUse",
               [](auto&, Uses& uses) {
                 const auto drop = uses.Make("DROP TABLE t");
                 drop->Execute();
                 uses.Run("SELECT a FROM t");
               }},
        Change{"DroppedByAStatementMadeBefore",
               [](auto&, Uses& uses) {
                 const auto drop = uses.Make("DROP TABLE t");
                 uses.Run("SELECT a FROM t");
                 drop->Execute();
               }},
        Change{"DroppedAgain",
               [](auto&, Uses& uses) {
                 for (int i = 0; i < 2; ++i) {
                   uses.Run("CREATE TABLE v(a)");
                   uses.Run("SELECT a FROM v");
                   uses.Run("DROP TABLE v");
                   uses.Run("SELECT a FROM v");
                 }
               }},
        Change{"RolledBack",
               [](const TestDB& db, Uses& uses) {
                 const Transaction transaction(db, 0);
                 uses.Run("ALTER TABLE t RENAME COLUMN a TO b");
                 uses.Run("SELECT b FROM t");
               }},
        Change{"RolledBackToASavepoint",
               [](const TestDB& db, Uses& uses) {
                 Transaction transaction(db, 0);
                 uses.Run("SAVEPOINT s");
                 uses.Run("ALTER TABLE t RENAME COLUMN a TO b");
                 uses.Run("SELECT b FROM t");
                 uses.Run("ROLLBACK TO s");
                 uses.Run("SELECT b FROM t");
                 uses.Run("RELEASE s");
               }},
        Change{"DroppedByAnotherProgram", [](auto&, Uses&) { OtherProgramRuns("DROP TABLE t"); }},
        Change{"DroppedByAnotherProgramBetweenTransactions",
               [](const TestDB& db, Uses& uses) {
                 {
                   Transaction transaction(db, 0);
                   uses.Run("SELECT a FROM t");
                   transaction.Commit();
                 }
                 OtherProgramRuns("DROP TABLE t");
                 const Transaction transaction(db, 0);
                 uses.Run("SELECT a FROM t");
                 uses.Run("SELECT a FROM t");
               }},
        Change{"NoticedByAStep",
               [](auto&, Uses& uses) {
                 OtherProgramRuns("ALTER TABLE t RENAME COLUMN a TO b");
                 uses.Run("SELECT * FROM u");
               }},
        Change{"NoticedByAFailedStep",
               [](auto&, Uses& uses) {
                 OtherProgramRuns("DROP TABLE t");
                 uses.Run("INSERT INTO t(a) VALUES(1)");
               }},
        Change{"NoticedByAPreparation",
               [](auto&, Uses& uses) {
                 OtherProgramRuns("DROP TABLE t; CREATE TABLE v(a)");
                 EXPECT_TRUE(uses.Make("SELECT a FROM v"));
               }},
        Change{"NoticedByAFailedPreparation",
               [](auto&, Uses& uses) {
                 OtherProgramRuns("DROP TABLE t");
                 EXPECT_FALSE(uses.Make("SELECT a FROM absent"));
               }}),
    [](const auto& change) { return change.param.name; });

} // namespace
} // namespace orva::db

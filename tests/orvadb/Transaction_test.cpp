#include "TestDB.h"

#include "system/Database.h"

#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include "support/ThreadState.h"
#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <thread>

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

/// A database with a table of one unique column.
class TransactionTest : public testing::Test {
protected:
  TransactionTest() {
    fs::remove_all("/tmp/transaction");
    fs::create_directory("/tmp/transaction");
    db.Open(path);
    db.Rows("CREATE TABLE t(a UNIQUE)");
  }

  void Execute(const char* sql) const { Statement(db, sql).Execute(); }

  int Step(const char* sql) const { return Statement(db, sql).Step(); }

  std::vector<std::string> Saved() const {
    return Database(path).Run("SELECT a FROM t ORDER BY a");
  }

  const std::string path = "/tmp/transaction/test.db";
  TestDB db;
};

TEST_F(TransactionTest, CommitSavesTheChanges) {
  Transaction transaction(db, 0);
  Execute("INSERT INTO t VALUES(1)");
  EXPECT_THAT(Saved(), IsEmpty());
  transaction.Commit();
  EXPECT_THAT(Saved(), ElementsAre("1"));
}

TEST_F(TransactionTest, ChangesAreRolledBackWithoutACommit) {
  {
    const Transaction transaction(db, 0);
    Execute("INSERT INTO t VALUES(1)");
  }
  EXPECT_THAT(Saved(), IsEmpty());
  EXPECT_THAT(db.Rows("SELECT a FROM t"), IsEmpty());
}

TEST_F(TransactionTest, AnExceptionRollsBack) {
  EXPECT_THROW(
      {
        const Transaction transaction(db, 0);
        Execute("INSERT INTO t VALUES(1)");
        Execute("CREATE TABLE u(a)");
        throw std::runtime_error("halfway");
      },
      std::runtime_error);
  EXPECT_THAT(Database(path).Run("SELECT name FROM sqlite_master WHERE type = 'table'"),
              ElementsAre("t"));
  EXPECT_THAT(Saved(), IsEmpty());
}

TEST_F(TransactionTest, RollsBackUnderAStatementThatIsStillInUse) {
  Execute("INSERT INTO t VALUES(1), (2)");
  Statement select(db, "SELECT a FROM t");
  {
    const Transaction transaction(db, 0);
    Execute("DELETE FROM t WHERE a = 2");
    ASSERT_TRUE(select.Fetch());
  }
  EXPECT_THAT(Saved(), ElementsAre("1", "2"));
}

TEST_F(TransactionTest, NothingIsRolledBackAfterTheCommit) {
  {
    Transaction transaction(db, 0);
    Execute("INSERT INTO t VALUES(1)");
    transaction.Commit();
    Execute("INSERT INTO t VALUES(2)");
  }
  EXPECT_THAT(Saved(), ElementsAre("1", "2"));
}

TEST_F(TransactionTest, TransactionsFollowEachOther) {
  for (const char* const sql : {"INSERT INTO t VALUES(1)", "INSERT INTO t VALUES(2)"}) {
    { const Transaction abandoned(db, 0); }
    Transaction transaction(db, 0);
    Execute(sql);
    transaction.Commit();
  }
  EXPECT_THAT(Saved(), ElementsAre("1", "2"));
}

TEST_F(TransactionTest, PreventsOtherWritersFromTheBeginning) {
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  {
    const Transaction transaction(db, 0);
    EXPECT_EQ(other.tryExec("BEGIN IMMEDIATE"), SQLITE_BUSY);
    EXPECT_EQ(other.tryExec("SELECT * FROM t"), SQLITE_OK) << "readers may go on";
  }
  EXPECT_EQ(other.tryExec("BEGIN IMMEDIATE"), SQLITE_OK);
}

TEST_F(TransactionTest, FailsWithTheCallersPlaceWhileAnotherWrites) {
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  other.exec("BEGIN IMMEDIATE");
  EXPECT_EQ(Thrown([&] { Transaction(db, 0, "Caller.cpp", 21); }),
            "Caller.cpp:21: database is locked (extended code 5) in \"BEGIN IMMEDIATE\"");
}

TEST_F(TransactionTest, FailsOnAClosedDatabase) {
  db.Close();
  EXPECT_THAT(Thrown([&] { Transaction(db, 0, "Caller.cpp", 21); }), StartsWith("Caller.cpp:21: "));
}

TEST_F(TransactionTest, ASecondOneOnTheConnectionFails) {
  const Transaction transaction(db, 0);
  EXPECT_THAT(Thrown([&] { Transaction(db, 0); }),
              HasSubstr("cannot start a transaction within a transaction"));
}

// Waiting.

TEST_F(TransactionTest, WaitsForAnotherWriterForItsBusyTimeOut) {
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  other.exec("BEGIN EXCLUSIVE; INSERT INTO t VALUES('theirs')");

  // Set when the waiting connection begins; from then on only the lock makes it sleep.
  std::atomic<pid_t> waiting = 0;
  const auto begins = [](unsigned /*event*/, void* place, void* /*statement*/, void* /*sql*/) {
    static_cast<std::atomic<pid_t>*>(place)->store(gettid());
    static_cast<std::atomic<pid_t>*>(place)->notify_one();
    return 0;
  };
  sqlite3_trace_v2(db.Handle(), SQLITE_TRACE_STMT, begins, &waiting);

  std::string failure;
  std::jthread waiter([&] {
    try {
      Transaction transaction(db, 600'000);
      Execute("INSERT INTO t VALUES('ours')");
      transaction.Commit();
    } catch (const std::string& thrown) {
      failure = thrown;
    }
  });
  waiting.wait(0);
  EXPECT_TRUE(test::AwaitSleeping(waiting));
  other.exec("COMMIT");
  waiter.join();
  EXPECT_EQ(failure, "");
  EXPECT_THAT(Saved(), ElementsAre("ours", "theirs"));
}

TEST_F(TransactionTest, TheBusyTimeOutIsTheTransactionsOnlyWhileItRuns) {
  ASSERT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("1000"));
  {
    Transaction transaction(db, 70);
    EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("70"));
    transaction.Commit();
    EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("1000"));
  }
  {
    const Transaction transaction(db, 80);
    EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("80"));
  }
  EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("1000"));
}

TEST_F(TransactionTest, AFailedBeginningRestoresTheBusyTimeOut) {
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  other.exec("BEGIN IMMEDIATE");
  EXPECT_THROW(Transaction(db, 0), std::string);
  EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("1000"));
}

// Failures in a transaction.

TEST_F(TransactionTest, AFailedStepMakesTheCommitFail) {
  std::string message;
  {
    Transaction transaction(db, 0);
    Execute("INSERT INTO t VALUES(1)");
    {
      Statement insert(db, "INSERT INTO t VALUES(?)");
      insert.BindInt(1, 1);
      EXPECT_EQ(insert.Step("Inner.cpp", 11), SQLITE_CONSTRAINT);
    }
    Execute("INSERT INTO t VALUES(2)");
    message = Thrown([&] { transaction.Commit("Caller.cpp", 22); });
  }
  EXPECT_THAT(message,
              AllOf(StartsWith("Caller.cpp:22: "),
                    HasSubstr("Inner.cpp:11: UNIQUE constraint failed: t.a (extended code 2067)"),
                    HasSubstr("INSERT INTO t VALUES(?)")));
  EXPECT_THAT(Saved(), IsEmpty());
}

TEST_F(TransactionTest, TheFirstFailedStepIsTheOneReported) {
  Execute("INSERT INTO t VALUES(1), (2)");
  Transaction transaction(db, 0);
  Step("INSERT INTO t VALUES(1)");
  Step("INSERT INTO t VALUES(2)");
  EXPECT_THAT(Thrown([&] { transaction.Commit(); }), HasSubstr("INSERT INTO t VALUES(1)"));
}

TEST_F(TransactionTest, StepsThatReturnARowOrTheEndAreNotFailures) {
  Execute("INSERT INTO t VALUES(1)");
  Transaction transaction(db, 0);
  EXPECT_EQ(Step("SELECT a FROM t"), Statement::ROW);
  EXPECT_EQ(Step("INSERT INTO t VALUES(2)"), Statement::DONE);
  EXPECT_NO_THROW(transaction.Commit());
}

TEST_F(TransactionTest, AStepThatFailedBeforeItBeganDoesNotCount) {
  Execute("INSERT INTO t VALUES(1)");
  EXPECT_EQ(Step("INSERT INTO t VALUES(1)"), SQLITE_CONSTRAINT);
  Transaction transaction(db, 0);
  Execute("INSERT INTO t VALUES(2)");
  EXPECT_NO_THROW(transaction.Commit());
}

TEST_F(TransactionTest, AStepThatFailedInThePreviousTransactionDoesNotCount) {
  Execute("INSERT INTO t VALUES(1)");
  {
    const Transaction transaction(db, 0);
    EXPECT_EQ(Step("INSERT INTO t VALUES(1)"), SQLITE_CONSTRAINT);
  }
  Transaction transaction(db, 0);
  Execute("INSERT INTO t VALUES(2)");
  EXPECT_NO_THROW(transaction.Commit());
}

TEST_F(TransactionTest, ACommitThatReadersPreventFailsAndChangesNothing) {
  Execute("INSERT INTO t VALUES(1)");
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  other.exec("BEGIN; SELECT * FROM t");
  {
    Transaction transaction(db, 0);
    Execute("INSERT INTO t VALUES(2)");
    EXPECT_EQ(Thrown([&] { transaction.Commit("Caller.cpp", 30); }),
              "Caller.cpp:30: database is locked (extended code 5) in \"COMMIT\"");
  }
  other.exec("COMMIT");
  EXPECT_THAT(Saved(), ElementsAre("1"));
}

TEST_F(TransactionTest, NothingIsWrittenAfterSqliteHasRolledBackByItself) {
  Execute("INSERT INTO t VALUES(1)");
  {
    const Transaction transaction(db, 0);
    EXPECT_EQ(Step("INSERT OR ROLLBACK INTO t VALUES(1)"), SQLITE_CONSTRAINT);
    EXPECT_THAT(
        Thrown([&] { Statement(db, "INSERT INTO t VALUES(2)", "Caller.cpp", 22); }),
        AllOf(StartsWith("Caller.cpp:22: \"INSERT INTO t VALUES(2)\" in a transaction that was "
                         "rolled back: "),
              HasSubstr("UNIQUE constraint failed: t.a")));
  }
  EXPECT_THAT(Saved(), ElementsAre("1"));
  Execute("INSERT INTO t VALUES(3)");
  EXPECT_THAT(Saved(), ElementsAre("1", "3"));
}

TEST_F(TransactionTest, EndsNormallyAfterSqliteHasRolledBackByItself) {
  Execute("INSERT INTO t VALUES(1)");
  {
    Transaction transaction(db, 70);
    Execute("INSERT INTO t VALUES(2)");
    EXPECT_EQ(Step("INSERT OR ROLLBACK INTO t VALUES(1)"), SQLITE_CONSTRAINT);
    EXPECT_THROW(transaction.Commit(), std::string);
  }
  EXPECT_THAT(Saved(), ElementsAre("1"));
  EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("1000"));
}

// Read-only connections.

class ReadOnlyTransactionTest : public TransactionTest {
protected:
  ReadOnlyTransactionTest() { reader.Open(path, TestDB::Access::ReadOnly, 0, false); }

  std::vector<std::string> Read() const {
    std::vector<std::string> rows;
    Statement select(reader, "SELECT a FROM t ORDER BY a");
    while (select.Fetch()) {
      rows.push_back(select.GetText(0));
    }
    return rows;
  }

  TestDB reader;
};

TEST_F(ReadOnlyTransactionTest, DoesNotPreventWriting) {
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  const Transaction transaction(reader, 0);
  EXPECT_EQ(other.tryExec("INSERT INTO t VALUES(1)"), SQLITE_OK) << "nothing was read yet";
}

TEST_F(ReadOnlyTransactionTest, SeesOneStateWhileAnotherWrites) {
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  other.exec("PRAGMA journal_mode = WAL; INSERT INTO t VALUES(1)");
  {
    Transaction transaction(reader, 0);
    EXPECT_THAT(Read(), ElementsAre("1"));
    other.exec("INSERT INTO t VALUES(2)");
    EXPECT_THAT(Saved(), ElementsAre("1", "2"));
    EXPECT_THAT(Read(), ElementsAre("1"));
    transaction.Commit();
  }
  EXPECT_THAT(Read(), ElementsAre("1", "2"));
}

TEST_F(ReadOnlyTransactionTest, PreventsAWriterWithARollbackJournal) {
  Execute("INSERT INTO t VALUES(1)");
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  {
    const Transaction transaction(reader, 0);
    EXPECT_THAT(Read(), ElementsAre("1"));
    EXPECT_EQ(other.tryExec("INSERT INTO t VALUES(2)"), SQLITE_BUSY);
    EXPECT_THAT(Read(), ElementsAre("1"));
  }
  EXPECT_EQ(other.tryExec("INSERT INTO t VALUES(2)"), SQLITE_OK);
  EXPECT_THAT(Read(), ElementsAre("1", "2"));
}

TEST_F(ReadOnlyTransactionTest, AFailedReadMakesTheCommitFail) {
  SQLite::Database other(path, SQLite::OPEN_READWRITE);
  EXPECT_THAT(Read(), IsEmpty()); // so that the schema is known and the statement compiled
  Transaction transaction(reader, 0);
  other.exec("BEGIN EXCLUSIVE");
  EXPECT_EQ(Statement(reader, "SELECT a FROM t ORDER BY a").Step("Inner.cpp", 11), SQLITE_BUSY);
  EXPECT_THAT(Thrown([&] { transaction.Commit(); }), HasSubstr("Inner.cpp:11: database is locked"));
}

} // namespace
} // namespace orva::db

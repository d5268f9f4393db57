// Hostile merged databases on a volume that becomes the master: with triggers, views and computed
// values, with pages that several pages point to, and with crafted journals and logs.

#include "HostileTest.h"
#include "SpecialFile.h"

#include "support/OtherUsers.h"

#include <filesystem>
#include <random>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::SizeIs;
using ::testing::StartsWith;

/// A merged database, changed by these statements, and the possible outcomes.
struct Case {
  std::string name;
  std::vector<std::string> statements;
  enum class Expected { Works, Refused, Either } expected;
};

const auto WORKS = Case::Expected::Works;
const auto REFUSED = Case::Expected::Refused;
const auto EITHER = Case::Expected::Either;

const std::string EXPENSIVE_VALUE = ExpensiveValue("'x'");

std::vector<std::string> TriggersOn(const std::string& table, const std::string& action) {
  std::vector<std::string> triggers;
  for (const char* const event : {"INSERT", "UPDATE", "DELETE"}) {
    for (const char* const time : {"BEFORE", "AFTER"}) {
      triggers.push_back("CREATE TRIGGER t" + table + event + time + " " + time + " " + event +
                         " ON " + table + " BEGIN " + action + "; END");
    }
  }
  return triggers;
}

std::vector<std::string> TriggersOnAll(const std::string& action,
                                       std::vector<std::string> first = {}) {
  for (const char* const table : {"Folders", "Files", "Statistics", "Status"}) {
    for (const std::string& trigger : TriggersOn(table, action)) {
      first.push_back(trigger);
    }
  }
  return first;
}

/// Replaces the Files table with an empty one that has `column` instead of created_date, and
/// `more`.
std::vector<std::string> FilesWith(const std::string& column, const std::string& more = "") {
  return {"DROP TABLE Files",
          "CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER NOT "
          "NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, " +
              column + more + ")"};
}

const std::string CREATED = "created_date INTEGER NOT NULL";

std::vector<std::string> ManyIndexes(int count) {
  std::vector<std::string> statements{"BEGIN"};
  for (int i = 0; i < count; ++i) {
    statements.push_back("CREATE INDEX more" + std::to_string(i) + " ON Files(name)");
  }
  statements.emplace_back("COMMIT");
  return statements;
}

const std::vector<Case> CASES = {
    {"TriggersThatFillTheFile",
     TriggersOnAll("INSERT INTO Others " + ENDLESS + "SELECT x FROM n", {"CREATE TABLE Others(a)"}),
     WORKS},
    {"TriggersThatEmptyTables", TriggersOnAll("DELETE FROM Folders"), WORKS},
    {"TriggersThatFail", TriggersOnAll("SELECT RAISE(ABORT, 'no')"), WORKS},
    {"FilesAreAView",
     {"ALTER TABLE Files RENAME TO Others", "CREATE VIEW Files AS SELECT * FROM Others"},
     REFUSED},
    {"FilesAreAnEndlessView",
     {"DROP TABLE Files", "CREATE VIEW Files(file_id, folder_id, name, modified_date, volume, "
                          "created_date) AS " +
                              ENDLESS + "SELECT x, x, 'n', 1, 'v', 1 FROM n"},
     REFUSED},
    {"StatusIsAnEndlessView",
     {"DROP TABLE Status", "CREATE VIEW Status(id, mc_version, mdate, desc, etype) AS " + ENDLESS +
                               "SELECT x, 'v', 1, 'd', 1 FROM n WHERE x < 0"},
     REFUSED},
    {"ViewWithAnInsertTrigger",
     {"ALTER TABLE Files RENAME TO Others", "CREATE VIEW Files AS SELECT * FROM Others",
      "CREATE TRIGGER t INSTEAD OF INSERT ON Files BEGIN DELETE FROM Folders; END"},
     REFUSED},
    {"FilesAreAFullTextTable",
     {"DROP TABLE Files", "CREATE VIRTUAL TABLE Files USING fts5(file_id, folder_id, name, "
                          "modified_date, volume, created_date)"},
     REFUSED},
    {"FoldersAreADbstatTable",
     {"DROP TABLE Folders", "CREATE VIRTUAL TABLE Folders USING dbstat"},
     REFUSED},
    {"GeneratedColumn", FilesWith(CREATED, ", more AS (" + EXPENSIVE_VALUE + ")"), REFUSED},
    {"StoredGeneratedColumn", FilesWith(CREATED, ", more AS (" + EXPENSIVE_VALUE + ") STORED"),
     REFUSED},
    {"ChecksThatTakeSeconds", FilesWith(CREATED + " CHECK (" + EXPENSIVE_VALUE + " >= 0)"), WORKS},
    {"DefaultsThatTakeSeconds", FilesWith(CREATED, ", more DEFAULT (" + EXPENSIVE_VALUE + ")"),
     REFUSED},
    {"IndexOnAnExpression", {"CREATE INDEX more ON Files(name || 'x')"}, REFUSED},
    {"IndexOnPartOfTheRows", {"CREATE INDEX more ON Files(name) WHERE length(name) > 1"}, REFUSED},
    // References are not followed, with any action for a deleted row.
    {"ReferencesThatSetAnExpensiveDefault",
     {"CREATE TABLE Others(a DEFAULT (" + EXPENSIVE_VALUE +
          ") REFERENCES Folders(folder_id) ON DELETE SET DEFAULT)",
      "INSERT INTO Others " + Rows(20) + "SELECT folder_id FROM Folders, n WHERE folder_id > 1"},
     WORKS},
    {"ReferencesThatKeepTheirRows",
     {"CREATE TABLE Others(a REFERENCES Folders(folder_id), b REFERENCES Files(file_id))",
      "INSERT INTO Others SELECT folder_id, file_id FROM Files"},
     WORKS},

    {"TableIsMissing", {"DROP TABLE Statistics"}, EITHER},
    {"StatusIsEmpty", {"DELETE FROM Status"}, WORKS},
    {"EverythingIsEmpty",
     {"DELETE FROM Status", "DELETE FROM Folders", "DELETE FROM Files", "DELETE FROM Statistics",
      "DELETE FROM sqlite_sequence"},
     EITHER},
    {"ColumnIsMissing", {"ALTER TABLE Files DROP COLUMN created_date"}, EITHER},
    {"FurtherColumns",
     {"ALTER TABLE Files ADD COLUMN more", "ALTER TABLE Folders ADD COLUMN more",
      "ALTER TABLE Statistics ADD COLUMN more", "ALTER TABLE Status ADD COLUMN more"},
     WORKS},
    {"OtherTypes",
     {"UPDATE Status SET mc_version = x'00ff', desc = zeroblob(1000), etype = 1e300, mdate = 'x'",
      "UPDATE Statistics SET last_updated_time = 'never', photos_total = x'00'",
      "UPDATE Folders SET modified_date = 'x' WHERE folder_id > 1"},
     EITHER},
    {"LongVersion", {"UPDATE Status SET mc_version = zeroblob(20000000)"}, REFUSED},
    {"ManyFoldersOfOneName",
     {"INSERT INTO Folders(parent_folder_id, name, modified_date, volume) " +
      Rows(TestScale(100'000, 1'000'000)) + "SELECT 1, '/shares/Good/a/', 0, 'x' FROM n"},
     EITHER},
    {"ManyFilesOfOneName",
     {"INSERT INTO Files(folder_id, name, modified_date, volume, created_date) " +
      Rows(TestScale(100'000, 1'000'000)) + "SELECT 2, 'top.jpg', 0, 'x', 0 FROM n"},
     EITHER},
    {"ManyStatisticsOfOneVolume",
     {"INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) " +
      Rows(TestScale(100'000, 1'000'000)) + "SELECT '/shares/Good/', 0, 0, 0 FROM n"},
     EITHER},
    {"ManyStatusRows",
     {"INSERT INTO Status(mc_version, mdate) " + Rows(TestScale(100'000, 1'000'000)) +
      "SELECT 'x', 0 FROM n"},
     EITHER},
    {"FoldersThatAreTheirOwnParents", {"UPDATE Folders SET parent_folder_id = folder_id"}, EITHER},
    {"ManyIndexes", ManyIndexes(TestScale(500, 5'000)), EITHER},
    {"RowsThatReplaceOthers", FilesWith("created_date INTEGER UNIQUE ON CONFLICT REPLACE"), EITHER},

    {"InAWriteAheadLog", {"PRAGMA journal_mode = WAL"}, WORKS},
    {"InSmallPages", {"PRAGMA page_size = 512", "VACUUM"}, WORKS},
    {"InLargePages", {"PRAGMA page_size = 65536", "VACUUM"}, WORKS},
    {"WithAutoVacuum", {"PRAGMA auto_vacuum = 1", "VACUUM"}, WORKS},
    {"WithWrongStatistics",
     {"ANALYZE", "UPDATE sqlite_stat1 SET stat = '1000000000 1000000000'"},
     WORKS},
};

void PrintTo(const Case& tested, std::ostream* stream) {
  *stream << tested.name;
}

class MergedDatabaseTest : public HostileTest {
protected:
  /// Uses the master and expects everything to work.
  void ExpectUsable() { EXPECT_THAT(UseHostileMaster(), ElementsAre("", "", "", "", "", "")); }

  /// Uses the master and expects every operation on its database to fail.
  void ExpectRefused() {
    const auto results = UseHostileMaster();
    ASSERT_THAT(results, SizeIs(7));
    EXPECT_THAT(results[0], StartsWith("Error that we will ignore "));
    for (const std::size_t thrown : {1U, 3U, 4U}) {
      EXPECT_THAT(results[thrown], StartsWith("std::string: "));
    }
  }

  static void Run(const std::vector<std::string>& statements) {
    const Database merged(MERGED);
    for (const std::string& statement : statements) {
      merged.Run(statement);
    }
  }
};

class MergedContentTest : public MergedDatabaseTest, public ::testing::WithParamInterface<Case> {};

TEST_P(MergedContentTest, MasterWorksOrIsRefused) {
  Run(GetParam().statements);
  switch (GetParam().expected) {
  case Case::Expected::Works:
    ExpectUsable();
    break;
  case Case::Expected::Refused:
    EXPECT_THAT(UseHostileMaster().at(0), StartsWith("Error that we will ignore "));
    break;
  case Case::Expected::Either:
    UseHostileMaster();
    break;
  }
}

INSTANTIATE_TEST_SUITE_P(MergedDatabases, MergedContentTest, ::testing::ValuesIn(CASES),
                         [](const auto& tested) { return tested.param.name; });

TEST_F(MergedDatabaseTest, TriggersWriteNothing) {
  Run(TriggersOnAll("INSERT INTO Others VALUES(1)", {"CREATE TABLE Others(a)"}));
  ExpectUsable();
  EXPECT_THAT(MergedRows(MASTER, "SELECT count(*) FROM Others"), ElementsAre("0"));
}

// Pages.

TEST_F(MergedDatabaseTest, OperationsOnEndlessRowsEnd) {
  for (const char* const table : {"Status", "Statistics", "Folders", "Files", "sqlite_sequence"}) {
    for (const unsigned levels : {1U, 12U}) {
      SCOPED_TRACE(std::string(table) + " " + std::to_string(levels));
      RestoreMaster();
      const std::uint32_t root = RootPage(MERGED, table);
      CraftedDatabase merged(MERGED);
      merged.Multiply(root, levels);
      merged.Save();
      UseHostileMaster();
    }
  }
}

TEST_F(MergedDatabaseTest, OperationsOnEndlessRowsWithoutIndexesFail) {
  for (const char* const table : {"Folders", "Files"}) {
    SCOPED_TRACE(table);
    RestoreMaster();
    Run({"DROP INDEX Folders_folderId", "DROP INDEX Folders_path", "DROP INDEX Files_folderId",
         "DROP INDEX Files_name"});
    const std::uint32_t root = RootPage(MERGED, table);
    CraftedDatabase merged(MERGED);
    merged.Multiply(root, 12);
    merged.Save();
    // SQLite may notice repeated rows before they are too many.
    EXPECT_THAT(UseHostileMaster(),
                Contains(::testing::AnyOf(HasSubstr("more work"), HasSubstr("malformed"))));
  }
}

TEST_F(MergedDatabaseTest, EndlessSchemaIsRefused) {
  Run({"CREATE TABLE Last(a UNIQUE)"});
  CraftedDatabase merged(MERGED);
  const std::uint32_t repeated = merged.CopyOf(1);
  merged.RepeatCell(repeated, merged.Cells(repeated) - 1);
  merged.MultiplyAfter(1, repeated, 12);
  merged.Save();
  ExpectRefused();
}

// Files.

TEST_F(MergedDatabaseTest, FilesThatAreNotDatabasesAreRefused) {
  for (const std::string& content : {std::string("what is this"), std::string(100'000, 'x'),
                                     std::string("SQLite format 3\0", 16)}) {
    SCOPED_TRACE(content.size());
    Bytes({content.begin(), content.end()}).Save(MERGED);
    ExpectRefused();
  }
}

TEST_F(MergedDatabaseTest, OperationsOnTruncatedDatabasesEnd) {
  const Bytes whole = Bytes::Of(MERGED);
  for (std::size_t size = 0; size < whole.Size(); size += 4096) {
    for (const std::size_t more : {0U, 1U, 4095U}) {
      SCOPED_TRACE(size + more);
      RestoreMaster();
      whole.Part(0, size + more).Save(MERGED);
      UseHostileMaster();
    }
  }
}

TEST_F(MergedDatabaseTest, OperationsOnRandomlyChangedDatabasesEnd) {
  const unsigned mutants = TestScale(50U, 5'000U);
  Run({"PRAGMA page_size = 512", "VACUUM"});
  const Bytes whole = Bytes::Of(MERGED);
  for (unsigned seed = 0; seed < mutants && !HasFailure(); ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    std::mt19937 random(seed);
    RestoreMaster();
    Bytes mutant = whole;
    Mutate(mutant, 512, random);
    mutant.Save(MERGED);
    UseHostileMaster();
  }
  ReportFigure("mutants of a merged database used as the master's", std::to_string(mutants));
}

// Rollback journals and logs.

TEST_F(MergedDatabaseTest, JournalDoesNotDeleteTheFileThatItNames) {
  const Bytes page = Bytes::Of(MERGED).Part(0, 4096);
  for (const std::string& victim :
       {VICTIM, std::string("/tmp/victim"), MASTER + "../Decoy/victim"}) {
    for (const bool isDatabaseThere : {true, false}) {
      SCOPED_TRACE(victim);
      RestoreMaster();
      CraftedJournal(4096, 2, {{1, page}}, victim).Save(MERGED + "-journal");
      if (isDatabaseThere) {
        ExpectRefused();
      } else {
        fs::remove(MERGED);
        UseHostileMaster();
      }
    }
  }
}

TEST_F(MergedDatabaseTest, JournalDoesNotEnlargeTheDatabase) {
  const Bytes page = Bytes::Of(MERGED).Part(0, 4096);
  for (const std::uint32_t pages : {0U, 1U, 1000U, 0x7fffffffU}) {
    SCOPED_TRACE(pages);
    RestoreMaster();
    CraftedJournal(4096, pages, {{1, page}}).Save(MERGED + "-journal");
    UseHostileMaster();
    EXPECT_GT(16LL << 20U, BytesOnMedium(MASTER));
  }
}

TEST_F(MergedDatabaseTest, HardLinkAsTheJournalChangesNoOtherFile) {
  SKIP_WITHOUT_OTHER_USERS();
  fs::remove(MERGED + "-journal");
  fs::create_hard_link(VICTIM, MERGED + "-journal");
  ASSERT_EQ(0, chown(MERGED.c_str(), 1, 1));
  UseHostileMaster();
}

TEST_F(MergedDatabaseTest, LogDoesNotEnlargeTheDatabase) {
  Run({"PRAGMA journal_mode = WAL"});
  Bytes page = Bytes::Of(MERGED).Part(0, 4096);
  page.Write(28, 4, 0x7fffffff);
  for (const std::uint32_t pages : {1U, 0x7fffffffU}) {
    CraftedWal(4096, pages, {{1, page}}).Save(MERGED + "-wal");
    UseHostileMaster();
    EXPECT_GT(16LL << 20U, BytesOnMedium(MASTER));
    RestoreMaster();
    Run({"PRAGMA journal_mode = WAL"});
  }
}

TEST_F(MergedDatabaseTest, HardLinkAsTheDatabaseOrItsLogsChangesNoOtherFile) {
  for (const char* const suffix : {"", "-journal", "-wal", "-shm"}) {
    SCOPED_TRACE(suffix);
    RestoreMaster();
    Run({"PRAGMA journal_mode = WAL"});
    // Only a valid database is written.
    const std::string name = MERGED + suffix;
    if (*suffix == '\0') {
      fs::copy_file(MERGED, DECOY + "other.db");
      fs::remove(MERGED);
      fs::create_hard_link(DECOY + "other.db", MERGED);
    } else {
      fs::create_hard_link(VICTIM, name);
    }
    UseHostileMaster();
    fs::remove(name);
  }
}

} // namespace
} // namespace orva::test

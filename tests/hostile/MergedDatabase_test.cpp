// The merged database that a plugged volume brings along, when that becomes the master: SQLite's
// own program in its schema, pages joined as SQLite never joins them, and a past that it would
// have SQLite undo.

#include "HostileTest.h"
#include "SpecialFile.h"

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

/// A merged database, changed by these statements, and what may come of it.
struct Case {
  std::string name;
  std::vector<std::string> statements;
  enum class Expected { Works, Refused, Either } expected;
};

const auto WORKS = Case::Expected::Works;
const auto REFUSED = Case::Expected::Refused;
const auto EITHER = Case::Expected::Either;

/// Seconds for one value, in one call.
const std::string DEAR_VALUE =
    "instr(hex(zeroblob(500000)), hex(zeroblob(200000)) || 'x' || hex(zeroblob(200000)))";

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

/// The Files table anew, empty, with `column` in place of its created_date, and `behind` it.
std::vector<std::string> FilesWith(const std::string& column, const std::string& behind = "") {
  return {"DROP TABLE Files",
          "CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER NOT "
          "NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, " +
              column + behind + ")"};
}

const std::string CREATED = "created_date INTEGER NOT NULL";

std::vector<std::string> ManyIndices(int count) {
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
    {"ViewThatTakesWhatIsWritten",
     {"ALTER TABLE Files RENAME TO Others", "CREATE VIEW Files AS SELECT * FROM Others",
      "CREATE TRIGGER t INSTEAD OF INSERT ON Files BEGIN DELETE FROM Folders; END"},
     REFUSED},
    {"FilesAreAFullTextTable",
     {"DROP TABLE Files", "CREATE VIRTUAL TABLE Files USING fts5(file_id, folder_id, name, "
                          "modified_date, volume, created_date)"},
     REFUSED},
    {"FoldersAreThePagesOfTheFile",
     {"DROP TABLE Folders", "CREATE VIRTUAL TABLE Folders USING dbstat"},
     REFUSED},
    {"GeneratedColumn", FilesWith(CREATED, ", more AS (" + DEAR_VALUE + ")"), REFUSED},
    {"StoredGeneratedColumn", FilesWith(CREATED, ", more AS (" + DEAR_VALUE + ") STORED"), REFUSED},
    {"ChecksThatTakeSeconds", FilesWith(CREATED + " CHECK (" + DEAR_VALUE + " >= 0)"), WORKS},
    {"DefaultsThatTakeSeconds", FilesWith(CREATED, ", more DEFAULT (" + DEAR_VALUE + ")"), REFUSED},
    {"IndexOnAnExpression", {"CREATE INDEX more ON Files(name || 'x')"}, REFUSED},
    {"IndexOnPartOfTheRows", {"CREATE INDEX more ON Files(name) WHERE length(name) > 1"}, REFUSED},
    // References are not followed, whatever they ask for when a row goes.
    {"ReferencesThatSetADearDefault",
     {"CREATE TABLE Others(a DEFAULT (" + DEAR_VALUE +
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
    {"FoldersOfTheirOwn", {"UPDATE Folders SET parent_folder_id = folder_id"}, EITHER},
    {"ManyIndices", ManyIndices(TestScale(500, 5'000)), EITHER},
    {"RowsThatReplaceOthers", FilesWith("created_date INTEGER UNIQUE ON CONFLICT REPLACE"), EITHER},

    {"InAWriteAheadLog", {"PRAGMA journal_mode = WAL"}, WORKS},
    {"InSmallPages", {"PRAGMA page_size = 512", "VACUUM"}, WORKS},
    {"InLargePages", {"PRAGMA page_size = 65536", "VACUUM"}, WORKS},
    {"InAFileThatShrinks", {"PRAGMA auto_vacuum = 1", "VACUUM"}, WORKS},
    {"WithStatisticsThatLie",
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

  /// Uses the master and expects that nothing but that can be done; each operation says so.
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

  static std::uint32_t RootOf(const std::string& name) {
    return static_cast<std::uint32_t>(std::stoul(
        Database(MERGED).Run("SELECT rootpage FROM sqlite_schema WHERE name = ?", {name}).at(0)));
  }
};

class MergedContentTest : public MergedDatabaseTest, public ::testing::WithParamInterface<Case> {};

TEST_P(MergedContentTest, Master) {
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

TEST_F(MergedDatabaseTest, RowsWithoutEnd) {
  for (const char* const table : {"Status", "Statistics", "Folders", "Files", "sqlite_sequence"}) {
    for (const unsigned levels : {1U, 12U}) {
      SCOPED_TRACE(std::string(table) + " " + std::to_string(levels));
      RestoreMaster();
      const std::uint32_t root = RootOf(table);
      CraftedDatabase merged(MERGED);
      merged.Multiply(root, levels);
      merged.Save();
      UseHostileMaster();
    }
  }
}

TEST_F(MergedDatabaseTest, RowsWithoutEndAndNoIndices) {
  for (const char* const table : {"Folders", "Files"}) {
    SCOPED_TRACE(table);
    RestoreMaster();
    Run({"DROP INDEX Folders_folderId", "DROP INDEX Folders_path", "DROP INDEX Files_folderId",
         "DROP INDEX Files_name"});
    const std::uint32_t root = RootOf(table);
    CraftedDatabase merged(MERGED);
    merged.Multiply(root, 12);
    merged.Save();
    // Rows that go twice show that the file is broken before they are too many.
    EXPECT_THAT(UseHostileMaster(),
                Contains(::testing::AnyOf(HasSubstr("more work"), HasSubstr("malformed"))));
  }
}

TEST_F(MergedDatabaseTest, SchemaWithoutEnd) {
  Run({"CREATE TABLE Last(a UNIQUE)"});
  CraftedDatabase merged(MERGED);
  const std::uint32_t repeated = merged.CopyOf(1);
  merged.RepeatCell(repeated, merged.Cells(repeated) - 1);
  merged.MultiplyBehind(1, repeated, 12);
  merged.Save();
  ExpectRefused();
}

// Files.

TEST_F(MergedDatabaseTest, NothingThatIsADatabase) {
  for (const std::string& content : {std::string("what is this"), std::string(100'000, 'x'),
                                     std::string("SQLite format 3\0", 16)}) {
    SCOPED_TRACE(content.size());
    Bytes({content.begin(), content.end()}).Save(MERGED);
    ExpectRefused();
  }
}

TEST_F(MergedDatabaseTest, CutAnywhere) {
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

TEST_F(MergedDatabaseTest, RandomBytesChanged) {
  const unsigned mutants = TestScale(50U, 5'000U);
  Run({"PRAGMA page_size = 512", "VACUUM"});
  const Bytes whole = Bytes::Of(MERGED);
  for (unsigned seed = 0; seed < mutants && !HasFailure(); ++seed) {
    SCOPED_TRACE("seed " + std::to_string(seed));
    std::mt19937 random(seed);
    const auto below = [&](std::size_t end) {
      return std::uniform_int_distribution<std::size_t>(0, end - 1)(random);
    };
    RestoreMaster();
    Bytes mutant = whole;
    for (std::size_t changes = 1 + below(8); changes > 0; --changes) {
      mutant[below(mutant.Size() / 512) * 512 + below(below(2) == 0 ? 120 : 512)] =
          static_cast<std::uint8_t>(below(256));
    }
    mutant.Save(MERGED);
    UseHostileMaster();
  }
  ReportFigure("mutants of a merged database used as the master's", std::to_string(mutants));
}

// What undoing a transaction touches beyond the database.

TEST_F(MergedDatabaseTest, JournalThatNamesAFileElsewhere) {
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

// The same, with something behind the name, where SQLite looks from the front.
TEST_F(MergedDatabaseTest, JournalOfGarbage) {
  const Bytes page = Bytes::Of(MERGED).Part(0, 4096);
  for (const std::uint32_t pages : {0U, 1U, 1000U, 0x7fffffffU}) {
    SCOPED_TRACE(pages);
    RestoreMaster();
    CraftedJournal(4096, pages, {{1, page}}).Save(MERGED + "-journal");
    UseHostileMaster();
    EXPECT_GT(16LL << 20U, BytesOnMedium(MASTER));
  }
}

TEST_F(MergedDatabaseTest, JournalWhoseOwnerIsNotTheDatabases) {
  fs::remove(MERGED + "-journal");
  fs::create_hard_link(VICTIM, MERGED + "-journal");
  ASSERT_EQ(0, chown(MERGED.c_str(), 1, 1));
  UseHostileMaster();
}

TEST_F(MergedDatabaseTest, LogOfAnotherDatabase) {
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

TEST_F(MergedDatabaseTest, AnotherNameOfADearFile) {
  for (const char* const suffix : {"", "-journal", "-wal", "-shm"}) {
    SCOPED_TRACE(suffix);
    RestoreMaster();
    Run({"PRAGMA journal_mode = WAL"});
    // The database itself would have to be one to be written to.
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

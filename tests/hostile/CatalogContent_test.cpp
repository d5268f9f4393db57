// Catalogs that are valid for SQLite but not what the indexer makes: other objects in place of
// tables, other columns, other values, and too many or too large ones.

#include "HostileTest.h"

#include <filesystem>

namespace orva::test {
namespace {

/// A catalog with some photos, changed by these statements, and the possible outcomes.
struct Case {
  std::string name;
  std::vector<std::string> statements;
  enum class Expected { Merged, Refused, Either } expected;
};

const auto MERGED_WELL = Case::Expected::Merged;
const auto REFUSED = Case::Expected::Refused;
const auto EITHER = Case::Expected::Either;

/// The values of a folder.
const std::string FOLDER_VALUES = "x, -1, 'p' || x || '/', 'n', 4, 0, 0, 0, 0, 0, 0, 0";

const std::string FOLDER_COLUMNS =
    "id INTEGER PRIMARY KEY, folderId INTEGER, path TEXT, name TEXT, category INTEGER, "
    "lastModifiedDate INTEGER, isBackup INTEGER, isHidden INTEGER, isSystem INTEGER, isDeleted "
    "INTEGER, status INTEGER, lastUpdatedDate INTEGER";
const std::string FILE_COLUMNS = FOLDER_COLUMNS + ", ext TEXT, size INTEGER";
const std::string FOLDER_NAMES =
    "(id, folderId, path, name, category, lastModifiedDate, isBackup, isHidden, isSystem, isDeleted, status, lastUpdatedDate)";

std::string Replaced(std::string text, const std::string& old, const std::string& by) {
  return text.replace(text.find(old), old.size(), by);
}

/// Replaces the Folders table with an empty one with other columns.
std::vector<std::string> FoldersOf(const std::string& columns, std::vector<std::string> more = {}) {
  std::vector<std::string> statements{"DROP TABLE Folders",
                                      "CREATE TABLE Folders(" + columns + ")"};
  statements.insert(statements.end(), more.begin(), more.end());
  return statements;
}

/// Changes the declaration of a table without its rows.
std::vector<std::string> Redeclared(const std::string& table, const std::string& old,
                                    const std::string& by) {
  return {"PRAGMA writable_schema = ON", "UPDATE sqlite_schema SET sql = replace(sql, '" + old +
                                             "', '" + by + "') WHERE name = '" + table + "'"};
}

/// Folders for a table of FoldersOf, without a value for the path.
const std::string FOLDER_ROWS_BUT_PATH =
    "INSERT INTO Folders(id, folderId, name, category, lastModifiedDate, isBackup, isHidden, "
    "isSystem, isDeleted, status, lastUpdatedDate) " +
    Rows(100) + "SELECT x, -1, 'n', 4, 0, 0, 0, 0, 0, 0, 0 FROM n";

/// Very many folders with the same path, which are `deleted` or not.
std::vector<std::string> FoldersOfOnePath(const std::string& deleted) {
  return {"INSERT INTO Folders " + Rows(TestScale(50'000, 1'000'000)) +
          "SELECT x + 10, -1, 'a/', 'a', 4, 0, 0, 0, 0, " + deleted + ", 0, 0 FROM n"};
}

/// Many rows of one file, and many transcodings of it with that `status`, with some indexes.
std::vector<std::string> FilesTimesTranscodings(const std::string& status,
                                                const std::vector<std::string>& indexes = {}) {
  std::vector<std::string> statements{
      "DROP TABLE Files", "CREATE TABLE Files(" + Replaced(FILE_COLUMNS, " PRIMARY KEY", "") + ")"};
  statements.insert(statements.end(), indexes.begin(), indexes.end());
  statements.push_back("INSERT INTO Files " + Rows(30'000) +
                       "SELECT 1, -1, 'a.jpg', 'a.jpg', 3, 0, 0, 0, 0, 0, 3, 0, 'jpg', 0 FROM n");
  statements.push_back("INSERT INTO Transcodings " + Rows(30'000) +
                       "SELECT x + 10, 1, 'cb62bbdd389b48898f2e5244977cb2c5', " + status +
                       ", x FROM n");
  return statements;
}

const std::string MEGABYTE = "hex(zeroblob(500000))";
const std::string EXPENSIVE_VALUE = ExpensiveValue("id");

const std::vector<Case> CASES = {
    // Objects other than tables.
    {"FoldersAreAView",
     {"ALTER TABLE Folders RENAME TO Others", "CREATE VIEW Folders AS SELECT * FROM Others"},
     REFUSED},
    {"FoldersAreAnEndlessView",
     {"DROP TABLE Folders", "CREATE VIEW Folders" + FOLDER_NAMES + " AS " + ENDLESS + "SELECT " +
                                FOLDER_VALUES + " FROM n"},
     REFUSED},
    {"FoldersAreAHugeView",
     {"DROP TABLE Folders", "CREATE VIEW Folders" + FOLDER_NAMES + " AS " + Rows(1'000'000'000) +
                                "SELECT " + FOLDER_VALUES + " FROM n"},
     REFUSED},
    {"FilesAreAnEndlessView",
     {"DROP TABLE Files",
      "CREATE VIEW Files AS " + ENDLESS +
          "SELECT x id, -1 folderId, 'p' path, 'n' name, 3 category, 0 "
          "lastModifiedDate, 0 isBackup, 0 isHidden, 0 isSystem, 0 isDeleted, 3 "
          "status, 0 lastUpdatedDate, '' ext, 0 size FROM n"},
     REFUSED},
    {"TranscodingsAreAnEndlessView",
     {"DROP TABLE Transcodings", "CREATE VIEW Transcodings AS " + ENDLESS +
                                     "SELECT x id, 1 sourceId, "
                                     "'cb62bbdd389b48898f2e5244977cb2c5' profile, 1 status, x "
                                     "lastUpdatedDate FROM n"},
     REFUSED},
    {"FoldersAreAFullTextTable",
     {"DROP TABLE Folders",
      "CREATE VIRTUAL TABLE Folders USING fts5(id, folderId, path, name, category, "
      "lastModifiedDate, isBackup, isHidden, isSystem, isDeleted, status, lastUpdatedDate)"},
     REFUSED},
    {"TranscodingsAreAnRTree",
     {"DROP TABLE Transcodings",
      "CREATE VIRTUAL TABLE Transcodings USING rtree(sourceId, status, lastUpdatedDate, +profile)"},
     REFUSED},
    {"FoldersAreADbstatTable",
     {"DROP TABLE Folders", "CREATE VIRTUAL TABLE Folders USING dbstat"},
     REFUSED},
    {"TriggersInTheCatalog",
     {"CREATE TRIGGER a AFTER INSERT ON Files BEGIN INSERT INTO Files SELECT * FROM Files; END",
      "CREATE TRIGGER b AFTER DELETE ON Files BEGIN DELETE FROM Folders; END"},
     MERGED_WELL},

    // Computed columns.
    {"PathIsComputed",
     FoldersOf(Replaced(FOLDER_COLUMNS, "path TEXT", "path TEXT AS ('p' || id) VIRTUAL"),
               {FOLDER_ROWS_BUT_PATH}),
     REFUSED},
    {"PathIsAComputedMegabyte",
     FoldersOf(Replaced(FOLDER_COLUMNS, "path TEXT", "path TEXT AS (" + MEGABYTE + ") VIRTUAL"),
               {FOLDER_ROWS_BUT_PATH}),
     REFUSED},
    {"PathTakesSecondsToCompute",
     Redeclared("Folders", "path TEXT", "path TEXT AS (" + EXPENSIVE_VALUE + ") VIRTUAL"), REFUSED},
    {"PathIsStoredComputed",
     FoldersOf(Replaced(FOLDER_COLUMNS, "path TEXT", "path TEXT AS ('p' || id) STORED"),
               {FOLDER_ROWS_BUT_PATH}),
     REFUSED},
    {"FurtherColumnTakesSecondsToCompute",
     Redeclared("Folders", "lastUpdatedDate INTEGER",
                "lastUpdatedDate INTEGER, more AS (" + EXPENSIVE_VALUE + ") VIRTUAL"),
     REFUSED},
    {"FlagTakesSecondsToCompute",
     Redeclared("Files", "isHidden INTEGER",
                "isHidden INTEGER AS (" + EXPENSIVE_VALUE + ") VIRTUAL"),
     REFUSED},
    {"StatusOfTranscodingsTakesSecondsToCompute",
     Redeclared("Transcodings", "status INTEGER",
                "status INTEGER AS (" + EXPENSIVE_VALUE + ") VIRTUAL"),
     REFUSED},

    // Checks, defaults and collations.
    {"ChecksThatTakeSeconds",
     Redeclared("Folders", "path TEXT", "path TEXT CHECK (" + EXPENSIVE_VALUE + " >= 0)"),
     MERGED_WELL},
    {"DefaultsThatTakeSeconds",
     FoldersOf(FOLDER_COLUMNS + ", more DEFAULT (" + ExpensiveValue("1") + ")"), EITHER},
    {"UnknownCollation", Redeclared("Transcodings", "profile TEXT", "profile TEXT COLLATE other"),
     REFUSED},

    // Error messages that are too long for the log.
    {"ErrorWithALongTableName",
     {"PRAGMA writable_schema = ON",
      "UPDATE sqlite_schema SET name = printf('%.*c', 300000, 'x'), sql = 'CREATE TABLE (' WHERE "
      "name = 'Transcodings'"},
     REFUSED},
    {"ErrorWithALongColumnName",
     {"ALTER TABLE Folders ADD COLUMN more AS (1)",
      "ALTER TABLE Folders RENAME COLUMN isHidden TO \"" + std::string(300'000, 'x') + "\""},
     REFUSED},

    // Missing and additional columns.
    {"FolderColumnIsMissing", {"ALTER TABLE Folders DROP COLUMN isSystem"}, REFUSED},
    {"LastFolderColumnIsMissing", {"ALTER TABLE Folders DROP COLUMN lastUpdatedDate"}, MERGED_WELL},
    {"FileColumnIsMissing", {"ALTER TABLE Files DROP COLUMN size"}, REFUSED},
    {"TableIsMissing", {"DROP TABLE Transcodings"}, REFUSED},
    {"FurtherColumns",
     {"ALTER TABLE Folders ADD COLUMN more BLOB", "ALTER TABLE Files ADD COLUMN more BLOB",
      "ALTER TABLE Transcodings ADD COLUMN more BLOB", "UPDATE Folders SET more = zeroblob(102400)",
      "UPDATE Files SET more = zeroblob(102400)",
      "UPDATE Transcodings SET more = zeroblob(102400)"},
     MERGED_WELL},
    {"WithoutRowIds",
     FoldersOf(FOLDER_COLUMNS + ") WITHOUT ROWID --",
               {"INSERT INTO Folders VALUES(1, -1, 'a/', 'a', 4, 11, 0, 0, 0, 0, 0, 0)"}),
     MERGED_WELL},

    // Unexpected values.
    {"NullsEverywhere",
     {"INSERT INTO Folders DEFAULT VALUES", "INSERT INTO Files DEFAULT VALUES",
      "INSERT INTO Transcodings DEFAULT VALUES", "UPDATE Files SET path = NULL, name = NULL",
      "UPDATE Folders SET path = NULL"},
     MERGED_WELL},
    {"TextWithNul",
     {"UPDATE Folders SET path = 'a' || char(0) || 'b/', name = char(0)",
      "UPDATE Files SET path = char(0) || path, name = char(0), ext = char(0)"},
     MERGED_WELL},
    {"InvalidUtf8",
     {"UPDATE Folders SET path = CAST(x'fffe80c3' AS TEXT)",
      "UPDATE Files SET path = CAST(x'c0afed' AS TEXT), name = CAST(x'c0af' AS TEXT)"},
     MERGED_WELL},
    {"BlobsInTextColumns",
     {"UPDATE Folders SET path = x'ff00ff2f', name = x''", "UPDATE Files SET path = x'612f00'"},
     MERGED_WELL},
    {"TextsInNumericColumns",
     {"UPDATE Folders SET lastModifiedDate = 'soon', isDeleted = 'maybe', folderId = x'00'",
      "UPDATE Files SET lastModifiedDate = 'now', isDeleted = '0x1', size = 'much'",
      "UPDATE Transcodings SET lastUpdatedDate = 'never'"},
     MERGED_WELL},
    {"RealsAndInfinities",
     {"UPDATE Folders SET lastModifiedDate = 1e308 * 10, isDeleted = 0.5",
      "UPDATE Files SET lastModifiedDate = -1e308 * 10, size = 1e300, category = 3.0",
      "UPDATE Transcodings SET lastUpdatedDate = 1e308 * 10"},
     MERGED_WELL},
    {"IntegersOutOfRange",
     {"UPDATE Folders SET lastModifiedDate = 9223372036854775807, category = -9223372036854775808",
      "UPDATE Files SET lastModifiedDate = 4294967297, status = 4294967299",
      "UPDATE Transcodings SET lastUpdatedDate = 9223372036854775807"},
     MERGED_WELL},
    {"PathsOutsideTheVolume",
     {"UPDATE Folders SET path = '../Good/' || path", "UPDATE Files SET path = '/../../etc/passwd'",
      "INSERT INTO Folders(id, path, isBackup, isHidden, isSystem, isDeleted) VALUES(9, '../', 0, "
      "0, 0, 1), (10, '', 0, 0, 0, 1), (11, '/////', 0, 0, 0, 0)"},
     MERGED_WELL},

    // Too many and too large values.
    {"ManyFoldersOfOnePath", FoldersOfOnePath("0"), EITHER},
    {"ManyDeletedFoldersOfOnePath", FoldersOfOnePath("1"), EITHER},
    {"ProductOfFilesAndTranscodings", FilesTimesTranscodings("1"), REFUSED},
    // With these indexes the texts are compared before the ids, and differ only at their ends.
    {"ProductWithoutMatches",
     FilesTimesTranscodings("0", {"CREATE INDEX Files_id ON Files(id)",
                                  "CREATE INDEX Transcodings_source ON Transcodings(sourceId)"}),
     REFUSED},
    {"TwoMebibytesOfText",
     {"UPDATE Folders SET path = printf('%.*c/', 2097152, 'x') WHERE id = 1"},
     MERGED_WELL},
    {"TwentyMebibytesOfText",
     {"UPDATE Folders SET path = printf('%.*c/', 20971520, 'x') WHERE id = 1"},
     REFUSED},
    {"EnormousText",
     {"UPDATE Folders SET path = zeroblob(" +
      std::to_string(TestScale(64LL << 20U, (1LL << 30U) - (100LL << 20U))) + ") WHERE id = 1"},
     REFUSED},
    {"EnormousFurtherColumn",
     {"ALTER TABLE Folders ADD COLUMN more",
      "UPDATE Folders SET more = zeroblob(" + std::to_string(64LL << 20U) + ") WHERE id = 1"},
     EITHER},
    // Rows without values for the last columns have their defaults, which are in the file once.
    {"LongDefaultInManyRows",
     {"DROP TABLE Folders", "CREATE TABLE Folders(id INTEGER PRIMARY KEY, folderId)",
      "INSERT INTO Folders " + Rows(100'000) + "SELECT x, -1 FROM n",
      "ALTER TABLE Folders ADD COLUMN path DEFAULT '" + std::string(900'000, 'x') + "'",
      "ALTER TABLE Folders ADD COLUMN name", "ALTER TABLE Folders ADD COLUMN category",
      "ALTER TABLE Folders ADD COLUMN lastModifiedDate",
      "ALTER TABLE Folders ADD COLUMN isBackup DEFAULT 0",
      "ALTER TABLE Folders ADD COLUMN isHidden DEFAULT 0",
      "ALTER TABLE Folders ADD COLUMN isSystem DEFAULT 0",
      "ALTER TABLE Folders ADD COLUMN isDeleted", "ALTER TABLE Folders ADD COLUMN status",
      "ALTER TABLE Folders ADD COLUMN lastUpdatedDate"},
     REFUSED},

    // Other file formats with the same content.
    {"InUtf16", {}, MERGED_WELL},
    {"InSmallPages", {"PRAGMA page_size = 512", "VACUUM"}, MERGED_WELL},
    {"InLargePages", {"PRAGMA page_size = 65536", "VACUUM"}, MERGED_WELL},
    {"WithFullAutoVacuum", {"PRAGMA auto_vacuum = 1", "VACUUM"}, MERGED_WELL},
    {"WithIncrementalAutoVacuum", {"PRAGMA auto_vacuum = 2", "VACUUM"}, MERGED_WELL},
    {"WithWrongStatistics",
     {"CREATE INDEX Transcodings_sourceId ON Transcodings(sourceId)", "ANALYZE",
      "UPDATE sqlite_stat1 SET stat = '1000000000 1'",
      "INSERT INTO sqlite_stat1 VALUES('Files', NULL, '99999999999999999999'), ('Folders', NULL, "
      "'-1'), ('Nothing', 'nothing', x'ff')"},
     MERGED_WELL},
};

/// For the name of the test.
void PrintTo(const Case& tested, std::ostream* stream) {
  *stream << tested.name;
}

class CatalogContentTest : public HostileTest, public ::testing::WithParamInterface<Case> {};

TEST_P(CatalogContentTest, IsMergedOrRefused) {
  std::filesystem::create_directories(core::GetORVA_HOME(VOLUME));
  if (GetParam().name == "InUtf16") {
    const Database catalog(CATALOG, true);
    catalog.Run("PRAGMA encoding = 'UTF-16le'");
    catalog.Run("CREATE TABLE Fixed(a)");
  }
  {
    Catalog catalog(VOLUME);
    AddPhotos(catalog);
  }
  {
    const Database catalog(CATALOG);
    for (const std::string& statement : GetParam().statements) {
      catalog.Run(statement);
    }
  }
  const Outcome outcome = MergeHostileVolume();
  EXPECT_NE(Outcome::Broken, outcome);
  if (GetParam().expected != EITHER) {
    EXPECT_EQ(GetParam().expected == REFUSED ? Outcome::Refused : Outcome::Merged, outcome)
        << Refusal();
  }
}

INSTANTIATE_TEST_SUITE_P(Catalogs, CatalogContentTest, ::testing::ValuesIn(CASES),
                         [](const auto& tested) { return tested.param.name; });

} // namespace
} // namespace orva::test

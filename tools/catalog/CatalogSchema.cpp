#include "CatalogSchema.h"

#include "Sql.h"

#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <sstream>
#include <system_error>

namespace orva::catalog {
namespace {

void CreateHome(const std::string& mountPoint) {
  const std::string home = core::GetORVA_HOME(mountPoint);
  std::error_code error;
  std::filesystem::create_directory(home, error);
  if (error) {
    throw util::Exception(home + ": " + error.message());
  }
}

// SQLite keeps the definitions as they are written here, so that they can be compared.

constexpr std::array TABLES = {
    // Readers take the first twelve columns of Folders by position.
    "CREATE TABLE Folders("
    "id INTEGER PRIMARY KEY, "
    "folderId INTEGER NOT NULL, "
    "path TEXT NOT NULL, "
    "name TEXT NOT NULL, "
    "category INTEGER NOT NULL, "
    "lastModifiedDate INTEGER NOT NULL, "
    "isBackup INTEGER NOT NULL, "
    "isHidden INTEGER NOT NULL, "
    "isSystem INTEGER NOT NULL, "
    "isDeleted INTEGER NOT NULL, "
    "status INTEGER NOT NULL, "
    "lastUpdatedDate INTEGER NOT NULL)",
    "CREATE TABLE Files("
    "id INTEGER PRIMARY KEY, "
    "folderId INTEGER NOT NULL, "
    "path TEXT NOT NULL, "
    "name TEXT NOT NULL, "
    "category INTEGER NOT NULL, "
    "lastModifiedDate INTEGER NOT NULL, "
    "isBackup INTEGER NOT NULL, "
    "isHidden INTEGER NOT NULL, "
    "isSystem INTEGER NOT NULL, "
    "isDeleted INTEGER NOT NULL, "
    "status INTEGER NOT NULL, "
    "lastUpdatedDate INTEGER NOT NULL, "
    "ext TEXT NOT NULL, "
    "size INTEGER NOT NULL)",
    "CREATE TABLE Transcodings("
    "id INTEGER PRIMARY KEY, "
    "sourceId INTEGER NOT NULL, "
    "profile TEXT NOT NULL, "
    "status INTEGER NOT NULL, "
    "lastUpdatedDate INTEGER NOT NULL)",
    "CREATE TABLE Identity(identity TEXT NOT NULL, newestStamp INTEGER NOT NULL)",
    "CREATE TABLE Stamps(stamp INTEGER PRIMARY KEY, mark INTEGER NOT NULL)",
    "CREATE TABLE Failures(fileId INTEGER PRIMARY KEY, reason TEXT NOT NULL)",
    "CREATE TABLE Removals(fileId INTEGER PRIMARY KEY)",
};

constexpr std::array INDEXES = {
    "CREATE UNIQUE INDEX Folders_path ON Folders(path)",
    "CREATE INDEX Folders_folderId ON Folders(folderId)",
    "CREATE UNIQUE INDEX Files_path ON Files(path)",
    "CREATE INDEX Files_folder ON Files(folderId, name)",
    // The photos that wait for a rendition.
    "CREATE INDEX Files_waiting ON Files(lastModifiedDate) "
    "WHERE category = 3 AND status = 1 AND isDeleted = 0",
    "CREATE UNIQUE INDEX Transcodings_sourceId ON Transcodings(sourceId, profile)",
    "CREATE INDEX Transcodings_lastUpdatedDate ON Transcodings(lastUpdatedDate)",
};

/// Indexes of earlier versions.
constexpr std::array FORMER_INDEXES = {"CREATE INDEX Files_folderId ON Files(folderId)"};

/// Runs a statement of TABLES or INDEXES unless its table or index exists.
void CreateIfMissing(const db::DB& catalog, const char* definition) {
  // The name follows the word TABLE or INDEX.
  std::istringstream words(definition);
  std::string word;
  while (words >> word && word != "TABLE" && word != "INDEX") {
  }
  words >> word;
  const std::string name = word.substr(0, word.find('('));
  if (SelectNumber(catalog, "SELECT count(*) FROM sqlite_schema WHERE name = ?", name) == 0) {
    Execute(catalog, definition);
  }
}

void FillRandom(void* bytes, std::size_t size) {
  if (getentropy(bytes, size) != 0) {
    throw util::Exception("no random numbers: " + std::generic_category().message(errno));
  }
}

std::string RandomIdentity() {
  std::array<unsigned char, 16> bytes{};
  FillRandom(bytes.data(), bytes.size());
  std::string identity;
  for (const unsigned char byte : bytes) {
    identity += util::FormatString("%02x", byte);
  }
  return identity;
}

/// The random number that was given out with a stamp; 0 if there is none.
long long MarkOf(const db::DB& catalog, std::time_t stamp) {
  return SelectNumber(catalog, "SELECT mark FROM Stamps WHERE stamp = ?", stamp);
}

} // namespace

std::unique_ptr<db::VolumeDB> OpenCatalog(const std::string& mountPoint) {
  CreateHome(mountPoint);
  auto catalog = std::make_unique<db::VolumeDB>(mountPoint, true);
  // Readers continue to see the last committed state while a run writes.
  SelectNumber(*catalog, "PRAGMA journal_mode = WAL");
  Execute(*catalog, "PRAGMA cache_size = -65536");
  CreateSchema(*catalog);
  return catalog;
}

bool HasOwnSchema(const db::DB& catalog) {
  bool own = true;
  ForEachRow(catalog, "SELECT sql FROM sqlite_schema WHERE sql IS NOT NULL",
             [&own](const db::Statement& row) {
               const std::string sql = row.GetText(0);
               own = own && (std::ranges::find(TABLES, sql) != TABLES.end() ||
                             std::ranges::find(INDEXES, sql) != INDEXES.end() ||
                             std::ranges::find(FORMER_INDEXES, sql) != FORMER_INDEXES.end());
             });
  return own;
}

bool HasIndexes(const db::DB& catalog) {
  return std::ranges::all_of(INDEXES, [&catalog](const std::string& sql) {
    return SelectNumber(catalog, "SELECT count(*) FROM sqlite_schema WHERE sql = ?", sql) != 0;
  });
}

void CreateSchema(const db::DB& catalog, unsigned busyTimeout) {
  db::Transaction transaction(catalog, busyTimeout);
  CreateTables(catalog);
  CreateIndexes(catalog);
  transaction.Commit();
}

void CreateTables(const db::DB& catalog) {
  for (const char* const table : TABLES) {
    CreateIfMissing(catalog, table);
  }
  if (SelectNumber(catalog, "SELECT count(*) FROM Identity") == 0) {
    const long long newest =
        std::max({SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Folders"),
                  SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Files"),
                  SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Transcodings")});
    Execute(catalog, "INSERT INTO Identity(identity, newestStamp) VALUES(?, ?)", RandomIdentity(),
            newest);
  }
}

void CreateIndexes(const db::DB& catalog) {
  Execute(catalog, "DROP INDEX IF EXISTS Files_folderId");
  for (const char* const index : INDEXES) {
    CreateIfMissing(catalog, index);
  }
}

void DropTables(const db::DB& catalog) {
  Execute(catalog, "DROP TABLE IF EXISTS Transcodings");
  Execute(catalog, "DROP TABLE IF EXISTS Files");
  Execute(catalog, "DROP TABLE IF EXISTS Folders");
  Execute(catalog, "DROP TABLE IF EXISTS Failures");
  Execute(catalog, "DROP TABLE IF EXISTS Removals");
}

std::string Identity(const db::DB& catalog) {
  db::Statement statement(catalog, "SELECT identity FROM Identity");
  return statement.Fetch() ? statement.GetText(0) : std::string();
}

void RenewIdentity(const db::DB& catalog) {
  Execute(catalog, "UPDATE Identity SET identity = ?", RandomIdentity());
}

CatalogState StateOf(const db::DB& catalog) {
  const std::time_t newest = NewestStamp(catalog);
  return {.identity = Identity(catalog), .newestStamp = newest, .mark = MarkOf(catalog, newest)};
}

bool HasBeenIn(const db::DB& catalog, const CatalogState& state) {
  return Identity(catalog) == state.identity && NewestStamp(catalog) >= state.newestStamp &&
         MarkOf(catalog, state.newestStamp) == state.mark;
}

std::time_t NewestStamp(const db::DB& catalog) {
  // The second one counts where an earlier version has written.
  return std::max(SelectNumber(catalog, "SELECT newestStamp FROM Identity"),
                  SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Transcodings"));
}

std::time_t NextStamp(const db::DB& catalog, std::time_t now) {
  const std::time_t stamp = std::max<std::time_t>(now, NewestStamp(catalog) + 1);
  Execute(catalog, "UPDATE Identity SET newestStamp = ?", stamp);
  long long mark = 0;
  FillRandom(&mark, sizeof mark);
  Execute(catalog, "INSERT OR REPLACE INTO Stamps(stamp, mark) VALUES(?, ?)", stamp, mark);
  // A crafted catalog may have many of them. They are not all removed at once.
  Execute(catalog, "DELETE FROM Stamps WHERE stamp IN "
                   "(SELECT stamp FROM Stamps ORDER BY stamp DESC LIMIT 2 OFFSET 1000)");
  return stamp;
}

std::chrono::seconds PauseAfterStamp(std::time_t stamp, std::time_t now) {
  using std::chrono::seconds;
  constexpr std::time_t MOST_AHEAD = 2;
  constexpr std::time_t LONGEST_PAUSE = 10;
  const std::time_t ahead = stamp - now;
  // If they are farther ahead, the clock was set back.
  return ahead > LONGEST_PAUSE ? seconds(1) : seconds(std::max<std::time_t>(ahead - MOST_AHEAD, 0));
}

void Checkpoint(const db::DB& catalog) {
  SelectNumber(catalog, "PRAGMA wal_checkpoint(TRUNCATE)");
}

} // namespace orva::catalog

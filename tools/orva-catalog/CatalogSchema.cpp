#include "CatalogSchema.h"

#include "Sql.h"

#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"

#include <algorithm>
#include <filesystem>
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

void CreateSchema(const db::DB& catalog) {
  db::Transaction transaction(catalog, BUSY_TIMEOUT);
  CreateTables(catalog);
  CreateIndexes(catalog);
  transaction.Commit();
}

void CreateTables(const db::DB& catalog) {
  // Readers take the first twelve columns of Folders by position.
  Execute(catalog, "CREATE TABLE IF NOT EXISTS Folders("
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
                   "lastUpdatedDate INTEGER NOT NULL)");
  Execute(catalog, "CREATE TABLE IF NOT EXISTS Files("
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
                   "size INTEGER NOT NULL)");
  Execute(catalog, "CREATE TABLE IF NOT EXISTS Transcodings("
                   "id INTEGER PRIMARY KEY, "
                   "sourceId INTEGER NOT NULL, "
                   "profile TEXT NOT NULL, "
                   "status INTEGER NOT NULL, "
                   "lastUpdatedDate INTEGER NOT NULL)");
}

void CreateIndexes(const db::DB& catalog) {
  Execute(catalog, "CREATE UNIQUE INDEX IF NOT EXISTS Folders_path ON Folders(path)");
  Execute(catalog, "CREATE INDEX IF NOT EXISTS Folders_folderId ON Folders(folderId)");
  Execute(catalog, "CREATE UNIQUE INDEX IF NOT EXISTS Files_path ON Files(path)");
  Execute(catalog, "CREATE INDEX IF NOT EXISTS Files_folderId ON Files(folderId)");
  Execute(catalog, "CREATE UNIQUE INDEX IF NOT EXISTS Transcodings_sourceId "
                   "ON Transcodings(sourceId, profile)");
  Execute(catalog, "CREATE INDEX IF NOT EXISTS Transcodings_lastUpdatedDate "
                   "ON Transcodings(lastUpdatedDate)");
}

void DropTables(const db::DB& catalog) {
  Execute(catalog, "DROP TABLE IF EXISTS Transcodings");
  Execute(catalog, "DROP TABLE IF EXISTS Files");
  Execute(catalog, "DROP TABLE IF EXISTS Folders");
}

std::time_t NextStamp(const db::DB& catalog, std::time_t now) {
  const long long newest =
      std::max({SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Folders"),
                SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Files"),
                SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Transcodings")});
  return std::max<std::time_t>(now, newest + 1);
}

void Checkpoint(const db::DB& catalog) {
  SelectNumber(catalog, "PRAGMA wal_checkpoint(TRUNCATE)");
}

} // namespace orva::catalog

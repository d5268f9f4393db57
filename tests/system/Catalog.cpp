#include "Catalog.h"

#include "orvautil/Core.h"

#include <filesystem>

namespace orva::test {

namespace {

std::string Place(const std::string& mountPoint) {
  std::filesystem::create_directories(core::GetORVA_HOME(mountPoint));
  return core::GetCatalogPath(mountPoint);
}

/// Length of the folder's part of a path: of "Pictures/" in "Pictures/a.jpg", 0 in "Pictures/".
std::size_t FolderLength(const std::string& path) {
  const std::size_t separator = path.rfind('/', path.size() - 2);
  return separator == std::string::npos ? 0 : separator + 1;
}

std::string NameOf(const std::string& path) {
  const std::string name = path.substr(FolderLength(path));
  return name.ends_with('/') ? name.substr(0, name.size() - 1) : name;
}

std::string Text(long number) {
  return std::to_string(number);
}

} // namespace

Catalog::Catalog(const std::string& mountPoint) : database_(Place(mountPoint), true) {
  database_.Run("CREATE TABLE Folders(id INTEGER PRIMARY KEY, folderId INTEGER, path TEXT, "
                "name TEXT, category INTEGER, lastModifiedDate INTEGER, isBackup INTEGER, "
                "isHidden INTEGER, isSystem INTEGER, isDeleted INTEGER, status INTEGER, "
                "lastUpdatedDate INTEGER)");
  database_.Run("CREATE TABLE Files(id INTEGER PRIMARY KEY, folderId INTEGER, path TEXT, "
                "name TEXT, category INTEGER, lastModifiedDate INTEGER, isBackup INTEGER, "
                "isHidden INTEGER, isSystem INTEGER, isDeleted INTEGER, status INTEGER, "
                "lastUpdatedDate INTEGER, ext TEXT, size INTEGER)");
  database_.Run("CREATE TABLE Transcodings(id INTEGER PRIMARY KEY, sourceId INTEGER, "
                "profile TEXT, status INTEGER, lastUpdatedDate INTEGER)");
}

void Catalog::Add(const FolderRow& row) {
  database_.Run("INSERT INTO Folders VALUES(nullif(?, '0'), ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
                {Text(row.id), Text(row.folderId), row.path, row.name, Text(row.category),
                 Text(row.lastModifiedDate), Text(row.isBackup), Text(row.isHidden),
                 Text(row.isSystem), Text(row.isDeleted), Text(row.status),
                 Text(row.lastUpdatedDate)});
}

void Catalog::Add(const FileRow& row) {
  database_.Run("INSERT INTO Files VALUES(nullif(?, '0'), ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
                {Text(row.id), Text(row.folderId), row.path, row.name, Text(row.category),
                 Text(row.lastModifiedDate), Text(row.isBackup), Text(row.isHidden),
                 Text(row.isSystem), Text(row.isDeleted), Text(row.status),
                 Text(row.lastUpdatedDate), row.ext, Text(row.size)});
}

void Catalog::Add(const TranscodingRow& row) {
  database_.Run(
      "INSERT INTO Transcodings(sourceId, profile, status, lastUpdatedDate) VALUES(?, ?, ?, ?)",
      {Text(row.sourceId), row.profile, Text(row.status), Text(row.lastUpdatedDate)});
}

void Catalog::AddFolder(const std::string& path, long modified, CatalogFlags flags) {
  Add(FolderRow{.folderId = FolderOf(path),
                .path = path,
                .name = NameOf(path),
                .lastModifiedDate = modified,
                .isBackup = flags.backup,
                .isHidden = flags.hidden,
                .isSystem = flags.system});
}

void Catalog::AddPhoto(const std::string& path, long modified, long stamp, CatalogFlags flags) {
  Add(FileRow{.folderId = FolderOf(path),
              .path = path,
              .name = NameOf(path),
              .lastModifiedDate = modified,
              .isBackup = flags.backup,
              .isHidden = flags.hidden,
              .isSystem = flags.system});
  Add(TranscodingRow{.sourceId = database_.getLastInsertRowid(), .lastUpdatedDate = stamp});
}

void Catalog::AddPhotos(const std::string& folder, int count, long stamp, int first) {
  database_.Run(
      "INSERT INTO Files(folderId, path, name, category, lastModifiedDate, isBackup, "
      "isHidden, isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
      "WITH RECURSIVE n(i) AS (SELECT CAST(?1 AS INTEGER) WHERE ?1 <> ?2 UNION ALL "
      "SELECT i + 1 FROM n WHERE i + 1 < CAST(?2 AS INTEGER)) "
      "SELECT ?3, ?4 || i || '.jpg', i || '.jpg', 3, ?5, 0, 0, 0, 0, 3, 0, 'jpg', 10 "
      "FROM n",
      {Text(first), Text(first + count), Text(FolderOf(folder + "0.jpg")), folder, Text(stamp)});
  database_.Run("INSERT INTO Transcodings(sourceId, profile, status, lastUpdatedDate) "
                "SELECT id, ?, 1, ? FROM Files "
                "WHERE id > last_insert_rowid() - CAST(? AS INTEGER)",
                {notify::TRANSCODING_PROFILE, Text(stamp), Text(count)});
}

void Catalog::DeletePhoto(const std::string& path, long stamp) {
  database_.Run("UPDATE Files SET isDeleted = 1 WHERE path = ?", {path});
  database_.Run("UPDATE Transcodings SET status = 0, lastUpdatedDate = ? "
                "WHERE sourceId = (SELECT id FROM Files WHERE path = ?)",
                {Text(stamp), path});
}

void Catalog::DeleteFolder(const std::string& path) {
  database_.Run("UPDATE Folders SET isDeleted = 1 WHERE path = ?", {path});
}

/// Id of the folder that a path is in; -1 when the catalog has none.
long Catalog::FolderOf(const std::string& path) const {
  const auto rows =
      database_.Run("SELECT id FROM Folders WHERE path = ?", {path.substr(0, FolderLength(path))});
  return rows.empty() ? -1 : std::stol(rows.front());
}

} // namespace orva::test

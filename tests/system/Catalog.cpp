#include "Catalog.h"

#include "orvautil/Core.h"

#include <sys/stat.h>

namespace orva::test {

namespace {

std::string Place(const std::string& root) {
  mkdir(core::GetORVA_HOME(root).c_str(), 0755);
  return core::GetCatalogPath(root);
}

/// "Pictures/" of "Pictures/a.jpg", "" of "Pictures/".
std::string FolderOf(const std::string& path) {
  const std::size_t separator = path.rfind('/', path.size() - 2);
  return separator == std::string::npos ? "" : path.substr(0, separator + 1);
}

std::string NameOf(const std::string& path) {
  const std::string name = path.substr(FolderOf(path).size());
  return name.back() == '/' ? name.substr(0, name.size() - 1) : name;
}

std::string Text(bool flag) {
  return flag ? "1" : "0";
}

} // namespace

Catalog::Catalog(const std::string& root) : database_(Place(root), true) {
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

void Catalog::AddFolder(const std::string& path, long modified, CatalogFlags flags) {
  database_.Run("INSERT INTO Folders(folderId, path, name, category, lastModifiedDate, isBackup, "
                "isHidden, isSystem, isDeleted, status, lastUpdatedDate) "
                "VALUES(coalesce((SELECT id FROM Folders WHERE path = ?), -1), ?, ?, 4, ?, ?, ?, "
                "?, 0, 0, 0)",
                {FolderOf(path), path, NameOf(path), std::to_string(modified), Text(flags.backup),
                 Text(flags.hidden), Text(flags.system)});
}

void Catalog::AddPhoto(const std::string& path, long modified, long stamp, CatalogFlags flags) {
  database_.Run("INSERT INTO Files(folderId, path, name, category, lastModifiedDate, isBackup, "
                "isHidden, isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
                "VALUES(coalesce((SELECT id FROM Folders WHERE path = ?), -1), ?, ?, 3, ?, ?, ?, "
                "?, 0, 3, 0, 'jpg', 10)",
                {FolderOf(path), path, NameOf(path), std::to_string(modified), Text(flags.backup),
                 Text(flags.hidden), Text(flags.system)});
  database_.Run("INSERT INTO Transcodings(sourceId, profile, status, lastUpdatedDate) "
                "SELECT id, 'cb62bbdd389b48898f2e5244977cb2c5', 1, ? FROM Files WHERE path = ?",
                {std::to_string(stamp), path});
}

void Catalog::AddPhotos(const std::string& folder, int count, long stamp, int first) {
  database_.Run(
      "INSERT INTO Files(folderId, path, name, category, lastModifiedDate, isBackup, "
      "isHidden, isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
      "WITH RECURSIVE n(i) AS (SELECT CAST(?1 AS INTEGER) WHERE ?1 <> ?2 UNION ALL SELECT i + 1 FROM n "
      "WHERE i + 1 < CAST(?2 AS INTEGER)) "
      "SELECT (SELECT id FROM Folders WHERE path = ?3), ?3 || i || '.jpg', i || '.jpg', "
      "3, ?4, 0, 0, 0, 0, 3, 0, 'jpg', 10 FROM n",
      {std::to_string(first), std::to_string(first + count), folder, std::to_string(stamp)});
  database_.Run("INSERT INTO Transcodings(sourceId, profile, status, lastUpdatedDate) "
                "SELECT id, 'cb62bbdd389b48898f2e5244977cb2c5', 1, ?1 FROM Files "
                "WHERE id > last_insert_rowid() - CAST(?2 AS INTEGER)",
                {std::to_string(stamp), std::to_string(count)});
}

void Catalog::DeletePhoto(const std::string& path, long stamp) {
  database_.Run("UPDATE Files SET isDeleted = 1 WHERE path = ?", {path});
  database_.Run("UPDATE Transcodings SET status = 0, lastUpdatedDate = ? "
                "WHERE sourceId = (SELECT id FROM Files WHERE path = ?)",
                {std::to_string(stamp), path});
}

void Catalog::DeleteFolder(const std::string& path) {
  database_.Run("UPDATE Folders SET isDeleted = 1 WHERE path = ?", {path});
}

} // namespace orva::test

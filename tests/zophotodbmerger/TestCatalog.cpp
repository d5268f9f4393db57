#include "TestCatalog.h"

#include "orvautil/Core.h"

#include <filesystem>

namespace orva::test {

namespace {

std::string Place(const std::string& mountPoint) {
  std::filesystem::create_directories(core::GetORVA_HOME(mountPoint));
  return core::GetCatalogPath(mountPoint);
}

std::string Text(long number) {
  return std::to_string(number);
}

std::string LastComponent(const std::string& path) {
  const std::string whole = path.ends_with('/') ? path.substr(0, path.size() - 1) : path;
  return whole.substr(whole.rfind('/') + 1);
}

} // namespace

TestCatalog::TestCatalog(const std::string& mountPoint) : database_(Place(mountPoint), true) {
  database_.Run("CREATE TABLE Folders(id INTEGER PRIMARY KEY, folderId INTEGER, path TEXT, name "
                "TEXT, category INTEGER, lastModifiedDate INTEGER, isBackup INTEGER, isHidden "
                "INTEGER, isSystem INTEGER, isDeleted INTEGER, status INTEGER, lastUpdatedDate "
                "INTEGER)");
  database_.Run("CREATE TABLE Files(id INTEGER PRIMARY KEY, folderId INTEGER, path TEXT, name "
                "TEXT, category INTEGER, lastModifiedDate INTEGER, isBackup INTEGER, isHidden "
                "INTEGER, isSystem INTEGER, isDeleted INTEGER, status INTEGER, lastUpdatedDate "
                "INTEGER, ext TEXT, size INTEGER)");
  database_.Run("CREATE TABLE Transcodings(id INTEGER PRIMARY KEY, sourceId INTEGER, profile TEXT, "
                "status INTEGER, lastUpdatedDate INTEGER)");
}

void TestCatalog::Add(const FolderRow& row) {
  database_.Run("INSERT INTO Folders VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
                {Text(row.id), Text(row.folderId), row.path, row.name, Text(row.category),
                 Text(row.lastModifiedDate), Text(row.isBackup), Text(row.isHidden),
                 Text(row.isSystem), Text(row.isDeleted), Text(row.status),
                 Text(row.lastUpdatedDate)});
}

void TestCatalog::Add(const FileRow& row) {
  database_.Run("INSERT INTO Files VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
                {Text(row.id), Text(row.folderId), row.path, row.name, Text(row.category),
                 Text(row.lastModifiedDate), Text(row.isBackup), Text(row.isHidden),
                 Text(row.isSystem), Text(row.isDeleted), Text(row.status),
                 Text(row.lastUpdatedDate), row.ext, Text(row.size)});
}

void TestCatalog::Add(const TranscodingRow& row) {
  database_.Run(
      "INSERT INTO Transcodings(sourceId, profile, status, lastUpdatedDate) VALUES(?, ?, ?, ?)",
      {Text(row.sourceId), row.profile, Text(row.status), Text(row.lastUpdatedDate)});
}

void TestCatalog::AddFolder(long id, const std::string& path, long modified) {
  Add(FolderRow{.id = id, .path = path, .name = LastComponent(path), .lastModifiedDate = modified});
}

void TestCatalog::AddPhoto(long id, const std::string& path, long modified, long stamp) {
  Add(FileRow{.id = id, .path = path, .name = LastComponent(path), .lastModifiedDate = modified});
  Add(TranscodingRow{.sourceId = id, .lastUpdatedDate = stamp});
}

void TestCatalog::DeletePhoto(long id, long stamp) {
  database_.Run("UPDATE Files SET isDeleted = 1 WHERE id = ?", {Text(id)});
  database_.Run("UPDATE Transcodings SET status = 0, lastUpdatedDate = ? WHERE sourceId = ?",
                {Text(stamp), Text(id)});
}

} // namespace orva::test

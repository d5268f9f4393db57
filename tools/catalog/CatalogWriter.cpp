#include "CatalogWriter.h"

#include "Sql.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"

namespace orva::catalog {
namespace {

constexpr char STORE_FILE[] =
    "INSERT OR REPLACE INTO Files(id, folderId, path, name, category, lastModifiedDate, "
    "isBackup, isHidden, isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
    "VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)";

} // namespace

void StoreFolder(const db::DB& catalog, const db::Folder& folder) {
  Execute(catalog,
          "INSERT OR REPLACE INTO Folders(id, folderId, path, name, category, lastModifiedDate, "
          "isBackup, isHidden, isSystem, isDeleted, status, lastUpdatedDate) "
          "VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
          folder.id, folder.folderId, folder.path, folder.name, folder.category,
          folder.lastModifiedDate, folder.isBackup, folder.isHidden, folder.isSystem,
          folder.isDeleted, folder.status, folder.lastUpdatedDate);
}

void StoreFile(const db::DB& catalog, const db::File& file) {
  Execute(catalog, STORE_FILE, file.id, file.folderId, file.path, file.name, file.category,
          file.lastModifiedDate, file.isBackup, file.isHidden, file.isSystem, file.isDeleted,
          file.status, file.lastUpdatedDate, file.ext, file.size);
}

void StoreFile(const db::DB& catalog, const FileRow& file) {
  std::string path;
  path.reserve(file.folderPath.size() + file.name.size());
  path.append(file.folderPath).append(file.name);
  db::Statement statement(catalog, STORE_FILE);
  int column = 0;
  statement.BindInt64(++column, file.id);
  statement.BindInt64(++column, file.folderId);
  statement.BindTextView(++column, path);
  statement.BindTextView(++column, file.name);
  statement.BindInt(++column, file.category);
  statement.BindTime(++column, file.lastModifiedDate);
  statement.BindInt(++column, file.flags.isBackup ? 1 : 0);
  statement.BindInt(++column, file.flags.isHidden ? 1 : 0);
  statement.BindInt(++column, file.flags.isSystem ? 1 : 0);
  statement.BindInt(++column, 0); // isDeleted
  statement.BindInt(++column, file.status);
  statement.BindTime(++column, file.lastUpdatedDate);
  statement.BindTextView(++column, file.extension);
  statement.BindInt64(++column, file.size);
  statement.Execute();
}

void StoreTranscoding(const db::DB& catalog, long long fileId, TranscodingStatus status,
                      std::time_t stamp) {
  Execute(catalog,
          "INSERT OR REPLACE INTO Transcodings(sourceId, profile, status, lastUpdatedDate) "
          "VALUES(?, ?, ?, ?)",
          fileId, std::string(PROFILE), static_cast<int>(status), stamp);
}

} // namespace orva::catalog

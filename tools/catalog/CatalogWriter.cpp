#include "CatalogWriter.h"

#include "Sql.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"

namespace orva::catalog {

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
  Execute(catalog,
          "INSERT OR REPLACE INTO Files(id, folderId, path, name, category, lastModifiedDate, "
          "isBackup, isHidden, isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
          "VALUES(?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
          file.id, file.folderId, file.path, file.name, file.category, file.lastModifiedDate,
          file.isBackup, file.isHidden, file.isSystem, file.isDeleted, file.status,
          file.lastUpdatedDate, file.ext, file.size);
}

void StoreTranscoding(const db::DB& catalog, long long fileId, TranscodingStatus status,
                      std::time_t stamp) {
  Execute(catalog,
          "INSERT OR REPLACE INTO Transcodings(sourceId, profile, status, lastUpdatedDate) "
          "VALUES(?, ?, ?, ?)",
          fileId, std::string(PROFILE), static_cast<int>(status), stamp);
}

} // namespace orva::catalog

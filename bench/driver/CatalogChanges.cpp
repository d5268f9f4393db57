#include "CatalogChanges.h"

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Generator.h"
#include "Sql.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

namespace orva::bench {

namespace {

constexpr int PHOTO = 3;
constexpr int FOLDER = 4;

/// Calls `change` with the catalog and the stamp of the change.
template <typename Change>
void ChangeCatalog(const std::string& mountPoint, Change change) {
  const auto catalog = catalog::OpenCatalog(mountPoint);
  {
    db::Transaction transaction(*catalog, catalog::BUSY_TIMEOUT);
    change(*catalog, catalog::NextStamp(*catalog, std::time(nullptr)));
    transaction.Commit();
  }
  catalog::Checkpoint(*catalog);
}

db::Folder AddFolder(const db::DB& catalog, std::time_t stamp) {
  db::Folder folder;
  folder.id = catalog::SelectNumber(catalog, "SELECT max(id) + 1 FROM Folders");
  folder.folderId = -1;
  folder.name = "Batch_" + std::to_string(folder.id);
  folder.path = folder.name + "/";
  folder.category = FOLDER;
  folder.lastModifiedDate = stamp;
  folder.status = catalog::INDEXED;
  folder.lastUpdatedDate = stamp;
  catalog::StoreFolder(catalog, folder);
  return folder;
}

void AddPhoto(const db::DB& catalog, const db::Folder& folder, long long id) {
  db::File file;
  file.id = id;
  file.folderId = folder.id;
  file.name = "New_" + std::to_string(id) + ".jpg";
  file.path = folder.path + file.name;
  file.category = PHOTO;
  file.lastModifiedDate = folder.lastModifiedDate;
  file.status = catalog::RENDERED;
  file.lastUpdatedDate = folder.lastUpdatedDate;
  file.ext = "jpg";
  file.size = id;
  catalog::StoreFile(catalog, file);
  catalog::StoreTranscoding(catalog, file.id, catalog::FINISHED, folder.lastUpdatedDate);
}

} // namespace

std::time_t NewestStamp(const std::string& mountPoint) {
  const db::VolumeDB catalog(mountPoint, false);
  return catalog::SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Transcodings");
}

void AppendBatch(const std::string& mountPoint, int files) {
  ChangeCatalog(mountPoint, [files](const db::DB& catalog, std::time_t stamp) {
    const db::Folder folder = AddFolder(catalog, stamp);
    const long long first = catalog::SelectNumber(catalog, "SELECT max(id) + 1 FROM Files");
    for (int i = 0; i < files; ++i) {
      AddPhoto(catalog, folder, first + i);
    }
  });
}

void DeleteEveryFile(const std::string& mountPoint) {
  ChangeCatalog(mountPoint, [](const db::DB& catalog, std::time_t stamp) {
    catalog::Execute(catalog, "UPDATE Files SET isDeleted = 1, status = 1, lastUpdatedDate = ?",
                     stamp);
    catalog::Execute(catalog, "UPDATE Transcodings SET status = 0, lastUpdatedDate = ?", stamp);
  });
}

void ReviveEveryFile(const std::string& mountPoint) {
  ChangeCatalog(mountPoint, [](const db::DB& catalog, std::time_t stamp) {
    catalog::Execute(catalog, "UPDATE Files SET isDeleted = 0, status = 3, lastUpdatedDate = ?",
                     stamp);
    catalog::Execute(catalog, "UPDATE Transcodings SET status = 1, lastUpdatedDate = ?", stamp);
  });
}

void RestampEveryFile(const std::string& mountPoint) {
  const auto catalog = catalog::OpenCatalog(mountPoint);
  catalog::Restamp(*catalog, std::time(nullptr));
  catalog::Checkpoint(*catalog);
}

} // namespace orva::bench

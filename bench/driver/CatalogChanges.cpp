#include "CatalogChanges.h"

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Generator.h"
#include "Sql.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/FormatString.h"

namespace orva::bench {

namespace {

constexpr int PHOTO = 3;
constexpr int FOLDER = 4;

std::time_t NewestStampOf(const db::DB& catalog) {
  return catalog::SelectNumber(catalog, "SELECT max(lastUpdatedDate) FROM Transcodings");
}

/// Calls `change` with the catalog and the stamp of the change.
template <typename Change>
void ChangeCatalog(const std::string& mountPoint, Change change) {
  const auto catalog = catalog::OpenCatalog(mountPoint);
  {
    db::Transaction transaction(*catalog, catalog::BUSY_TIMEOUT);
    // The generator and the changes here give no file or folder a later stamp than its
    // transcodings, whose stamps have an index.
    change(*catalog, NewestStampOf(*catalog) + 1);
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

void AddPhoto(const db::DB& catalog, const db::Folder& folder, const std::string& name,
              std::time_t stamp) {
  db::File file;
  file.id = catalog::SelectNumber(catalog, "SELECT max(id) + 1 FROM Files");
  file.folderId = folder.id;
  file.name = name;
  file.path = folder.path + file.name;
  file.category = PHOTO;
  file.lastModifiedDate = stamp;
  file.status = catalog::RENDERED;
  file.lastUpdatedDate = stamp;
  file.ext = "jpg";
  file.size = file.id;
  catalog::StoreFile(catalog, file);
  catalog::StoreTranscoding(catalog, file.id, catalog::FINISHED, stamp);
}

/// A name that no file of the catalog has.
std::string NewName(const db::DB& catalog) {
  return "New_" + std::to_string(catalog::SelectNumber(catalog, "SELECT max(id) + 1 FROM Files")) +
         ".jpg";
}

} // namespace

std::time_t NewestStamp(const std::string& mountPoint) {
  return NewestStampOf(db::VolumeDB(mountPoint, false));
}

void AppendBatch(const std::string& mountPoint, int files, catalog::Names names) {
  ChangeCatalog(mountPoint, [&](const db::DB& catalog, std::time_t stamp) {
    const db::Folder folder = AddFolder(catalog, stamp);
    for (int i = 1; i <= files; ++i) {
      AddPhoto(catalog, folder,
               names == catalog::Names::Camera ? util::FormatString("IMG_%04d.JPG", i)
                                               : NewName(catalog),
               stamp);
    }
  });
}

void AppendFile(const std::string& mountPoint) {
  ChangeCatalog(mountPoint, [](const db::DB& catalog, std::time_t stamp) {
    db::Statement query(catalog, "SELECT id, path FROM Folders ORDER BY id LIMIT 1");
    if (!query.Fetch()) {
      throw std::string("the catalog has no folder");
    }
    db::Folder folder;
    folder.id = query.GetInt64(0);
    folder.path = query.GetText(1);
    AddPhoto(catalog, folder, NewName(catalog), stamp);
  });
}

void AddCovers(const std::string& mountPoint) {
  ChangeCatalog(mountPoint, [](const db::DB& catalog, std::time_t stamp) {
    catalog::Execute(catalog,
                     "INSERT INTO Files(folderId, path, name, category, lastModifiedDate, "
                     "isBackup, isHidden, isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
                     "SELECT id, path || 'cover.jpg', 'cover.jpg', ?, lastModifiedDate, "
                     "0, 0, 0, 0, ?, ?, 'jpg', 1000 FROM Folders",
                     PHOTO, static_cast<int>(catalog::RENDERED), stamp);
    catalog::Execute(catalog,
                     "INSERT INTO Transcodings(sourceId, profile, status, lastUpdatedDate) "
                     "SELECT id, ?, ?, lastUpdatedDate FROM Files WHERE name = 'cover.jpg'",
                     std::string(catalog::PROFILE), static_cast<int>(catalog::FINISHED));
  });
}

void DeleteEveryFile(const std::string& mountPoint) {
  ChangeCatalog(mountPoint, [](const db::DB& catalog, std::time_t stamp) {
    catalog::Execute(catalog, "UPDATE Files SET isDeleted = 1, status = 1, lastUpdatedDate = ?",
                     stamp);
    catalog::Execute(catalog, "UPDATE Transcodings SET status = 0, lastUpdatedDate = ?", stamp);
  });
}

void RestampEveryFile(const std::string& mountPoint) {
  const auto catalog = catalog::OpenCatalog(mountPoint);
  catalog::Restamp(*catalog, std::time(nullptr));
  catalog::Checkpoint(*catalog);
}

} // namespace orva::bench

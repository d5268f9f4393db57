#include "Renditions.h"

#include "CatalogWriter.h"
#include "Classification.h"
#include "Sql.h"

#include "orvautil/FormatString.h"

#include <limits>

namespace orva::catalog {
namespace {

/// Whether the catalog still describes `photo` as it was read.
bool IsUnchanged(const db::DB& catalog, const WaitingPhoto& photo) {
  return SelectNumber(catalog,
                      "SELECT count(*) FROM Files WHERE id = ? AND path = ? AND "
                      "lastModifiedDate = ? AND size = ? AND status = 1 AND isDeleted = 0",
                      photo.id, photo.path, photo.lastModifiedDate, photo.size) != 0;
}

/// A tombstone is a second row for a path, as a deleted file: a merged database drops the file only
/// for such a row. Its path has a leading separator, which readers ignore, so that both can exist.
std::string TombstonePath(const std::string& path) {
  return '/' + path;
}

void AddTombstone(const db::DB& catalog, const WaitingPhoto& photo, std::time_t stamp) {
  const std::string path = TombstonePath(photo.path);
  Execute(catalog,
          "INSERT OR IGNORE INTO Files(folderId, path, name, category, lastModifiedDate, isBackup, "
          "isHidden, isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
          "SELECT folderId, ?, name, category, lastModifiedDate, isBackup, isHidden, isSystem, 1, "
          "1, ?, ext, size FROM Files WHERE id = ?",
          path, stamp, photo.id);
  StoreTranscoding(catalog, SelectNumber(catalog, "SELECT id FROM Files WHERE path = ?", path),
                   WITHDRAWN, stamp);
}

void RemoveTombstone(const db::DB& catalog, const std::string& photo) {
  const long long id =
      SelectNumber(catalog, "SELECT id FROM Files WHERE path = ?", TombstonePath(photo));
  if (id != 0) {
    Execute(catalog, "DELETE FROM Transcodings WHERE sourceId = ?", id);
    Execute(catalog, "DELETE FROM Files WHERE id = ?", id);
  }
}

} // namespace

std::vector<WaitingPhoto> NewestWaiting(const db::DB& catalog, std::size_t count) {
  constexpr long long LAST = std::numeric_limits<long long>::max();
  return NewestWaiting(catalog, count, {.id = LAST, .path = {}, .lastModifiedDate = LAST});
}

std::vector<WaitingPhoto> NewestWaiting(const db::DB& catalog, std::size_t count,
                                        const WaitingPhoto& previous) {
  db::Statement statement(
      catalog, "SELECT id, path, lastModifiedDate, size FROM Files INDEXED BY Files_waiting "
               "WHERE category = 3 AND status = 1 AND isDeleted = 0 "
               "AND (lastModifiedDate, id) < (?, ?) "
               "ORDER BY lastModifiedDate DESC, id DESC LIMIT ?");
  statement.BindTime(1, previous.lastModifiedDate);
  statement.BindInt64(2, previous.id);
  statement.BindInt64(3, static_cast<long long>(count));
  std::vector<WaitingPhoto> photos;
  while (statement.Fetch()) {
    photos.push_back({.id = statement.GetInt64(0),
                      .path = statement.GetText(1),
                      .lastModifiedDate = statement.GetTime(2),
                      .size = statement.GetInt64(3)});
  }
  return photos;
}

long long CountWaiting(const db::DB& catalog) {
  return SelectNumber(catalog, "SELECT count(*) FROM Files INDEXED BY Files_waiting "
                               "WHERE category = 3 AND status = 1 AND isDeleted = 0");
}

long long CountFailed(const db::DB& catalog) {
  return SelectNumber(catalog, "SELECT count(*) FROM Failures");
}

bool MarkFinished(const db::DB& catalog, const WaitingPhoto& photo, std::time_t stamp) {
  if (!IsUnchanged(catalog, photo)) {
    return false;
  }
  Execute(catalog, "UPDATE Files SET status = ?, lastUpdatedDate = ? WHERE id = ?",
          static_cast<int>(RENDERED), stamp, photo.id);
  StoreTranscoding(catalog, photo.id, FINISHED, stamp);
  RemoveTombstone(catalog, photo.path);
  return true;
}

bool MarkFailed(const db::DB& catalog, const WaitingPhoto& photo, const std::string& reason,
                std::time_t stamp) {
  if (!IsUnchanged(catalog, photo)) {
    return false;
  }
  const bool isListed = SelectNumber(catalog,
                                     "SELECT count(*) FROM Transcodings "
                                     "WHERE sourceId = ? AND profile = ? AND status = 1",
                                     photo.id, std::string(PROFILE)) != 0;
  if (isListed) {
    AddTombstone(catalog, photo, stamp);
  }
  Execute(catalog, "UPDATE Files SET status = ?, lastUpdatedDate = ? WHERE id = ?",
          static_cast<int>(UNRENDERABLE), stamp, photo.id);
  StoreTranscoding(catalog, photo.id, FAILED, stamp);
  Execute(catalog, "INSERT OR REPLACE INTO Failures(fileId, reason) VALUES(?, ?)", photo.id,
          reason);
  return true;
}

bool WasNotOpened(const db::DB& catalog, long long fileId) {
  return SelectNumber(catalog,
                      "SELECT count(*) FROM Failures WHERE fileId = ? AND instr(reason, ?) = 1",
                      fileId, std::string(NOT_OPENED)) != 0;
}

void MarkMissing(const db::DB& catalog, long long fileId) {
  Execute(catalog, "UPDATE Files SET status = 1 WHERE id = ? AND status = 3 AND isDeleted = 0",
          fileId);
}

std::vector<long long> RemovedFiles(const db::DB& catalog, std::size_t count) {
  db::Statement statement(catalog, "SELECT fileId FROM Removals LIMIT ?");
  statement.BindInt64(1, static_cast<long long>(count));
  std::vector<long long> files;
  while (statement.Fetch()) {
    files.push_back(statement.GetInt64(0));
  }
  return files;
}

std::vector<long long> ListedPhotos(const db::DB& catalog, long long first, std::size_t count) {
  db::Statement statement(
      catalog, "SELECT id FROM Files WHERE id >= ? AND category = 3 AND isDeleted = 0 "
               "AND EXISTS (SELECT 1 FROM Transcodings WHERE sourceId = Files.id AND profile = ? "
               "AND Transcodings.status = 1) ORDER BY id LIMIT ?");
  statement.BindInt64(1, first);
  statement.BindText(2, PROFILE);
  statement.BindInt64(3, static_cast<long long>(count));
  std::vector<long long> photos;
  while (statement.Fetch()) {
    photos.push_back(statement.GetInt64(0));
  }
  return photos;
}

bool IsOnVolume(const db::DB& catalog, long long fileId) {
  return SelectNumber(catalog, "SELECT count(*) FROM Files WHERE id = ? AND isDeleted = 0",
                      fileId) != 0;
}

void ForgetRemovedFile(const db::DB& catalog, long long fileId) {
  Execute(catalog, "DELETE FROM Removals WHERE fileId = ?", fileId);
}

std::string RenditionFolder(long long fileId) {
  return util::FormatString("%s/%lld", RENDITIONS, fileId / RENDITIONS_PER_FOLDER);
}

std::string RenditionName(long long fileId) {
  return std::to_string(fileId) + ".jpg";
}

std::string RenditionPath(long long fileId) {
  return RenditionFolder(fileId) + '/' + RenditionName(fileId);
}

} // namespace orva::catalog

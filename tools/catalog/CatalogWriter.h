#pragma once

#include "Classification.h"

#include <ctime>
#include <string_view>

namespace orva::db {
class DB;
class File;
class Folder;
} // namespace orva::db

// Writes rows of a catalog. On the connection's thread; failures are thrown as std::string.
namespace orva::catalog {

/// The transcoding profile that the photo database reads.
inline constexpr char PROFILE[] = "cb62bbdd389b48898f2e5244977cb2c5";

/// Files.status and Folders.status.
enum ItemStatus : int { INDEXED = 1, UNRENDERABLE = 2, RENDERED = 3 };

/// Transcodings.status.
enum TranscodingStatus : int { WITHDRAWN = 0, FINISHED = 1, FAILED = 3 };

/// Inserts or replaces the row `folder.id`. `folder.path` is relative to the volume and ends in
/// "/".
void StoreFolder(const db::DB& catalog, const db::Folder& folder);

/// Inserts or replaces the row `file.id`. `file.path` is relative to the volume.
void StoreFile(const db::DB& catalog, const db::File& file);

/// A row of Files for a file that is on the volume. The texts belong to the caller.
struct FileRow {
  long long id = 0;
  long long folderId = -1;
  std::string_view folderPath{}; ///< relative to the volume
  std::string_view name{};
  Category category = OTHER;
  std::time_t lastModifiedDate = 0;
  Flags flags{};
  ItemStatus status = INDEXED;
  std::time_t lastUpdatedDate = 0;
  std::string_view extension{};
  long long size = 0;
};

/// Inserts or replaces the row `file.id`.
void StoreFile(const db::DB& catalog, const FileRow& file);

/// Inserts or replaces the file's transcoding for PROFILE.
void StoreTranscoding(const db::DB& catalog, long long fileId, TranscodingStatus status,
                      std::time_t stamp);

} // namespace orva::catalog

#pragma once

#include <ctime>

namespace orva::db {
class DB;
class File;
class Folder;
} // namespace orva::db

// Rows of a catalog. On the connection's thread; failures are thrown as std::string.
namespace orva::catalog {

/// The transcoding profile whose renditions the photo database takes.
inline constexpr char PROFILE[] = "cb62bbdd389b48898f2e5244977cb2c5";

/// Files.status and Folders.status.
enum ItemStatus : int { INDEXED = 1, RENDERED = 3 };

/// Transcodings.status.
enum TranscodingStatus : int { WITHDRAWN = 0, FINISHED = 1 };

/// Writes the row `folder.id`, new or in the place of the old one; `folder.path` is relative to
/// the volume and ends in "/".
void StoreFolder(const db::DB& catalog, const db::Folder& folder);

/// Writes the row `file.id`, new or in the place of the old one; `file.path` is relative to the
/// volume.
void StoreFile(const db::DB& catalog, const db::File& file);

/// Writes the file's transcoding for PROFILE, new or in the place of the old one.
void StoreTranscoding(const db::DB& catalog, long long fileId, TranscodingStatus status,
                      std::time_t stamp);

} // namespace orva::catalog

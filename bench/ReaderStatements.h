#pragma once

namespace orva::bench {

// The statements that a merge runs on a catalog, copied from src/zophotodbmerger/CatalogReader.cpp.

inline constexpr char SELECT_FOLDERS[] =
    "SELECT * FROM Folders where +isSystem = 0 AND +isBackup = 0 AND +isHidden = 0";

/// Its parameter is the stamp after which a file has changed.
inline constexpr char SELECT_CHANGED_FILES[] =
    "SELECT f.id,f.folderId,f.path,f.name,f.category,f.lastModifiedDate,f.isBackup,"
    "f.isHidden,f.isSystem,f.isDeleted,f.status,t.lastUpdatedDate,f.ext,f.size from "
    "Files f, Transcodings t WHERE f.id = t.sourceId AND t.lastUpdatedDate > ? AND "
    "t.profile = 'cb62bbdd389b48898f2e5244977cb2c5' AND ((f.isDeleted = 0 and "
    "t.status = 1) OR (f.isDeleted = 1 and t.status = 0))";

/// Its parameter is the status of a rendered photo.
inline constexpr char COUNT_RENDERED[] =
    "SELECT count(*) FROM Files WHERE category = 3 AND status = ? AND +isSystem = "
    "0 AND +isBackup = 0 AND +isHidden = 0 AND +isDeleted = 0";
inline constexpr int RENDERED_STATUS = 3;

inline constexpr char COUNT_PHOTOS[] =
    "SELECT count(*) FROM Files WHERE category = 3 AND +isSystem = 0 AND +isBackup "
    "= 0 AND +isHidden = 0 AND +isDeleted = 0";

} // namespace orva::bench

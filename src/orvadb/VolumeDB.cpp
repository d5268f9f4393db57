#include "orvadb/VolumeDB.h"

#include "DatabaseFile.h"

#include "orvautil/Core.h"
#include "orvautil/FormatString.h"
#include "orvautil/Path.h"

#include <sqlite3.h>

#include <sys/statvfs.h>

#include <array>

namespace orva::db {

namespace {

/// Milliseconds. The indexer writes whole scans at once; a catalog that it is just writing is
/// waited for.
constexpr int CATALOG_BUSY_TIMEOUT = 5000;

bool IsOnReadOnlyFileSystem(const std::string& path) {
  struct statvfs status {};
  return statvfs(path.c_str(), &status) == 0 && (status.f_flag & ST_RDONLY) != 0;
}

/// Whether the open file says that it is written with a write-ahead log. Read through SQLite's
/// own descriptor: opening and closing another one would drop its locks.
bool IsInWalMode(sqlite3* handle) {
  sqlite3_file* file = nullptr;
  sqlite3_file_control(handle, "main", SQLITE_FCNTL_FILE_POINTER, &file);
  constexpr sqlite3_int64 readVersionOffset = 19;
  constexpr unsigned char walVersion = 2;
  std::array<unsigned char, 1> readVersion{};
  return file != nullptr && file->pMethods != nullptr &&
         file->pMethods->xRead(file, readVersion.data(), readVersion.size(), readVersionOffset) ==
             SQLITE_OK &&
         readVersion.front() == walVersion;
}

} // namespace

VolumeDB::VolumeDB(const std::string& path, bool writable) : prefix_(path) {
  const std::string volume = util::Path(path).Canonicalize();
  if (volume.empty()) {
    throw util::FormatString("%s:%d: there is no volume at '%s'", __FILE__, __LINE__, path.c_str());
  }
  const std::string catalog = core::GetCatalogPath(volume);
  const Access access = writable ? Access::ReadWrite : Access::ReadOnly;
  Open(catalog, access, CATALOG_BUSY_TIMEOUT, false);
  if (!writable && IsOnReadOnlyFileSystem(catalog) && IsInWalMode(Handle())) {
    // SQLite cannot make the shared memory that a log needs here. Without a log to read,
    // nobody can be writing either.
    if (!IsAbsentOrEmpty(catalog + "-wal")) {
      throw util::FormatString("%s:%d: '%s' has a write-ahead log, which cannot be read on a "
                               "read-only file system",
                               __FILE__, __LINE__, catalog.c_str());
    }
    Open(catalog, access, CATALOG_BUSY_TIMEOUT, true);
  }
}

} // namespace orva::db

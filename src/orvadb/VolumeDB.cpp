#include "orvadb/VolumeDB.h"

#include "DatabaseFile.h"

#include "orvadb/ErrorMessage.h"

#include "orvautil/Core.h"
#include "orvautil/FormatString.h"
#include "orvautil/Path.h"

#include <sqlite3.h>

#include <sys/statvfs.h>

#include <array>

namespace orva::db {

namespace {

/// Milliseconds. The indexer writes a whole scan in one transaction, which the reads wait for.
constexpr int CATALOG_BUSY_TIMEOUT = 5000;

bool IsOnReadOnlyFileSystem(const std::string& path) {
  struct statvfs status {};
  return statvfs(path.c_str(), &status) == 0 && (status.f_flag & ST_RDONLY) != 0;
}

/// Whether the header of the open file asks for a write-ahead log. Reads through SQLite's own
/// descriptor: closing another one on the file would drop SQLite's locks.
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
    throw ErrorMessage(util::FormatString("there is no volume at '%s'", path.c_str()));
  }
  const std::string catalog = core::GetCatalogPath(volume);
  const Access access = writable ? Access::ReadWrite : Access::ReadOnly;
  Open(catalog, access, CATALOG_BUSY_TIMEOUT, false);
  if (!writable && IsOnReadOnlyFileSystem(catalog) && IsInWalMode(Handle())) {
    // SQLite cannot make the shared memory that a log needs here. Where there is no log to read,
    // no other process can be writing either.
    if (!IsAbsentOrEmpty(catalog + "-wal")) {
      throw ErrorMessage(util::FormatString("'%s' has a write-ahead log, which cannot be read on a "
                                            "read-only file system",
                                            catalog.c_str()));
    }
    Open(catalog, access, CATALOG_BUSY_TIMEOUT, true);
  }
}

} // namespace orva::db

#include "orvadb/VolumeDB.h"

#include "DatabaseFiles.h"

#include "orvadb/ErrorMessage.h"

#include "orvautil/Core.h"
#include "orvautil/FormatString.h"
#include "orvautil/Path.h"

#include <sqlite3.h>

#include <sys/stat.h>
#include <sys/types.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cstddef>
#include <ctime>
#include <optional>
#include <thread>

namespace orva::db {

namespace {

/// Milliseconds. The indexer writes a whole scan in one transaction, which the reads wait for.
constexpr int CATALOG_BUSY_TIMEOUT = 5000;

/// Reads a part of the header of the open file into `bytes`; false if that fails. Reads through
/// SQLite's own descriptor: closing another one on the file would drop SQLite's locks.
template <std::size_t Count>
bool ReadHeader(sqlite3* handle, sqlite3_int64 offset, std::array<unsigned char, Count>& bytes) {
  sqlite3_file* file = nullptr;
  sqlite3_file_control(handle, "main", SQLITE_FCNTL_FILE_POINTER, &file);
  return file != nullptr && file->pMethods != nullptr &&
         file->pMethods->xRead(file, bytes.data(), Count, offset) == SQLITE_OK;
}

/// Whether the header of the open file asks for a write-ahead log.
bool IsInWalMode(sqlite3* handle) {
  constexpr sqlite3_int64 readVersionOffset = 19;
  constexpr unsigned char walVersion = 2;
  std::array<unsigned char, 1> readVersion{};
  return ReadHeader(handle, readVersionOffset, readVersion) && readVersion.front() == walVersion;
}

/// What changes when somebody writes to a file.
struct FileState {
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  long long modified = 0; ///< nanoseconds since the epoch
  long long changed = 0;  ///< the same

  bool operator==(const FileState&) const = default;
};

/// What changes when somebody writes to a catalog. There is no lock between its users if one of
/// them sees it on a read-only file system.
struct CatalogState {
  FileState database;
  FileState log;
  std::array<unsigned char, 4> changeCounter{};

  bool operator==(const CatalogState&) const = default;
};

long long Nanoseconds(const timespec& time) {
  return time.tv_sec * 1'000'000'000LL + time.tv_nsec;
}

/// The part of a time below a second.
long long Fraction(long long nanoseconds) {
  return nanoseconds % 1'000'000'000;
}

FileState StateOf(const struct stat& status) {
  return {.device = status.st_dev,
          .inode = status.st_ino,
          .size = status.st_size,
          .modified = Nanoseconds(status.st_mtim),
          .changed = Nanoseconds(status.st_ctim)};
}

CatalogState StateOf(const DatabaseFiles& files, sqlite3* handle) {
  CatalogState state{.database = StateOf(files.Status("")),
                     .log = StateOf(files.Status(DatabaseFiles::WRITE_AHEAD_LOG))};
  constexpr sqlite3_int64 changeCounterOffset = 24;
  ReadHeader(handle, changeCounterOffset, state.changeCounter);
  return state;
}

/// Whether every later change gives a file another time than this state has: a file system gives
/// changes within one tick of its clock the same time. Its clock may also be ahead.
bool IsSettled(const FileState& file) {
  using std::chrono::nanoseconds;
  constexpr nanoseconds tick = std::chrono::milliseconds(20);
  constexpr nanoseconds coarseTick = std::chrono::seconds(2);
  const bool coarse = Fraction(file.modified) == 0 && Fraction(file.changed) == 0;
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  return Nanoseconds(now) - std::max(file.modified, file.changed) >
         (coarse ? coarseTick : tick).count();
}

/// The settled state of a catalog. Waits for it up to some seconds, then returns nothing.
std::optional<CatalogState> SettledStateOf(const DatabaseFiles& files, sqlite3* handle) {
  constexpr std::chrono::milliseconds pause(25);
  constexpr int pauses = 100;
  for (int i = 0; i < pauses; ++i) {
    const CatalogState state = StateOf(files, handle);
    if (IsSettled(state.database) && IsSettled(state.log)) {
      return state;
    }
    std::this_thread::sleep_for(pause);
  }
  return std::nullopt;
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
  if (!writable && Files().IsReadOnlyFileSystem() && IsInWalMode(Handle())) {
    OpenImmutable(catalog);
  }
}

void VolumeDB::OpenImmutable(const std::string& catalog) {
  const auto failIfChanged = [catalog](bool changed) {
    if (changed) {
      throw ErrorMessage(util::FormatString("'%s' was changed while it was read", catalog.c_str()));
    }
  };
  const std::optional<CatalogState> before = SettledStateOf(Files(), Handle());
  failIfChanged(!before);
  if (before->log.size != 0) {
    throw ErrorMessage(util::FormatString("'%s' has a write-ahead log, which cannot be read on a "
                                          "read-only file system",
                                          catalog.c_str()));
  }
  Open(catalog, Access::ReadOnly, CATALOG_BUSY_TIMEOUT, true);
  // The volume may be writable elsewhere.
  CheckBeforeCommit([this, failIfChanged, state = *before] {
    failIfChanged(StateOf(Files(), Handle()) != state);
  });
}

} // namespace orva::db

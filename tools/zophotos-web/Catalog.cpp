#include "Catalog.h"

#include "catalog/VolumeRoot.h"

#include "orvadb/DB.h"
#include "orvadb/ErrorMessage.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"
#include "orvautil/Core.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <array>
#include <cstddef>

namespace orva::web {
namespace {

/// Milliseconds. Writers in WAL mode do not block readers.
constexpr int BUSY_TIMEOUT = 500;

/// What changes when a file is written; zero if there is none.
struct FileState {
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  std::array<long, 4> times{};

  bool operator==(const FileState&) const = default;
};

FileState StateOf(const catalog::VolumeRoot& volume, const char* suffix) {
  const util::FileDescriptor file = volume.Open(core::GetCatalogPath("") + suffix, O_PATH);
  struct stat status {};
  if (!file || fstat(file.Get(), &status) != 0) {
    return {};
  }
  return {.device = status.st_dev,
          .inode = status.st_ino,
          .size = status.st_size,
          .times = {status.st_mtim.tv_sec, status.st_mtim.tv_nsec, status.st_ctim.tv_sec,
                    status.st_ctim.tv_nsec}};
}

struct CatalogState {
  FileState database;
  FileState log;
  bool hasJournal = false;
  bool hasSharedMemory = false;

  /// Whether everything is in the database file, so that it can be read without its logs.
  bool IsComplete() const { return log.size == 0 && !hasJournal; }

  bool operator==(const CatalogState&) const = default;
};

CatalogState StateOf(const catalog::VolumeRoot& volume) {
  return {.database = StateOf(volume, ""),
          .log = StateOf(volume, "-wal"),
          .hasJournal = StateOf(volume, "-journal").inode != 0,
          .hasSharedMemory = StateOf(volume, "-shm").inode != 0};
}

class Catalog : public db::DB {
public:
  using Ids = std::vector<std::optional<std::int64_t>>;

  Catalog(const catalog::VolumeRoot& volume, bool immutable) {
    Open(volume.Path() + '/' + core::GetCatalogPath(""), Access::ReadOnly, BUSY_TIMEOUT, immutable);
  }

  Ids Find(const std::vector<std::string>& paths, WorkWatch& watch) const {
    const WorkWatch::Scope limit(watch, Handle());
    const db::Transaction oneState(*this, BUSY_TIMEOUT);
    RejectComputedColumns("Files");
    Ids ids;
    for (const std::string& path : paths) {
      ids.push_back(Find(path));
    }
    return ids;
  }

private:
  std::optional<std::int64_t> Find(const std::string& path) const {
    db::Statement query(*this, "SELECT id FROM Files WHERE path = ? AND isDeleted = 0 LIMIT 1");
    query.BindText(1, path);
    if (!query.Fetch() || !query.IsInteger(0) || query.GetInt64(0) < 0) {
      return std::nullopt;
    }
    return query.GetInt64(0);
  }
};

} // namespace

std::vector<std::optional<std::int64_t>> FindFileIds(const catalog::VolumeRoot& volume,
                                                     const std::vector<std::string>& paths,
                                                     WorkWatch& watch) {
  constexpr int ATTEMPTS = 3;
  for (int i = 0; i < ATTEMPTS; ++i) {
    const CatalogState before = StateOf(volume);
    if (!before.IsComplete() && !before.hasSharedMemory && before.log.size != 0) {
      // SQLite would make the shared memory, and we do not write on volumes.
      throw std::string("its write-ahead log is not in use; the indexer has to open it first");
    }
    if (!before.IsComplete()) {
      return Catalog(volume, false).Find(paths, watch);
    }
    // With logs SQLite would make files. Without, nothing locks the file: see whether it changed.
    auto ids = Catalog(volume, true).Find(paths, watch);
    if (StateOf(volume) == before) {
      return ids;
    }
  }
  throw std::string("it changes all the time");
}

} // namespace orva::web

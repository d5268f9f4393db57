#include "SlowFile.h"

#include <sqlite3.h>

#include <algorithm>
#include <chrono>
#include <new>
#include <optional>
#include <stdexcept>
#include <thread>

namespace orva::test {

namespace {

/// A file of the system's VFS, which follows it in memory.
struct WatchedFile {
  sqlite3_file base;
  bool isSlow;
};

struct Watch {
  std::string path;
  int reads = 0;
  int locked = 0;
  int most = 0;
};

std::optional<Watch> watch;
sqlite3_vfs* systemVfs = nullptr;
sqlite3_vfs slowVfs;
sqlite3_io_methods slowMethods;

sqlite3_file* RealFile(sqlite3_file* file) {
  return reinterpret_cast<sqlite3_file*>(reinterpret_cast<WatchedFile*>(file) + 1);
}

int ReadSlowly(sqlite3_file* file, void* buffer, int size, sqlite3_int64 offset) {
  if (watch && reinterpret_cast<WatchedFile*>(file)->isSlow) {
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
    ++watch->reads;
    watch->most = std::max(watch->most, ++watch->locked);
  }
  return RealFile(file)->pMethods->xRead(RealFile(file), buffer, size, offset);
}

int UnlockWatched(sqlite3_file* file, int level) {
  if (watch && reinterpret_cast<WatchedFile*>(file)->isSlow && level == SQLITE_LOCK_NONE) {
    watch->locked = 0;
  }
  return RealFile(file)->pMethods->xUnlock(RealFile(file), level);
}

void SetMethods() {
  slowMethods.iVersion = 1;
  slowMethods.xClose = [](sqlite3_file* file) {
    return RealFile(file)->pMethods->xClose(RealFile(file));
  };
  slowMethods.xRead = &ReadSlowly;
  slowMethods.xWrite = [](sqlite3_file* file, const void* bytes, int size, sqlite3_int64 offset) {
    return RealFile(file)->pMethods->xWrite(RealFile(file), bytes, size, offset);
  };
  slowMethods.xTruncate = [](sqlite3_file* file, sqlite3_int64 size) {
    return RealFile(file)->pMethods->xTruncate(RealFile(file), size);
  };
  slowMethods.xSync = [](sqlite3_file* file, int flags) {
    return RealFile(file)->pMethods->xSync(RealFile(file), flags);
  };
  slowMethods.xFileSize = [](sqlite3_file* file, sqlite3_int64* size) {
    return RealFile(file)->pMethods->xFileSize(RealFile(file), size);
  };
  slowMethods.xLock = [](sqlite3_file* file, int level) {
    return RealFile(file)->pMethods->xLock(RealFile(file), level);
  };
  slowMethods.xUnlock = &UnlockWatched;
  slowMethods.xCheckReservedLock = [](sqlite3_file* file, int* isReserved) {
    return RealFile(file)->pMethods->xCheckReservedLock(RealFile(file), isReserved);
  };
  slowMethods.xFileControl = [](sqlite3_file* file, int operation, void* argument) {
    return RealFile(file)->pMethods->xFileControl(RealFile(file), operation, argument);
  };
  slowMethods.xSectorSize = [](sqlite3_file* file) {
    return RealFile(file)->pMethods->xSectorSize(RealFile(file));
  };
  slowMethods.xDeviceCharacteristics = [](sqlite3_file* file) {
    return RealFile(file)->pMethods->xDeviceCharacteristics(RealFile(file));
  };
}

/// Only databases that are opened to be read are watched: others may use a write-ahead log.
int OpenWatched(sqlite3_vfs* /*vfs*/, const char* name, sqlite3_file* file, int flags,
                int* outFlags) {
  if (name == nullptr || !watch || watch->path != name || (flags & SQLITE_OPEN_READONLY) == 0) {
    return systemVfs->xOpen(systemVfs, name, file, flags, outFlags);
  }
  auto* const watched = new (file) WatchedFile{.base = {}, .isSlow = true};
  const int code = systemVfs->xOpen(systemVfs, name, RealFile(file), flags, outFlags);
  watched->base.pMethods = RealFile(file)->pMethods == nullptr ? nullptr : &slowMethods;
  return code;
}

} // namespace

SlowFile::SlowFile(const std::string& path) {
  SetMethods();
  systemVfs = sqlite3_vfs_find(nullptr);
  slowVfs = *systemVfs;
  slowVfs.zName = "slow";
  slowVfs.szOsFile += static_cast<int>(sizeof(WatchedFile));
  slowVfs.xOpen = &OpenWatched;
  watch = Watch{.path = path};
  if (sqlite3_vfs_register(&slowVfs, 1) != SQLITE_OK) {
    throw std::runtime_error("cannot register the slow disk");
  }
}

SlowFile::~SlowFile() {
  sqlite3_vfs_unregister(&slowVfs);
  sqlite3_vfs_register(systemVfs, 1);
  watch.reset();
}

int SlowFile::Reads() const noexcept {
  return watch->reads;
}

int SlowFile::MostReadsLocked() const noexcept {
  return watch->most;
}

} // namespace orva::test

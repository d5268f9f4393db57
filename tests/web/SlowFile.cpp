#include "SlowFile.h"

#include <sqlite3.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <new>
#include <stdexcept>
#include <thread>
#include <utility>

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

Watch* watch = nullptr;
sqlite3_vfs* systems = nullptr;
sqlite3_vfs slow;
sqlite3_io_methods methods;

sqlite3_file* Real(sqlite3_file* file) {
  return reinterpret_cast<sqlite3_file*>(reinterpret_cast<WatchedFile*>(file) + 1);
}

int Read(sqlite3_file* file, void* buffer, int size, sqlite3_int64 offset) {
  if (watch != nullptr && reinterpret_cast<WatchedFile*>(file)->isSlow) {
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
    ++watch->reads;
    watch->most = std::max(watch->most, ++watch->locked);
  }
  return Real(file)->pMethods->xRead(Real(file), buffer, size, offset);
}

int Unlock(sqlite3_file* file, int level) {
  if (watch != nullptr && reinterpret_cast<WatchedFile*>(file)->isSlow &&
      level == SQLITE_LOCK_NONE) {
    watch->locked = 0;
  }
  return Real(file)->pMethods->xUnlock(Real(file), level);
}

void SetMethods() {
  methods.iVersion = 1;
  methods.xClose = [](sqlite3_file* file) { return Real(file)->pMethods->xClose(Real(file)); };
  methods.xRead = &Read;
  methods.xWrite = [](sqlite3_file* file, const void* bytes, int size, sqlite3_int64 offset) {
    return Real(file)->pMethods->xWrite(Real(file), bytes, size, offset);
  };
  methods.xTruncate = [](sqlite3_file* file, sqlite3_int64 size) {
    return Real(file)->pMethods->xTruncate(Real(file), size);
  };
  methods.xSync = [](sqlite3_file* file, int flags) {
    return Real(file)->pMethods->xSync(Real(file), flags);
  };
  methods.xFileSize = [](sqlite3_file* file, sqlite3_int64* size) {
    return Real(file)->pMethods->xFileSize(Real(file), size);
  };
  methods.xLock = [](sqlite3_file* file, int level) {
    return Real(file)->pMethods->xLock(Real(file), level);
  };
  methods.xUnlock = &Unlock;
  methods.xCheckReservedLock = [](sqlite3_file* file, int* isReserved) {
    return Real(file)->pMethods->xCheckReservedLock(Real(file), isReserved);
  };
  methods.xFileControl = [](sqlite3_file* file, int operation, void* argument) {
    return Real(file)->pMethods->xFileControl(Real(file), operation, argument);
  };
  methods.xSectorSize = [](sqlite3_file* file) {
    return Real(file)->pMethods->xSectorSize(Real(file));
  };
  methods.xDeviceCharacteristics = [](sqlite3_file* file) {
    return Real(file)->pMethods->xDeviceCharacteristics(Real(file));
  };
}

/// Only databases that are opened to be read are watched: others may use a write-ahead log.
int Open(sqlite3_vfs* /*vfs*/, const char* name, sqlite3_file* file, int flags, int* outFlags) {
  if (name == nullptr || watch == nullptr || watch->path != name ||
      (flags & SQLITE_OPEN_READONLY) == 0) {
    return systems->xOpen(systems, name, file, flags, outFlags);
  }
  auto* const watched = new (file) WatchedFile{.base = {}, .isSlow = true};
  const int code = systems->xOpen(systems, name, Real(file), flags, outFlags);
  watched->base.pMethods = Real(file)->pMethods == nullptr ? nullptr : &methods;
  return code;
}

} // namespace

SlowFile::SlowFile(const std::string& path) {
  SetMethods();
  systems = sqlite3_vfs_find(nullptr);
  slow = *systems;
  slow.zName = "slow";
  slow.szOsFile += static_cast<int>(sizeof(WatchedFile));
  slow.xOpen = &Open;
  watch = new Watch{.path = path};
  if (sqlite3_vfs_register(&slow, 1) != SQLITE_OK) {
    throw std::runtime_error("cannot register the slow disk");
  }
}

SlowFile::~SlowFile() {
  sqlite3_vfs_unregister(&slow);
  sqlite3_vfs_register(systems, 1);
  delete std::exchange(watch, nullptr);
}

int SlowFile::Reads() const noexcept {
  return watch->reads;
}

int SlowFile::MostReadsLocked() const noexcept {
  return watch->most;
}

} // namespace orva::test

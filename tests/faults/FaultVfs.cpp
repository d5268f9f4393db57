#include "FaultVfs.h"

#include <sqlite3.h>

#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <utility>

namespace orva::test {

namespace {

FaultVfs* current = nullptr;

std::string ContentOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

/// Our file, followed by the real one in the memory that SQLite allocates.
struct FaultFile : sqlite3_file {
  const char* path; ///< SQLite keeps it until the file is closed; null for a temporary file
  /// A sync also saves the name of a new journal: SQLite then syncs its directory.
  bool syncsItsName;
};

const char* PathOf(sqlite3_file* file) {
  return static_cast<FaultFile*>(file)->path;
}

std::string DirectoryOf(const char* path) {
  return std::filesystem::path(path).parent_path();
}

sqlite3_file* Real(sqlite3_file* file) {
  return reinterpret_cast<sqlite3_file*>(static_cast<FaultFile*>(file) + 1);
}

sqlite3_vfs* Real(sqlite3_vfs* vfs) {
  return static_cast<sqlite3_vfs*>(vfs->pAppData);
}

bool Fails(Request request, const char* path, const std::function<void()>& partly = {}) {
  return current->Fails(request, path, partly);
}

// Requests on an open file.

int Close(sqlite3_file* file) {
  return Real(file)->pMethods->xClose(Real(file));
}

int Read(sqlite3_file* file, void* bytes, int count, sqlite3_int64 offset) {
  if (Fails(Request::Read, PathOf(file))) {
    return current->Code();
  }
  return Real(file)->pMethods->xRead(Real(file), bytes, count, offset);
}

int Write(sqlite3_file* file, const void* bytes, int count, sqlite3_int64 offset) {
  const auto half = [&] { Real(file)->pMethods->xWrite(Real(file), bytes, count / 2, offset); };
  if (Fails(Request::Write, PathOf(file), half)) {
    return current->Code();
  }
  return Real(file)->pMethods->xWrite(Real(file), bytes, count, offset);
}

int Truncate(sqlite3_file* file, sqlite3_int64 size) {
  if (Fails(Request::Truncate, PathOf(file))) {
    return current->Code();
  }
  return Real(file)->pMethods->xTruncate(Real(file), size);
}

int Sync(sqlite3_file* file, int flags) {
  if (Fails(Request::Sync, PathOf(file))) {
    return current->Code();
  }
  const int code = Real(file)->pMethods->xSync(Real(file), flags);
  current->Synced(PathOf(file));
  if (static_cast<FaultFile*>(file)->syncsItsName) {
    current->Synced(DirectoryOf(PathOf(file)).c_str());
  }
  return code;
}

int FileSize(sqlite3_file* file, sqlite3_int64* size) {
  if (Fails(Request::Size, PathOf(file))) {
    return current->Code();
  }
  return Real(file)->pMethods->xFileSize(Real(file), size);
}

int Lock(sqlite3_file* file, int lock) {
  if (Fails(Request::Lock, PathOf(file))) {
    return current->Code();
  }
  return Real(file)->pMethods->xLock(Real(file), lock);
}

int Unlock(sqlite3_file* file, int lock) {
  return Real(file)->pMethods->xUnlock(Real(file), lock);
}

int CheckReservedLock(sqlite3_file* file, int* reserved) {
  return Real(file)->pMethods->xCheckReservedLock(Real(file), reserved);
}

int FileControl(sqlite3_file* file, int operation, void* argument) {
  return Real(file)->pMethods->xFileControl(Real(file), operation, argument);
}

int SectorSize(sqlite3_file* file) {
  return Real(file)->pMethods->xSectorSize(Real(file));
}

int DeviceCharacteristics(sqlite3_file* file) {
  return Real(file)->pMethods->xDeviceCharacteristics(Real(file));
}

int ShmMap(sqlite3_file* file, int region, int size, int extend, void volatile** memory) {
  return Real(file)->pMethods->xShmMap(Real(file), region, size, extend, memory);
}

int ShmLock(sqlite3_file* file, int offset, int count, int flags) {
  if ((flags & SQLITE_SHM_LOCK) != 0 && Fails(Request::Lock, PathOf(file))) {
    return current->Code();
  }
  return Real(file)->pMethods->xShmLock(Real(file), offset, count, flags);
}

void ShmBarrier(sqlite3_file* file) {
  Real(file)->pMethods->xShmBarrier(Real(file));
}

int ShmUnmap(sqlite3_file* file, int remove) {
  return Real(file)->pMethods->xShmUnmap(Real(file), remove);
}

/// Version 2, without memory mapping, which would bypass this file system.
constexpr sqlite3_io_methods METHODS = {2,
                                        Close,
                                        Read,
                                        Write,
                                        Truncate,
                                        Sync,
                                        FileSize,
                                        Lock,
                                        Unlock,
                                        CheckReservedLock,
                                        FileControl,
                                        SectorSize,
                                        DeviceCharacteristics,
                                        ShmMap,
                                        ShmLock,
                                        ShmBarrier,
                                        ShmUnmap,
                                        nullptr,
                                        nullptr};

// Requests on names.

int Open(sqlite3_vfs* vfs, const char* path, sqlite3_file* file, int flags, int* outFlags) {
  file->pMethods = nullptr;
  if (Fails(Request::Open, path)) {
    return current->Code();
  }
  current->Touching(path);
  static_cast<FaultFile*>(file)->path = path;
  static_cast<FaultFile*>(file)->syncsItsName =
      (flags & SQLITE_OPEN_CREATE) != 0 &&
      (flags & (SQLITE_OPEN_MAIN_JOURNAL | SQLITE_OPEN_WAL)) != 0;
  const int code = Real(vfs)->xOpen(Real(vfs), path, Real(file), flags, outFlags);
  if (Real(file)->pMethods != nullptr) {
    current->Opened(path);
    file->pMethods = &METHODS;
  }
  return code;
}

int Delete(sqlite3_vfs* vfs, const char* path, int syncDirectory) {
  if (Fails(Request::Delete, path)) {
    return current->Code();
  }
  current->Touching(path);
  current->SetDeleting(true);
  const int code = Real(vfs)->xDelete(Real(vfs), path, syncDirectory);
  current->SetDeleting(false);
  current->Deleted(path);
  if (syncDirectory != 0) {
    current->Synced(DirectoryOf(path).c_str());
  }
  return code;
}

int Access(sqlite3_vfs* vfs, const char* path, int flags, int* result) {
  if (Fails(Request::Access, path)) {
    return current->Code();
  }
  return Real(vfs)->xAccess(Real(vfs), path, flags, result);
}

int Sleep(sqlite3_vfs* /*vfs*/, int microseconds) {
  return microseconds;
}

} // namespace

/// The registered file system: the real one but for some functions.
struct FaultVfs::Registration {
  Registration() : real(sqlite3_vfs_find(nullptr)), vfs(*real) {
    vfs.zName = "faults";
    vfs.pAppData = real;
    vfs.szOsFile = static_cast<int>(sizeof(FaultFile)) + real->szOsFile;
    vfs.xOpen = Open;
    vfs.xDelete = Delete;
    vfs.xAccess = Access;
    vfs.xSleep = Sleep;
    sqlite3_vfs_register(&vfs, 1);
  }
  Registration(const Registration&) = delete;
  Registration& operator=(const Registration&) = delete;
  ~Registration() {
    sqlite3_vfs_unregister(&vfs);
    sqlite3_vfs_register(real, 1);
  }

  sqlite3_vfs* real; ///< SQLite's
  sqlite3_vfs vfs;
};

FaultVfs::FaultVfs(FaultPlan plan) : plan_(std::move(plan)) {
  if (current != nullptr) {
    throw std::logic_error("two fault file systems");
  }
  registration_ = std::make_unique<Registration>();
  current = this;
}

FaultVfs::~FaultVfs() {
  current = nullptr;
}

FaultVfs* FaultVfs::Current() noexcept {
  return current;
}

bool FaultVfs::Concerns(const char* path) const {
  return path != nullptr && std::string(path).find(plan_.files) != std::string::npos;
}

bool FaultVfs::Fails(Request request, const char* path, const std::function<void()>& partly) {
  if (!Concerns(path) || std::ranges::find(plan_.requests, request) == plan_.requests.end()) {
    return false;
  }
  ++seen_;
  const bool fails = seen_ == plan_.nth || (plan_.permanent && plan_.nth != 0 && seen_ > plan_.nth);
  if (fails && partly) {
    partly();
  }
  if (fails && plan_.effect != FaultPlan::Effect::Error) {
    Crash();
  }
  failed_ += fails ? 1 : 0;
  return fails;
}

bool FaultVfs::Follows(const char* path) const {
  return plan_.effect == FaultPlan::Effect::PowerLoss && Concerns(path);
}

void FaultVfs::Touching(const char* path) {
  if (Follows(path) && !files_.contains(path) && std::filesystem::exists(path)) {
    files_[path] = std::make_shared<std::string>(ContentOf(path));
    lasting_[path] = files_[path];
  }
}

void FaultVfs::Opened(const char* path) {
  if (Follows(path)) {
    files_.try_emplace(path, std::make_shared<std::string>());
  }
}

void FaultVfs::Synced(const char* path) {
  if (plan_.effect != FaultPlan::Effect::PowerLoss || path == nullptr) {
    return;
  }
  if (std::filesystem::is_directory(path)) {
    DirectorySynced(path);
  } else if (const auto file = files_.find(path); file != files_.end()) {
    *file->second = ContentOf(path);
  }
}

void FaultVfs::DirectorySynced(const std::string& path) {
  const auto isThere = [&](const auto& file) { return DirectoryOf(file.first.c_str()) == path; };
  std::erase_if(lasting_, isThere);
  std::ranges::copy_if(files_, std::inserter(lasting_, lasting_.end()), isThere);
}

void FaultVfs::Deleted(const char* path) {
  files_.erase(path);
}

void FaultVfs::Renamed(const char* from, const char* to) {
  auto file = files_.extract(from);
  files_.erase(to);
  if (!file.empty()) {
    file.key() = to;
    files_.insert(std::move(file));
  }
}

void FaultVfs::Crash() const {
  for (const auto& [path, content] : files_) {
    if (path.find(plan_.lost) == std::string::npos) {
      *content = ContentOf(path);
    }
    std::filesystem::remove(path);
  }
  for (const auto& [path, content] : plan_.losesNames ? lasting_ : files_) {
    std::ofstream(path, std::ios::binary) << *content;
  }
  _exit(CRASHED);
}

} // namespace orva::test

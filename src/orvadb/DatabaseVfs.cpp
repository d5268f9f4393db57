#include "DatabaseVfs.h"

#include "orvadb/ErrorMessage.h"

#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <exception>
#include <filesystem>
#include <mutex>
#include <new>
#include <system_error>
#include <utility>
#include <vector>

namespace orva::db {

namespace {

/// The databases that are open in this process. SQLite names files by their paths when it opens
/// and deletes them.
class OpenDatabases {
public:
  void Add(const DatabaseFiles& files) {
    const std::lock_guard lock(mutex_);
    databases_.push_back(&files);
  }

  void Remove(const DatabaseFiles& files) {
    const std::lock_guard lock(mutex_);
    databases_.erase(std::ranges::find(databases_, &files));
  }

  /// Calls `use` with the last database that `isWanted` accepts, which lives until `use` has
  /// returned. Returns whether there is one.
  template <typename Predicate, typename Use>
  bool WithLast(const Predicate& isWanted, const Use& use) {
    const std::lock_guard lock(mutex_);
    const auto found = std::find_if(databases_.rbegin(), databases_.rend(),
                                    [&](const auto* files) { return isWanted(*files); });
    if (found == databases_.rend()) {
      return false;
    }
    use(**found);
    return true;
  }

private:
  std::mutex mutex_;
  std::vector<const DatabaseFiles*> databases_;
};

OpenDatabases& Databases() {
  static OpenDatabases databases;
  return databases;
}

thread_local std::string lastRefusal;

/// The database that SQLite opens or deletes a file for, while it does; null when it does not tell.
thread_local const DatabaseFiles* current = nullptr;

/// Sets `current` for as long as it lives.
class CurrentScope {
public:
  explicit CurrentScope(const DatabaseFiles& files) noexcept { current = &files; }
  CurrentScope(const CurrentScope&) = delete;
  CurrentScope& operator=(const CurrentScope&) = delete;
  ~CurrentScope() { current = nullptr; }
};

/// Calls `use` with the open database that `isWanted` accepts: the current one, if it does,
/// otherwise the last that was opened. Returns whether there is one.
template <typename Predicate, typename Use>
bool WithDatabase(const Predicate& isWanted, const Use& use) {
  if (current != nullptr && isWanted(*current)) {
    use(*current);
    return true;
  }
  return Databases().WithLast(isWanted, use);
}

/// Whether `path` is that of a file of `files`.
bool Contains(const DatabaseFiles& files, const char* path) {
  return files.Suffix(path).has_value();
}

int OpenFile(const char* path, int flags, int mode) {
  int descriptor = -1;
  const auto openFile = [&](const DatabaseFiles& files) {
    std::string refusal;
    descriptor =
        files.Open(*files.Suffix(path), flags, static_cast<mode_t>(mode), refusal).Release();
    if (!refusal.empty()) {
      lastRefusal.swap(refusal);
    }
  };
  const auto openDirectory = [&](const DatabaseFiles& files) {
    descriptor = files.OpenDirectory(flags).Release();
  };
  const auto isFile = [&](const DatabaseFiles& files) { return Contains(files, path); };
  const auto isDirectory = [&](const DatabaseFiles& files) { return files.Directory() == path; };
  if (!WithDatabase(isFile, openFile) && !WithDatabase(isDirectory, openDirectory)) {
    // A temporary file, or one of a connection that is not ours.
    descriptor = open(path, flags, mode);
  }
  return descriptor;
}

bool DeleteFile(const char* path) {
  bool deleted = false;
  const auto isFile = [&](const DatabaseFiles& files) { return Contains(files, path); };
  const auto deleteFile = [&](const DatabaseFiles& files) {
    deleted = files.Delete(*files.Suffix(path));
  };
  if (!WithDatabase(isFile, deleteFile)) {
    deleted = unlink(path) == 0;
  }
  return deleted;
}

// SQLite calls these two in the place of open(2) and unlink(2). It knows no exceptions.

int OpenCall(const char* path, int flags, int mode) noexcept {
  try {
    return OpenFile(path, flags, mode);
  } catch (const std::bad_alloc&) {
    errno = ENOMEM;
    return -1;
  }
}

int UnlinkCall(const char* path) noexcept {
  try {
    return DeleteFile(path) ? 0 : -1;
  } catch (const std::bad_alloc&) {
    errno = ENOMEM;
    return -1;
  }
}

/// Has SQLite use the two functions above, in the whole process.
void ReplaceSystemCalls() {
  sqlite3_vfs* const unix = sqlite3_vfs_find("unix");
  unix->xSetSystemCall(unix, "open", reinterpret_cast<sqlite3_syscall_ptr>(&OpenCall));
  unix->xSetSystemCall(unix, "unlink", reinterpret_cast<sqlite3_syscall_ptr>(&UnlinkCall));
}

sqlite3_vfs* Default() {
  static const bool replaced = (ReplaceSystemCalls(), true);
  static_cast<void>(replaced);
  return sqlite3_vfs_find(nullptr);
}

} // namespace

DatabaseVfs::DatabaseVfs(const std::string& path, bool written)
    : sqlite3_vfs(*Default()), original_(sqlite3_vfs_find(nullptr)),
      files_(FullPath(path), written),
      name_(util::FormatString("orva-%p", static_cast<const void*>(this))) {
  zName = name_.c_str();
  xOpen = Open;
  xDelete = Delete;
  xAccess = Access;
  if (sqlite3_vfs_register(this, 0) != SQLITE_OK) {
    throw ErrorMessage("out of memory");
  }
  Databases().Add(files_);
}

DatabaseVfs::~DatabaseVfs() {
  Databases().Remove(files_);
  sqlite3_vfs_unregister(this);
}

std::string DatabaseVfs::FullPath(const std::string& path) {
  // Without resolving links, which SQLite does and then refuses the path.
  std::error_code error;
  const std::filesystem::path full = std::filesystem::absolute(path, error);
  return error ? path : full.lexically_normal().string();
}

std::string DatabaseVfs::TakeRefusal() {
  return std::exchange(lastRefusal, {});
}

bool DatabaseVfs::Accepts(const char* path) const noexcept {
  if (Contains(files_, path)) {
    return true;
  }
  try {
    lastRefusal = DatabaseFiles::Refused("'%s' names another file", files_.Path() + "-journal");
  } catch (const std::exception&) {
    lastRefusal.clear(); // no memory: SQLite's own message has to do
  }
  return false;
}

int DatabaseVfs::Open(sqlite3_vfs* self, const char* path, sqlite3_file* file, int flags,
                      int* outFlags) {
  const DatabaseVfs& vfs = *static_cast<DatabaseVfs*>(self);
  const bool temporary = (flags & SQLITE_OPEN_DELETEONCLOSE) != 0;
  if (!temporary && !vfs.Accepts(path)) {
    file->pMethods = nullptr;
    return SQLITE_CANTOPEN;
  }
  const CurrentScope scope(vfs.files_);
  return vfs.original_->xOpen(vfs.original_, path, file, flags, outFlags);
}

int DatabaseVfs::Delete(sqlite3_vfs* self, const char* path, int syncDirectory) {
  const DatabaseVfs& vfs = *static_cast<DatabaseVfs*>(self);
  if (!vfs.Accepts(path)) {
    return SQLITE_IOERR_DELETE;
  }
  const CurrentScope scope(vfs.files_);
  return vfs.original_->xDelete(vfs.original_, path, syncDirectory);
}

int DatabaseVfs::Access(sqlite3_vfs* self, const char* path, int flags, int* result) {
  const DatabaseVfs& vfs = *static_cast<DatabaseVfs*>(self);
  return vfs.Accepts(path) ? vfs.original_->xAccess(vfs.original_, path, flags, result)
                           : SQLITE_IOERR_ACCESS;
}

} // namespace orva::db

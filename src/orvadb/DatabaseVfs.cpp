#include "DatabaseVfs.h"

#include "orvadb/ErrorMessage.h"

#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sys/stat.h>
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

/// The database that SQLite opens or deletes a file for; null while no function of DatabaseVfs
/// runs.
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

/// The state of a file as stat(2) gives it, but links are not followed. SQLite uses it to look for
/// journals, to give them the owner of the database, and to notice that the database was replaced.
int StatFile(const char* path, struct stat* status) {
  int result = -1;
  const auto statFile = [&](const DatabaseFiles& files) {
    result = files.Stat(*files.Suffix(path), *status) ? 0 : -1;
  };
  const auto isFile = [&](const DatabaseFiles& files) { return Contains(files, path); };
  if (!WithDatabase(isFile, statFile)) {
    result = stat(path, status);
  }
  return result;
}

/// Whether a file is as this process creates files. SQLite gives every journal to the owner of the
/// database, also one that it finds.
bool IsNew(int descriptor) {
  struct stat status {};
  return fstat(descriptor, &status) == 0 && status.st_size == 0 && status.st_uid == geteuid();
}

/// Calls `call`; its failures are errnos. SQLite, which calls, knows no exceptions.
template <typename Call>
int Guarded(const Call& call) noexcept {
  try {
    return call();
  } catch (...) {
    errno = ENOMEM;
    return -1;
  }
}

// SQLite calls these in the place of the system calls.

int OpenCall(const char* path, int flags, int mode) noexcept {
  return Guarded([&] { return OpenFile(path, flags, mode); });
}

int UnlinkCall(const char* path) noexcept {
  return Guarded([&] { return DeleteFile(path) ? 0 : -1; });
}

int StatCall(const char* path, struct stat* status) noexcept {
  return Guarded([&] { return StatFile(path, status); });
}

int ChownCall(int descriptor, uid_t user, gid_t group) noexcept {
  return IsNew(descriptor) ? fchown(descriptor, user, group) : 0;
}

int ChmodCall(int descriptor, mode_t mode) noexcept {
  return IsNew(descriptor) ? fchmod(descriptor, mode) : 0;
}

/// Has SQLite use the functions above, in the whole process.
void ReplaceSystemCalls() {
  sqlite3_vfs* const unix = sqlite3_vfs_find("unix");
  if (unix == nullptr) {
    throw ErrorMessage("out of memory");
  }
  const auto replace = [unix](const char* name, auto* function) {
    unix->xSetSystemCall(unix, name, reinterpret_cast<sqlite3_syscall_ptr>(function));
  };
  replace("open", &OpenCall);
  replace("unlink", &UnlinkCall);
  replace("stat", &StatCall);
  replace("fchown", &ChownCall);
  replace("fchmod", &ChmodCall);
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
  Databases().Add(files_);
  if (sqlite3_vfs_register(this, 0) != SQLITE_OK) {
    Databases().Remove(files_);
    throw ErrorMessage("out of memory");
  }
}

DatabaseVfs::~DatabaseVfs() {
  sqlite3_vfs_unregister(this);
  Databases().Remove(files_);
}

std::string DatabaseVfs::FullPath(const std::string& path) {
  // Without resolving links, which SQLite does and then refuses the path.
  std::error_code error;
  const std::filesystem::path full = std::filesystem::absolute(path, error);
  return error ? path : full.lexically_normal().string();
}

const std::string& DatabaseVfs::LastRefusal() noexcept {
  return lastRefusal;
}

void DatabaseVfs::ForgetRefusal() noexcept {
  lastRefusal.clear();
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

int DatabaseVfs::CountRead(sqlite3_file* file, void* bytes, int count, sqlite3_int64 offset) {
  auto& counted = *reinterpret_cast<CountedFile*>(const_cast<sqlite3_io_methods*>(file->pMethods));
  const int code = counted.read(file, bytes, count, offset);
  if (code == SQLITE_OK) {
    try {
      counted.counter.Count(offset, count);
    } catch (const std::bad_alloc&) {
      return SQLITE_IOERR_NOMEM;
    }
  }
  return code;
}

int DatabaseVfs::Open(sqlite3_vfs* self, const char* path, sqlite3_file* file, int flags,
                      int* outFlags) {
  DatabaseVfs& vfs = *static_cast<DatabaseVfs*>(self);
  const bool temporary = (flags & SQLITE_OPEN_DELETEONCLOSE) != 0;
  const bool named = (flags & SQLITE_OPEN_SUPER_JOURNAL) != 0; // by a journal
  if (!temporary && (named || !vfs.Accepts(path))) {
    file->pMethods = nullptr;
    return SQLITE_CANTOPEN;
  }
  const CurrentScope scope(vfs.files_);
  const int code = vfs.original_->xOpen(vfs.original_, path, file, flags, outFlags);
  if (file->pMethods != nullptr && (flags & (SQLITE_OPEN_MAIN_DB | SQLITE_OPEN_WAL)) != 0) {
    CountedFile& counted = (flags & SQLITE_OPEN_WAL) != 0 ? vfs.log_ : vfs.database_;
    counted.read = file->pMethods->xRead;
    counted.methods = *file->pMethods;
    counted.methods.xRead = CountRead;
    file->pMethods = &counted.methods;
  }
  return code;
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

#include "DatabaseFiles.h"

#include "orvadb/ErrorMessage.h"

#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <thread>
#include <utility>

namespace orva::db {

namespace {

constexpr std::array<const char*, 3> LOG_SUFFIXES{"-journal", DatabaseFiles::WRITE_AHEAD_LOG,
                                                  "-shm"};

/// Opens a file of the directory `folder`, without following or waiting. A program that holds a
/// lease on the file, as file servers do, is given half a second to release it.
util::FileDescriptor OpenAt(int folder, const char* name, int flags, mode_t mode) {
  constexpr std::chrono::milliseconds pause(10);
  constexpr int pauses = 50;
  for (int i = 0;; ++i) {
    util::FileDescriptor file(
        openat(folder, name, flags | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC, mode));
    if (file || errno != EWOULDBLOCK || i == pauses) {
      return file;
    }
    std::this_thread::sleep_for(pause);
  }
}

/// The mount that an open file is on; 0 if the kernel does not report it.
std::uint64_t MountOf(int descriptor) {
  struct statx status {};
  return statx(descriptor, "", AT_EMPTY_PATH, STATX_MNT_ID, &status) == 0 &&
                 (status.stx_mask & STATX_MNT_ID) != 0
             ? status.stx_mnt_id
             : 0;
}

} // namespace

DatabaseFiles::DatabaseFiles(std::string path, bool written)
    : path_(std::move(path)), directory_(path_.substr(0, path_.rfind('/'))),
      name_(path_.substr(path_.rfind('/') + 1)), written_(written) {
  folder_.Reset(open(directory_.empty() ? "/" : directory_.c_str(),
                     O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!folder_ || fstat(folder_.Get(), &folderStatus_) != 0) {
    folderError_ = errno;
    folder_.Reset();
  }
  folderMount_ = MountOf(folder_.Get());
}

std::optional<std::string_view> DatabaseFiles::Suffix(std::string_view path) const {
  if (path.starts_with(path_)) {
    path.remove_prefix(path_.size());
    if (path.empty() || std::ranges::find(LOG_SUFFIXES, path) != LOG_SUFFIXES.end()) {
      return path;
    }
  }
  return std::nullopt;
}

util::FileDescriptor DatabaseFiles::Open(std::string_view suffix, int flags, mode_t mode,
                                         std::string& refusal) const {
  if (!IsInPlace()) {
    return {};
  }
  const std::string name = Name(suffix);
  // To open a device may have an effect, and closing a descriptor releases all locks that this
  // process holds on the file: look before.
  struct stat status {};
  if (fstatat(folder_.Get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) {
    refusal = Refusal(suffix, status);
  }
  util::FileDescriptor file;
  if (refusal.empty()) {
    file = OpenAt(folder_.Get(), name.c_str(), flags, mode);
    if (!file) {
      return file;
    }
    if (fstat(file.Get(), &status) != 0) {
      return {};
    }
    refusal = Refusal(suffix, status);
    if (refusal.empty() && MayBeWritten(suffix) && IsOnAnotherMount(file.Get())) {
      refusal = Refused("'%s' is a mount of its own", path_ + std::string(suffix));
    }
  }
  if (!refusal.empty()) {
    file.Reset();
    errno = EPERM;
  } else if (suffix.empty()) {
    databaseOwner_ = status.st_uid;
  }
  return file;
}

util::FileDescriptor DatabaseFiles::OpenDirectory(int flags) const {
  return IsInPlace() ? OpenAt(folder_.Get(), ".", flags | O_DIRECTORY, 0) : util::FileDescriptor();
}

bool DatabaseFiles::Delete(std::string_view suffix) const {
  return IsInPlace() && unlinkat(folder_.Get(), Name(suffix).c_str(), 0) == 0;
}

bool DatabaseFiles::DeleteLogs() const {
  bool gone = true;
  for (const char* const suffix : LOG_SUFFIXES) {
    gone = (Delete(suffix) || errno == ENOENT) && gone;
  }
  return gone;
}

bool DatabaseFiles::DeleteAll() const {
  const bool gone = Delete("") || errno == ENOENT;
  return DeleteLogs() && gone;
}

void DatabaseFiles::Publish(const DatabaseFiles& target) const {
  Synchronise();
  if (!target.DeleteLogs()) {
    throw ErrorMessage(
        util::FormatString("cannot remove what is left of '%s'", target.path_.c_str()));
  }
  if (renameat(folder_.Get(), name_.c_str(), folder_.Get(), target.name_.c_str()) != 0) {
    throw ErrorMessage(util::FormatString("cannot rename '%s' to '%s': %s", path_.c_str(),
                                          target.path_.c_str(), std::strerror(errno)));
  }
  const util::FileDescriptor directory = OpenDirectory(O_RDONLY);
  // Some file systems cannot synchronise a directory and do not need to.
  if (!directory || (fsync(directory.Get()) != 0 && errno != EINVAL)) {
    throw ErrorMessage(util::FormatString("cannot synchronise '%s': %s", directory_.c_str(),
                                          std::strerror(errno)));
  }
}

void DatabaseFiles::Synchronise() const {
  std::string refusal;
  const util::FileDescriptor file = Open("", O_RDONLY, 0, refusal);
  if (!file || fsync(file.Get()) != 0) {
    throw ErrorMessage(refusal.empty() ? util::FormatString("cannot synchronise '%s': %s",
                                                            path_.c_str(), std::strerror(errno))
                                       : refusal);
  }
}

bool DatabaseFiles::Stat(std::string_view suffix, struct stat& status) const {
  return IsInPlace() &&
         fstatat(folder_.Get(), Name(suffix).c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0;
}

struct stat DatabaseFiles::Status(std::string_view suffix) const {
  struct stat status {};
  if (!Stat(suffix, status)) {
    status = {};
  }
  return status;
}

bool DatabaseFiles::IsReadOnlyFileSystem() const {
  const util::FileDescriptor file(
      openat(folder_.Get(), name_.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
  struct statvfs status {};
  return file && fstatvfs(file.Get(), &status) == 0 && (status.f_flag & ST_RDONLY) != 0;
}

std::string DatabaseFiles::Refused(const char* format, const std::string& path) {
  return util::FormatString(format, path.c_str());
}

std::string DatabaseFiles::Name(std::string_view suffix) const {
  return name_ + std::string(suffix);
}

/// Why a file must not be used; empty if it may be.
std::string DatabaseFiles::Refusal(std::string_view suffix, const struct stat& status) const {
  const std::string path = path_ + std::string(suffix);
  if (!S_ISREG(status.st_mode)) {
    return Refused("'%s' is not a regular file", path);
  }
  if (MayBeWritten(suffix) && status.st_nlink > 1) {
    return Refused("'%s' has another name", path);
  }
  // SQLite gives the logs to the owner of the database.
  if (written_ && !suffix.empty() && status.st_uid != databaseOwner_ &&
      status.st_uid != geteuid()) {
    return Refused("'%s' belongs to another user", path);
  }
  return {};
}

/// Even to read a database SQLite may write into its logs or change their owner.
bool DatabaseFiles::MayBeWritten(std::string_view suffix) const {
  return written_ || !suffix.empty();
}

/// Whether the path still leads to the directory; otherwise errno says why not.
bool DatabaseFiles::IsInPlace() const {
  struct stat status {};
  if (!folder_) {
    errno = folderError_;
    return false;
  }
  if (lstat(directory_.empty() ? "/" : directory_.c_str(), &status) != 0) {
    return false;
  }
  errno = ENOENT;
  return status.st_dev == folderStatus_.st_dev && status.st_ino == folderStatus_.st_ino;
}

/// A directory of the appliance may be mounted, but not one of the files in it.
bool DatabaseFiles::IsOnAnotherMount(int descriptor) const {
  struct stat status {};
  return folderMount_ != 0
             ? MountOf(descriptor) != folderMount_
             : fstat(descriptor, &status) != 0 || status.st_dev != folderStatus_.st_dev;
}

} // namespace orva::db

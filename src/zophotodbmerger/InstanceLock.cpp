#include "InstanceLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <cerrno>

namespace orva::dbmerger {

namespace {

using util::FileDescriptor;

bool IsOwn(const struct stat& status) {
  return status.st_uid == 0 || status.st_uid == geteuid();
}

/// Opens a directory in which no other user can create, rename or remove anything.
FileDescriptor OpenDirectory(int parent, const char* name) {
  FileDescriptor directory(openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  struct stat status {};
  if (fstat(directory.Get(), &status) != 0 || !IsOwn(status) ||
      (status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
    directory.Reset();
  }
  return directory;
}

/// Opens the directory of PATH.
FileDescriptor OpenLockDirectory() {
  const FileDescriptor run = OpenDirectory(AT_FDCWD, "/run");
  if (!run) {
    return {};
  }
  const char* const name = "zophotodbmerger";
  mkdirat(run.Get(), name, 0755); // exists already below systemd
  return OpenDirectory(run.Get(), name);
}

bool IsLockFile(const struct stat& status) {
  return S_ISREG(status.st_mode) && IsOwn(status) && status.st_nlink == 1;
}

/// Makes sure that other users cannot open a lock file. Returns whether they cannot.
bool ProtectLockFile(int file) {
  struct stat status {};
  return fstat(file, &status) == 0 && IsLockFile(status) &&
         ((status.st_mode & (S_IRWXG | S_IRWXO)) == 0 || fchmod(file, S_IRUSR | S_IWUSR) == 0);
}

} // namespace

InstanceLock::InstanceLock() {
  const FileDescriptor directory = OpenLockDirectory();
  if (!directory) {
    return;
  }
  const char* const name = "lock";
  file_.Reset(openat(directory.Get(), name, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC,
                     S_IRUSR | S_IWUSR));
  if (!file_) {
    // The file of root's daemon, for a daemon without privileges.
    struct stat status {};
    isHeldByAnother_ = errno == EACCES &&
                       fstatat(directory.Get(), name, &status, AT_SYMLINK_NOFOLLOW) == 0 &&
                       IsLockFile(status);
  } else if (!ProtectLockFile(file_.Get())) {
    file_.Reset();
  } else if (flock(file_.Get(), LOCK_EX | LOCK_NB) != 0) {
    isHeldByAnother_ = errno == EWOULDBLOCK;
  }
}

} // namespace orva::dbmerger

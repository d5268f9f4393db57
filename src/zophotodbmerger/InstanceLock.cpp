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

/// Opens a file that no other user can open, and creates it when there is none.
FileDescriptor OpenFile(int directory, const char* name) {
  FileDescriptor file(openat(
      directory, name, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, S_IRUSR | S_IWUSR));
  struct stat status {};
  if (fstat(file.Get(), &status) != 0 || !S_ISREG(status.st_mode) || !IsOwn(status) ||
      (status.st_mode & (S_IRWXG | S_IRWXO)) != 0 || status.st_nlink != 1) {
    file.Reset();
  }
  return file;
}

/// Opens the file of PATH.
FileDescriptor OpenLockFile() {
  const FileDescriptor run = OpenDirectory(AT_FDCWD, "/run");
  if (!run) {
    return {};
  }
  const char* const name = "zophotodbmerger";
  mkdirat(run.Get(), name, 0755); // exists already below systemd
  const FileDescriptor directory = OpenDirectory(run.Get(), name);
  return directory ? OpenFile(directory.Get(), "lock") : FileDescriptor();
}

} // namespace

InstanceLock::InstanceLock() : file_(OpenLockFile()) {
  if (file_ && flock(file_.Get(), LOCK_EX | LOCK_NB) != 0) {
    isHeldByAnother_ = errno == EWOULDBLOCK;
  }
}

} // namespace orva::dbmerger

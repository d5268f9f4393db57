#include "VolumeRoot.h"

#include "orvautil/Exception.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <system_error>
#include <utility>

namespace orva::catalog {
namespace {

bool IsMountPoint(int folder) {
  struct statx status {};
  return statx(folder, "", AT_EMPTY_PATH | AT_NO_AUTOMOUNT, STATX_TYPE, &status) == 0 &&
         (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

} // namespace

VolumeRoot::VolumeRoot(std::string path, Kind kind)
    : path_(std::move(path)),
      root_(open(path_.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC)) {
  if (!root_) {
    throw util::Exception(path_ + ": " + std::generic_category().message(errno));
  }
  if (kind == Kind::Mount && !IsMountPoint(root_.Get())) {
    throw util::Exception(path_ + ": nothing is mounted there");
  }
}

util::FileDescriptor VolumeRoot::Open(const std::string& path, int flags, mode_t mode) const {
  open_how how{};
  // openat2 refuses flags without a meaning.
  const int waiting = (flags & O_PATH) != 0 ? 0 : O_NONBLOCK | O_NOCTTY;
  how.flags = static_cast<std::uint64_t>(flags | waiting | O_NOFOLLOW | O_CLOEXEC);
  how.mode = mode;
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS;
  return util::FileDescriptor(static_cast<int>(
      syscall(SYS_openat2, root_.Get(), path.empty() ? "." : path.c_str(), &how, sizeof how)));
}

bool VolumeRoot::IsInPlace() const {
  struct stat opened {};
  struct stat found {};
  return fstat(root_.Get(), &opened) == 0 &&
         fstatat(AT_FDCWD, path_.c_str(), &found, AT_SYMLINK_NOFOLLOW) == 0 &&
         opened.st_dev == found.st_dev && opened.st_ino == found.st_ino;
}

} // namespace orva::catalog

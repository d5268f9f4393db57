#include "VolumeRoot.h"

#include "orvautil/Exception.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <string_view>
#include <system_error>
#include <utility>

namespace orva::catalog {
namespace {

bool IsMountPoint(int folder) {
  struct statx status {};
  return statx(folder, "", AT_EMPTY_PATH | AT_NO_AUTOMOUNT, STATX_TYPE, &status) == 0 &&
         (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0;
}

/// What openat2 does with RESOLVE_BENEATH and RESOLVE_NO_SYMLINKS, for systems that refuse it:
/// opens one component after the other, each without following a link. Refuses ".." and empty
/// components.
util::FileDescriptor OpenByComponents(int root, std::string_view path, int flags, mode_t mode) {
  constexpr int FOLDER = O_PATH | O_NOFOLLOW | O_CLOEXEC;
  util::FileDescriptor folder(openat(root, ".", FOLDER));
  while (folder) {
    const std::size_t end = path.find('/');
    const std::string name(path.substr(0, end));
    if (name.empty() || name == "..") {
      errno = EXDEV;
      break;
    }
    if (end == std::string_view::npos) {
      return util::FileDescriptor(openat(folder.Get(), name.c_str(), flags, mode));
    }
    path.remove_prefix(end + 1);
    // The next step refuses what is no folder.
    folder.Reset(openat(folder.Get(), name.c_str(), FOLDER));
    struct stat status {};
    if (folder && fstat(folder.Get(), &status) == 0 && S_ISLNK(status.st_mode)) {
      errno = ELOOP;
      break;
    }
    if (path.empty()) { // "folder/"
      path = ".";
    }
  }
  return {};
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
  flags |= waiting | O_NOFOLLOW | O_CLOEXEC;
  how.flags = static_cast<std::uint64_t>(flags);
  how.mode = mode;
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS;
  // Ends at the first NUL, as for the system: "..\0" is "..".
  const char* const relative = path.empty() ? "." : path.c_str();
  util::FileDescriptor file(
      static_cast<int>(syscall(SYS_openat2, root_.Get(), relative, &how, sizeof how)));
  // systemd refuses openat2 to services with RestrictSUIDSGID=yes, so to those with
  // DynamicUser=yes.
  return file || errno != ENOSYS ? std::move(file)
                                 : OpenByComponents(root_.Get(), relative, flags, mode);
}

long long VolumeRoot::FreeSpace() const {
  struct statvfs status {};
  if (fstatvfs(root_.Get(), &status) != 0) {
    return 0;
  }
  const bool hasInode = status.f_files == 0 || status.f_ffree != 0; // 0 files: made as needed
  return hasInode ? static_cast<long long>(status.f_bfree) * static_cast<long long>(status.f_frsize)
                  : 0;
}

bool VolumeRoot::IsInPlace() const {
  struct stat opened {};
  struct stat found {};
  return fstat(root_.Get(), &opened) == 0 &&
         fstatat(AT_FDCWD, path_.c_str(), &found, AT_SYMLINK_NOFOLLOW) == 0 &&
         opened.st_dev == found.st_dev && opened.st_ino == found.st_ino;
}

} // namespace orva::catalog

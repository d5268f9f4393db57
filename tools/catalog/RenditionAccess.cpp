#include "RenditionAccess.h"

#include "Renditions.h"
#include "VolumeRoot.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <tuple>

namespace orva::catalog {
namespace {

constexpr mode_t READ = S_IRUSR | S_IRGRP | S_IROTH;

bool IsLater(const timespec& a, const timespec& b) {
  return std::tie(a.tv_sec, a.tv_nsec) > std::tie(b.tv_sec, b.tv_nsec);
}

} // namespace

RenditionAccess::RenditionAccess(const VolumeRoot& root, const std::string& path) : root_(root) {
  const std::size_t length = path.size() - (path.ends_with('/') ? 1 : 0);
  for (std::size_t end = 0; isKnown_ && end < length;) {
    end = std::min(path.find('/', end + 1), length);
    const util::FileDescriptor folder = root.Open(path.substr(0, end), O_PATH | O_DIRECTORY);
    struct stat status {};
    isKnown_ = folder && fstat(folder.Get(), &status) == 0;
    if (isKnown_ && (status.st_mode & S_IXOTH) == 0) {
      restrictions_.push_back((status.st_mode & S_IXGRP) != 0 ? std::optional(status.st_gid)
                                                              : std::nullopt);
    }
  }
}

mode_t RenditionAccess::ModeFor(mode_t photo, gid_t group) const {
  if (!isKnown_) {
    return photo & S_IRUSR;
  }
  mode_t mode = photo & READ;
  for (const std::optional<gid_t>& passing : restrictions_) {
    mode &= ~static_cast<mode_t>(S_IROTH);
    if (passing != group) {
      mode &= ~static_cast<mode_t>(S_IRGRP);
    }
  }
  return mode;
}

bool RenditionAccess::IsOutdated(long long id, const PhotoAccess& photo) {
  if (number_ != id / RENDITIONS_PER_FOLDER) {
    number_ = id / RENDITIONS_PER_FOLDER;
    renditions_ = root_.Open(RenditionFolder(id), O_PATH | O_DIRECTORY);
  }
  struct stat rendition {};
  if (!renditions_ ||
      fstatat(renditions_.Get(), RenditionName(id).c_str(), &rendition, AT_SYMLINK_NOFOLLOW) != 0) {
    return false;
  }
  // A rendition has permissions to read only. If it has others, they could not be set.
  const mode_t mode = rendition.st_mode & static_cast<mode_t>(~S_IFMT);
  if ((mode & ~READ) == 0 && mode != ModeFor(photo.mode, photo.group)) {
    return true;
  }
  // If the owner could not be set, it differs from the beginning.
  return (rendition.st_uid != photo.owner || rendition.st_gid != photo.group) &&
         IsLater(photo.changed, rendition.st_ctim);
}

} // namespace orva::catalog

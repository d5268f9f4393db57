#pragma once

#include "orvautil/FileDescriptor.h"

#include <sys/types.h>

#include <string>

namespace orva::catalog {

/// The root folder of a volume, open. Other users may rename and replace everything on a volume at
/// any time, so what is on it is opened through this descriptor, and no link is followed. While an
/// object exists, the volume cannot be unmounted. Const operations may run in any thread.
class VolumeRoot {
public:
  enum class Kind {
    Mount,    ///< the root folder of a mounted file system
    Directory ///< any folder
  };

  /// Opens the volume at the absolute `path`. Throws util::Exception when there is no folder, or,
  /// for a Mount, when nothing is mounted there.
  VolumeRoot(std::string path, Kind kind);

  const std::string& Path() const noexcept { return path_; }

  /// The descriptor (O_PATH), still owned by this object.
  int Descriptor() const noexcept { return root_.Get(); }

  /// Opens `path`, relative to the root, as open(2) does; an empty path is the root. Links anywhere
  /// in it are refused (ELOOP), and so is a path that leads out of the volume (EXDEV). Does not
  /// wait for a FIFO. Returns no descriptor, with errno, when that fails.
  util::FileDescriptor Open(const std::string& path, int flags, mode_t mode = 0) const;

  /// Bytes that are free for files, including those that are reserved; 0 if there is no inode for
  /// another file, or if that is not known.
  long long FreeSpace() const;

  /// Whether the volume is still at its path.
  bool IsInPlace() const;

private:
  std::string path_;
  util::FileDescriptor root_;
};

} // namespace orva::catalog

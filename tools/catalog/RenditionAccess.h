#pragma once

#include "orvautil/FileDescriptor.h"

#include <sys/types.h>

#include <ctime>
#include <optional>
#include <string>
#include <vector>

namespace orva::catalog {

class VolumeRoot;

/// Whose a photo is.
struct PhotoAccess {
  mode_t mode = 0;
  uid_t owner = 0;
  gid_t group = 0;
  timespec changed{}; ///< its ctime
};

/// Who may read the photos of one folder, and so their renditions. On one thread.
class RenditionAccess {
public:
  /// For the folder at `path`, relative to the volume; it may end in "/". `root` outlives the
  /// object.
  RenditionAccess(const VolumeRoot& root, const std::string& path);

  /// The mode of a rendition: of the mode `photo` what allows reading, as far as the folders on the
  /// way let the same users pass. `group` is that of the photo.
  mode_t ModeFor(mode_t photo, gid_t group) const;

  /// Whether the rendition of the file `id` has another owner, group or mode than it would get now.
  /// False if there is none, and where the file system does not keep these.
  bool IsOutdated(long long id, const PhotoAccess& photo);

private:
  const VolumeRoot& root_;
  bool isKnown_ = true; ///< all folders on the way can be examined
  /// The groups of the folders on the way that others cannot pass; none if the group cannot either.
  std::vector<std::optional<gid_t>> restrictions_;
  long long number_ = -1; ///< of the open folder of renditions
  util::FileDescriptor renditions_;
};

} // namespace orva::catalog

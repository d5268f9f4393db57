#pragma once

#include "SnapshotReader.h"

#include <optional>
#include <string>

namespace orva::web {

/// Where a photo is.
struct VolumePath {
  std::string root;     ///< folder of the volume: "/shares/Photos"
  std::string relative; ///< to the root; no component is empty, "." or ".."
};

/// Where the photo is. Nothing if its volume is not a folder directly below /shares, or if its path
/// does not lead to a file below the volume: the merged database is untrusted.
std::optional<VolumePath> Locate(const Photo& photo);

} // namespace orva::web

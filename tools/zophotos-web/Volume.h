#pragma once

#include "zophotos-web/SnapshotReader.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace orva::zophotos {
struct Activity;
}

namespace orva::web {

/// A volume that is in the merged database, or that a service knows.
struct Volume {
  std::string mountPoint; ///< with a separator at its end
  bool isMerged = false;  ///< is in the merged database
  bool isGone = false;    ///< only the statistics are left
  std::int64_t transcoded = 0;
  std::int64_t total = 0;
  std::int64_t mergedUpTo = 0; ///< stamp; 0 for none
  // Nothing if the service does not run or does not know the volume.
  std::optional<std::string> state{}; ///< of the indexer: walking, watching, timed, ...
  std::optional<std::int64_t> foldersWaiting{};
  std::optional<std::int64_t> waiting{}; ///< photos without a rendition yet
  std::optional<std::int64_t> failed{};  ///< photos
  bool isRendering = false;
  std::string activity{}; ///< for people: "being indexed, 12 folders waiting"; empty for nothing

  bool operator==(const Volume&) const = default;
};

/// All volumes, by mount point.
std::vector<Volume> Combine(const std::vector<VolumeRow>& rows, const zophotos::Activity& services);

} // namespace orva::web

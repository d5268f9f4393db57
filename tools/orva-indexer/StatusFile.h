#pragma once

#include <string>
#include <vector>

namespace orva::indexer {

/// What the indexer does with a volume.
struct VolumeStatus {
  std::string mountPoint; ///< ends in "/"
  const char* state = ""; ///< "walking", "watching", "timed", "read-only" or "unusable"
  std::size_t foldersWaiting = 0;
  long long files = 0;
};

/// Replaces the status file in `directory`, which other programs read at any time. A failure is not
/// reported.
void WriteStatus(const std::string& directory, const std::vector<VolumeStatus>& volumes);

} // namespace orva::indexer

#pragma once

#include <iosfwd>
#include <map>
#include <string>
#include <vector>

namespace orva::notify {

/// The mounted volumes: mount points with the identifiers of their mounts.
using Volumes = std::map<std::string, int>;

/// Whether `path`, which is canonical, is directly below /shares.
bool IsDirectlyBelowShares(const std::string& path);

/// Reads a table in the format of /proc/self/mountinfo. Returns the visible mount points directly
/// below /shares. Malformed lines are skipped.
Volumes ReadVolumes(std::istream& mountInfo);

struct VolumeChanges {
  std::vector<std::string> unplugged;
  std::vector<std::string> plugged;
};

/// The changes between two tables, ordered by path. A mount point with another mount than before
/// was unplugged and plugged.
VolumeChanges Compare(const Volumes& before, const Volumes& now);

} // namespace orva::notify

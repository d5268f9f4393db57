#pragma once

#include <iosfwd>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace orva::notify {

/// A mount. The kernel gives the number of an earlier mount to the next one, which may be of
/// another disk.
struct MountIdentity {
  int number = 0;
  std::string device{}; ///< "MAJOR:MINOR"
  bool operator==(const MountIdentity&) const = default;
};

/// The mounted volumes, by mount point.
using Volumes = std::map<std::string, MountIdentity>;

/// Whether `path`, which is canonical, is directly below /shares.
bool IsDirectlyBelowShares(const std::string& path);

/// Whether the directory is /shares, or above it: it contains the volumes, so it is no volume whose
/// photos are indexed and rendered.
bool ContainsShares(const std::string& directory);

/// Reads a table in the format of /proc/self/mountinfo. Returns the visible mount points directly
/// below /shares. Malformed lines are skipped.
Volumes ReadVolumes(std::istream& mountInfo);

/// All mount points of such a table.
std::set<std::string> ReadMountPoints(std::istream& mountInfo);

struct VolumeChanges {
  std::vector<std::string> unplugged;
  std::vector<std::string> plugged;
};

/// The changes between two tables, ordered by path. A mount point with another mount than before
/// was unplugged and plugged.
VolumeChanges Compare(const Volumes& before, const Volumes& now);

} // namespace orva::notify

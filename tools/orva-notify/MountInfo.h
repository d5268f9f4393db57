#pragma once

#include <iosfwd>
#include <map>
#include <string>
#include <vector>

namespace orva::notify {

/// The mounted volumes: mount point to the identifier of what is mounted there.
using Volumes = std::map<std::string, int>;

/// Reads a table in the format of /proc/self/mountinfo and returns the mount points directly
/// below /shares that can be seen. Lines that cannot be read are passed over.
Volumes ReadVolumes(std::istream& mountInfo);

struct VolumeChanges {
  std::vector<std::string> unplugged;
  std::vector<std::string> plugged;
};

/// What happened between two tables, in path order. A mount point at which something else is
/// mounted now was unplugged and plugged.
VolumeChanges Compare(const Volumes& before, const Volumes& now);

} // namespace orva::notify

#include "orva-notify/MountInfo.h"

#include <filesystem>
#include <istream>
#include <sstream>

namespace orva::notify {
namespace {

const std::string SHARES = "/shares";

bool IsOctal(char c) {
  return c >= '0' && c <= '7';
}

// The kernel writes spaces, tabs, newlines and backslashes as a backslash and three octal digits.
std::string DecodeOctal(const std::string& text) {
  std::string decoded;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\' && i + 3 < text.size() && IsOctal(text[i + 1]) && IsOctal(text[i + 2]) &&
        IsOctal(text[i + 3])) {
      decoded += static_cast<char>((text[i + 1] - '0') * 64 + (text[i + 2] - '0') * 8 +
                                   (text[i + 3] - '0'));
      i += 3;
    } else {
      decoded += text[i];
    }
  }
  return decoded;
}

/// The mount points of the mounts that are in `volumes` and not in `others`.
std::vector<std::string> MountPointsOnlyIn(const Volumes& volumes, const Volumes& others) {
  std::vector<std::string> mountPoints;
  for (const auto& [mountPoint, identity] : volumes) {
    const auto other = others.find(mountPoint);
    if (other == others.end() || other->second != identity) {
      mountPoints.push_back(mountPoint);
    }
  }
  return mountPoints;
}

} // namespace

bool IsDirectlyBelowShares(const std::string& path) {
  const std::string start = SHARES + "/";
  return path.size() > start.size() && path.starts_with(start) &&
         path.find('/', start.size()) == std::string::npos;
}

bool ContainsShares(const std::string& directory) {
  const std::filesystem::path path = std::filesystem::path(directory) / ""; // ends in "/"
  return (SHARES + '/').starts_with(path.lexically_normal().native());
}

Volumes ReadVolumes(std::istream& mountInfo) {
  Volumes volumes;
  std::string line;
  while (std::getline(mountInfo, line)) {
    // Fields are separated by spaces only: the kernel does not escape other white space.
    std::istringstream fields(line);
    MountIdentity identity;
    std::string parent, root, mountPoint;
    fields >> identity.number >> parent >> identity.device;
    fields.get();
    std::getline(fields, root, ' ');
    if (!std::getline(fields, mountPoint, ' ')) {
      continue;
    }
    mountPoint = DecodeOctal(mountPoint);
    if (mountPoint == SHARES) {
      volumes.clear(); // this mount hides those below the earlier one
    } else if (IsDirectlyBelowShares(mountPoint)) {
      volumes[mountPoint] = identity; // the last of several mounts on one mount point is visible
    }
  }
  return volumes;
}

std::set<std::string> ReadMountPoints(std::istream& mountInfo) {
  std::set<std::string> mountPoints;
  for (std::string line; std::getline(mountInfo, line);) {
    std::istringstream fields(line);
    std::string field;
    for (int number = 0; number < 5 && std::getline(fields, field, ' '); ++number) {
    }
    mountPoints.insert(DecodeOctal(field));
  }
  return mountPoints;
}

VolumeChanges Compare(const Volumes& before, const Volumes& now) {
  return {.unplugged = MountPointsOnlyIn(before, now), .plugged = MountPointsOnlyIn(now, before)};
}

} // namespace orva::notify

#include "orva-notify/MountInfo.h"

#include <istream>
#include <sstream>

namespace orva::notify {
namespace {

const std::string SHARES = "/shares";

bool IsOctal(char c) {
  return c >= '0' && c <= '7';
}

// The kernel writes blanks, line ends and backslashes as a backslash and three octal digits.
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

bool IsDirectlyBelowShares(const std::string& mountPoint) {
  const std::string start = SHARES + "/";
  return mountPoint.size() > start.size() && mountPoint.starts_with(start) &&
         mountPoint.find('/', start.size()) == std::string::npos;
}

} // namespace

Volumes ReadVolumes(std::istream& mountInfo) {
  Volumes volumes;
  std::string line;
  while (std::getline(mountInfo, line)) {
    // Only blanks part the fields: the kernel leaves other white space in a name as it is.
    std::istringstream fields(line);
    int id = 0;
    std::string parent, device, root, mountPoint;
    fields >> id >> parent >> device;
    fields.get();
    std::getline(fields, root, ' ');
    if (!std::getline(fields, mountPoint, ' ')) {
      continue;
    }
    mountPoint = DecodeOctal(mountPoint);
    if (mountPoint == SHARES) {
      volumes.clear(); // what was mounted below is hidden now
    } else if (IsDirectlyBelowShares(mountPoint)) {
      volumes[mountPoint] = id; // of several mounts on one place the last one is seen
    }
  }
  return volumes;
}

VolumeChanges Compare(const Volumes& before, const Volumes& now) {
  VolumeChanges changes;
  for (const auto& [mountPoint, id] : before) {
    const auto found = now.find(mountPoint);
    if (found == now.end() || found->second != id) {
      changes.unplugged.push_back(mountPoint);
    }
  }
  for (const auto& [mountPoint, id] : now) {
    const auto found = before.find(mountPoint);
    if (found == before.end() || found->second != id) {
      changes.plugged.push_back(mountPoint);
    }
  }
  return changes;
}

} // namespace orva::notify

#include "VolumePaths.h"

#include <algorithm>
#include <cstddef>
#include <string_view>

namespace orva::web {
namespace {

constexpr std::string_view SHARES = "/shares/";

bool IsName(std::string_view text) {
  return !text.empty() && text != "." && text != "..";
}

/// The folder of the volume without its separator; empty if it is not directly below /shares.
std::string_view RootOf(std::string_view mountPoint) {
  if (!mountPoint.starts_with(SHARES) || !mountPoint.ends_with('/')) {
    return {};
  }
  const std::string_view root = mountPoint.substr(0, mountPoint.size() - 1);
  const std::string_view name = root.substr(std::min(SHARES.size(), root.size()));
  return IsName(name) && name.find('/') == std::string_view::npos ? root : std::string_view();
}

/// Whether each component of a relative path is a name.
bool HasOnlyNames(std::string_view path) {
  for (std::size_t begin = 0; begin <= path.size();) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    if (!IsName(path.substr(begin, end - begin))) {
      return false;
    }
    begin = end + 1;
  }
  return true;
}

} // namespace

std::optional<VolumePath> Locate(const Photo& photo) {
  const std::string_view root = RootOf(photo.volume);
  if (root.empty() || !photo.path.starts_with(photo.volume) ||
      photo.path.find('\0') != std::string::npos) {
    return std::nullopt;
  }
  const std::string relative = photo.path.substr(photo.volume.size());
  if (!HasOnlyNames(relative)) {
    return std::nullopt;
  }
  return VolumePath{.root = std::string(root), .relative = relative};
}

} // namespace orva::web

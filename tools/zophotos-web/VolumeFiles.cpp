#include "VolumeFiles.h"

#include "VolumePaths.h"

#include "catalog/Renditions.h"
#include "catalog/VolumeRoot.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <string_view>

namespace orva::web {
namespace {

using catalog::VolumeRoot;

/// A rendition has at most 1,024 pixels on its longer side.
constexpr std::uint64_t MOST_RENDITION = 16 << 20;

/// The products' own folders in the root of a volume.
std::array<std::string, 2> OwnFolders() {
  return {core::GetORVA_HOME(""), ".zophotos"};
}

std::optional<VolumeRoot> OpenRoot(const std::string& path) {
  try {
    return std::optional<VolumeRoot>(std::in_place, path, VolumeRoot::Kind::Directory);
  } catch (const util::Exception&) {
    return std::nullopt; // unplugged, or not for this user
  }
}

std::optional<VolumeFile> Open(const VolumeRoot& volume, const std::string& path) {
  VolumeFile result;
  result.file = volume.Open(path, O_RDONLY);
  struct stat status {};
  if (!result.file || fstat(result.file.Get(), &status) != 0 || !S_ISREG(status.st_mode)) {
    return std::nullopt;
  }
  result.size = static_cast<std::uint64_t>(status.st_size);
  result.tag =
      util::FormatString("\"%llx-%llx-%llx.%lx\"", static_cast<unsigned long long>(status.st_ino),
                         static_cast<unsigned long long>(status.st_size),
                         static_cast<unsigned long long>(status.st_mtim.tv_sec),
                         static_cast<unsigned long>(status.st_mtim.tv_nsec));
  return result;
}

bool IsEqualFolded(std::string_view a, std::string_view b) {
  const auto fold = [](char c) {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  };
  return std::ranges::equal(a, b, {}, fold, fold);
}

bool IsSameFolder(const VolumeRoot& volume, const std::string& a, const std::string& b) {
  const util::FileDescriptor first = volume.Open(a, O_PATH);
  const util::FileDescriptor second = volume.Open(b, O_PATH);
  struct stat one {};
  struct stat other {};
  return first && second && fstat(first.Get(), &one) == 0 && fstat(second.Get(), &other) == 0 &&
         one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

/// Whether the first component of `path` is one of the products' own folders. Some file systems
/// know a folder by several names.
bool IsInOwnFolder(const VolumeRoot& volume, const std::string& path) {
  const std::string first = path.substr(0, path.find('/'));
  return std::ranges::any_of(OwnFolders(), [&](const std::string& own) {
    return IsEqualFolded(first, own) || IsSameFolder(volume, first, own);
  });
}

} // namespace

std::optional<VolumeFile> VolumeFiles::OpenOriginal(const Photo& photo) const {
  const auto path = Locate(photo);
  const auto volume = path ? OpenRoot(path->root) : std::nullopt;
  if (!volume || IsInOwnFolder(*volume, path->relative)) {
    return std::nullopt;
  }
  return Open(*volume, path->relative);
}

std::optional<VolumeFile> VolumeFiles::OpenRendition(const Photo& photo) {
  const auto path = Locate(photo);
  const auto volume = path ? OpenRoot(path->root) : std::nullopt;
  const auto id = volume ? ids_.Find(photo.id, *path, *volume) : std::nullopt;
  auto file = id ? Open(*volume, catalog::RenditionPath(*id)) : std::nullopt;
  if (!file || file->size > MOST_RENDITION) {
    return std::nullopt;
  }
  // The thread that sends it must not wait for the disk.
  readahead(file->file.Get(), 0, file->size);
  return file;
}

} // namespace orva::web

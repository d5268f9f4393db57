#include "RenditionFiles.h"

#include "Renditions.h"
#include "VolumeRoot.h"

#include "orvautil/Exception.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/sendfile.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <limits>
#include <memory>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

namespace orva::transcoder {
namespace {

using catalog::RENDITIONS_PER_FOLDER;
using util::FileDescriptor;

/// How many entries of a folder are examined. More is not our work.
constexpr int MOST_ENTRIES = 100'000;

[[noreturn]] void ThrowError(const catalog::VolumeRoot& root, const std::string& path) {
  if (errno == ENOSPC || errno == EDQUOT) {
    throw VolumeFull(root);
  }
  throw util::Exception(root.Path() + '/' + path + ": " + std::generic_category().message(errno));
}

/// The last component of a path.
std::string NameOf(const std::string& path) {
  return path.substr(path.rfind('/') + 1);
}

std::string FileName(long long id) {
  return NameOf(catalog::RenditionPath(id));
}

std::string TemporaryName(long long id) {
  return FileName(id) + ".new";
}

/// The number in `name`, which has to be exactly as `nameOf` writes it.
template <typename NameOf>
std::optional<long long> NumberIn(std::string_view name, NameOf nameOf) {
  long long number = 0;
  const auto result = std::from_chars(name.data(), name.data() + name.size(), number);
  return result.ec == std::errc() && nameOf(number) == name ? std::optional(number) : std::nullopt;
}

FileDescriptor OpenFolder(const catalog::VolumeRoot& root, const std::string& path) {
  return root.Open(path, O_RDONLY | O_DIRECTORY);
}

/// Opens a folder inside of `parent`, which is at `parentPath`. Makes it if necessary; what is
/// there and is no folder is removed.
FileDescriptor MakeFolder(const catalog::VolumeRoot& root, const FileDescriptor& parent,
                          const std::string& path) {
  const std::string name = NameOf(path);
  FileDescriptor folder = OpenFolder(root, path);
  if (!folder && (errno == ENOTDIR || errno == ELOOP)) {
    unlinkat(parent.Get(), name.c_str(), 0);
  }
  if (!folder) {
    if (mkdirat(parent.Get(), name.c_str(), 0755) != 0 && errno != EEXIST) {
      ThrowError(root, path);
    }
    folder = OpenFolder(root, path);
  }
  if (!folder) {
    ThrowError(root, path);
  }
  return folder;
}

/// Copies all of `content`. Returns whether that worked; else errno says why.
bool Copy(const FileDescriptor& content, const FileDescriptor& file) {
  off_t offset = 0;
  ssize_t count = 0;
  do {
    count = sendfile(file.Get(), content.Get(), &offset, 1 << 30);
  } while (count > 0 || (count == -1 && errno == EINTR));
  return count == 0;
}

/// Makes an empty file that only this process's user can read. Replaces what is there and is no
/// folder: a file that an earlier run left.
FileDescriptor MakeFile(const FileDescriptor& folder, const std::string& name) {
  constexpr int FLAGS = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
  FileDescriptor file(openat(folder.Get(), name.c_str(), FLAGS, 0600));
  if (!file && errno == EEXIST && unlinkat(folder.Get(), name.c_str(), 0) == 0) {
    file.Reset(openat(folder.Get(), name.c_str(), FLAGS, 0600));
  }
  return file;
}

struct DirectoryClose {
  void operator()(DIR* directory) const noexcept { closedir(directory); }
};

/// Calls `visit` with the name of each entry of the open folder.
template <typename Visit>
void ForEachEntry(const FileDescriptor& folder, Visit visit) {
  const int listed = openat(folder.Get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const std::unique_ptr<DIR, DirectoryClose> directory(fdopendir(listed));
  if (!directory) {
    return;
  }
  int entries = 0;
  while (const dirent* const entry = readdir(directory.get())) {
    const std::string name = entry->d_name;
    if (name != "." && name != ".." && ++entries <= MOST_ENTRIES) {
      visit(name);
    }
  }
}

} // namespace

VolumeFull::VolumeFull(const catalog::VolumeRoot& root)
    : Exception(root.Path() + ": " + std::generic_category().message(ENOSPC)) {}

RenditionWriter::~RenditionWriter() {
  for (const Unpublished& rendition : unpublished_) {
    unlinkat(FolderOf(rendition.id).Get(), TemporaryName(rendition.id).c_str(), 0);
  }
}

const FileDescriptor& RenditionWriter::FolderOf(long long id) {
  FileDescriptor& folder = folders_[id / RENDITIONS_PER_FOLDER];
  if (!folder) {
    const std::string renditions = catalog::RENDITIONS;
    const std::string home = renditions.substr(0, renditions.rfind('/'));
    const FileDescriptor parent = OpenFolder(root_, home);
    if (!parent) {
      ThrowError(root_, home);
    }
    const FileDescriptor all = MakeFolder(root_, parent, renditions);
    folder = MakeFolder(root_, all, catalog::RenditionFolder(id));
  }
  return folder;
}

void RenditionWriter::Add(long long id, const FileDescriptor& content, const struct stat& photo,
                          mode_t mode) {
  const FileDescriptor& folder = FolderOf(id);
  FileDescriptor file = MakeFile(folder, TemporaryName(id));
  if (!file) {
    ThrowError(root_, catalog::RenditionPath(id));
  }
  const int descriptor = file.Get();
  unpublished_.push_back({.id = id, .file = std::move(file)});
  if (!Copy(content, unpublished_.back().file)) {
    ThrowError(root_, catalog::RenditionPath(id));
  }
  // Some file systems have no owners and modes.
  static_cast<void>(fchown(descriptor, photo.st_uid, photo.st_gid) == 0);
  static_cast<void>(fchmod(descriptor, mode) == 0);
}

std::vector<long long> RenditionWriter::Publish() {
  for (const Unpublished& rendition : unpublished_) {
    sync_file_range(rendition.file.Get(), 0, 0, SYNC_FILE_RANGE_WRITE); // begins to write
  }
  for (const Unpublished& rendition : unpublished_) {
    if (fdatasync(rendition.file.Get()) != 0) {
      ThrowError(root_, catalog::RenditionPath(rendition.id));
    }
  }
  std::vector<long long> obstructed;
  while (!unpublished_.empty()) {
    const long long id = unpublished_.back().id;
    const int folder = FolderOf(id).Get();
    const std::string temporary = TemporaryName(id);
    if (renameat(folder, temporary.c_str(), folder, FileName(id).c_str()) != 0) {
      if (errno != EISDIR) {
        ThrowError(root_, catalog::RenditionPath(id));
      }
      obstructed.push_back(id);
      unlinkat(folder, temporary.c_str(), 0);
    }
    unpublished_.pop_back();
  }
  for (const auto& [number, folder] : folders_) {
    fsync(folder.Get());
  }
  return obstructed;
}

bool RemoveRendition(const catalog::VolumeRoot& root, long long id) {
  const FileDescriptor folder = OpenFolder(root, catalog::RenditionFolder(id));
  if (!folder) {
    return errno == ENOENT || errno == ENOTDIR || errno == ELOOP;
  }
  return unlinkat(folder.Get(), FileName(id).c_str(), 0) == 0 || errno == ENOENT ||
         errno == EISDIR || errno == EPERM;
}

std::vector<long long> CheckFolder(const catalog::VolumeRoot& root, long long first,
                                   const std::vector<long long>& expected,
                                   const std::function<bool(long long)>& isInUse) {
  std::vector<long long> missing = expected;
  const FileDescriptor folder = OpenFolder(root, catalog::RenditionFolder(first));
  if (!folder) {
    return missing;
  }
  ForEachEntry(folder, [&](const std::string& name) {
    const auto id = NumberIn(name, FileName);
    if (id && isInUse(*id)) {
      return;
    }
    struct stat status {};
    const auto place = id ? std::ranges::lower_bound(missing, *id) : missing.end();
    if (place == missing.end() || *place != *id ||
        fstatat(folder.Get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 ||
        !S_ISREG(status.st_mode) || status.st_size == 0) {
      unlinkat(folder.Get(), name.c_str(), 0); // does not remove a folder
    } else {
      missing.erase(place);
    }
  });
  std::erase_if(missing, isInUse);
  return missing;
}

std::vector<long long> ListFolders(const catalog::VolumeRoot& root) {
  std::vector<long long> folders;
  const FileDescriptor renditions = OpenFolder(root, catalog::RENDITIONS);
  if (!renditions) {
    return folders;
  }
  ForEachEntry(renditions, [&](const std::string& name) {
    if (unlinkat(renditions.Get(), name.c_str(), 0) == 0) {
      return;
    }
    const auto number = NumberIn(name, [](long long n) { return std::to_string(n); });
    constexpr long long LARGEST = std::numeric_limits<long long>::max() / RENDITIONS_PER_FOLDER;
    if (number && *number >= 0 && *number < LARGEST) {
      folders.push_back(*number * RENDITIONS_PER_FOLDER);
    }
  });
  return folders;
}

void RemoveEmptyFolder(const catalog::VolumeRoot& root, long long first) {
  const FileDescriptor renditions = OpenFolder(root, catalog::RENDITIONS);
  if (renditions) {
    unlinkat(renditions.Get(), NameOf(catalog::RenditionFolder(first)).c_str(), AT_REMOVEDIR);
  }
}

} // namespace orva::transcoder

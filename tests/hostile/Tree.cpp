#include "Tree.h"

#include "orvautil/FileDescriptor.h"
#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <string_view>

namespace orva::test {

namespace {

namespace fs = std::filesystem;

/// Hash of a file's data without its holes.
std::size_t HashOf(const std::string& path) {
  constexpr std::size_t pieceSize = 1U << 20U;
  std::string piece(pieceSize, '\0');
  std::size_t hash = 0;
  const util::FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  off_t begin = 0;
  while ((begin = lseek(file.Get(), begin, SEEK_DATA)) != -1) {
    const off_t end = lseek(file.Get(), begin, SEEK_HOLE);
    while (begin < end) {
      const ssize_t size = pread(file.Get(), piece.data(), piece.size(), begin);
      if (size <= 0) {
        break;
      }
      const std::string_view content(piece.data(), static_cast<std::size_t>(size));
      hash = hash * 31 + std::hash<std::string_view>{}(content);
      begin += size;
    }
  }
  return hash;
}

std::string Describe(const std::string& path) {
  struct stat status {};
  if (lstat(path.c_str(), &status) != 0) {
    return "gone";
  }
  std::string text =
      util::FormatString("mode %o, owner %u:%u, size %lld, changed %lld.%09ld", status.st_mode,
                         status.st_uid, status.st_gid, static_cast<long long>(status.st_size),
                         static_cast<long long>(status.st_mtim.tv_sec), status.st_mtim.tv_nsec);
  if (S_ISREG(status.st_mode)) {
    text += util::FormatString(", content %zx", HashOf(path));
  } else if (S_ISLNK(status.st_mode)) {
    text += ", to " + fs::read_symlink(path).string();
  }
  return text;
}

} // namespace

Tree Tree::Of(const std::vector<std::string>& directories, const Except& except) {
  Tree tree;
  const auto add = [&](const std::string& path) {
    if (!except(path)) {
      tree.items_[path] = Describe(path);
    }
  };
  for (const std::string& directory : directories) {
    add(directory);
    for (const auto& entry : fs::recursive_directory_iterator(directory)) {
      add(entry.path());
    }
  }
  return tree;
}

std::vector<std::string> Tree::ChangesSince(const Tree& earlier) const {
  std::vector<std::string> changes;
  for (const auto& [path, description] : earlier.items_) {
    const auto now = items_.find(path);
    if (now == items_.end()) {
      changes.push_back(path + ": gone");
    } else if (now->second != description) {
      changes.push_back(path + ": was " + description + "; is " + now->second);
    }
  }
  for (const auto& [path, description] : items_) {
    if (!earlier.items_.contains(path)) {
      changes.push_back(path + ": new, " + description);
    }
  }
  return changes;
}

} // namespace orva::test

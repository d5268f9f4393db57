#include "Locator.h"

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <string_view>
#include <utility>

namespace orva::indexer {
namespace {

constexpr char DIRECTORY[] = "/tmp";
constexpr char NAME[] = "zophotodbmerger.conf";
constexpr char PATH[] = "/tmp/zophotodbmerger.conf";
constexpr std::string_view KEY = "zophotos_db_path=";
constexpr std::string_view DATABASE = "/.zophotos/zophotos.db";

} // namespace

Locator::Locator() : inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  Watch();
}

/// Watches the file, or, while there is none, its directory.
void Locator::Watch() {
  const int former = watch_;
  // The file may appear or disappear in between.
  do {
    watch_ = inotify_add_watch(inotify_.Get(), PATH,
                               IN_CLOSE_WRITE | IN_DELETE_SELF | IN_MOVE_SELF | IN_ATTRIB |
                                   IN_DONT_FOLLOW);
    isOnFile_ = watch_ != -1;
    if (!isOnFile_) {
      watch_ = inotify_add_watch(inotify_.Get(), DIRECTORY, IN_CREATE | IN_MOVED_TO | IN_ONLYDIR);
    }
  } while (!isOnFile_ && watch_ != -1 && access(PATH, F_OK) == 0);
  if (former != -1 && former != watch_) {
    inotify_rm_watch(inotify_.Get(), former);
  }
}

bool Locator::HasChanged() {
  alignas(inotify_event) std::array<char, 4096> buffer;
  bool hasChanged = false;
  ssize_t size = 0;
  while ((size = read(inotify_.Get(), buffer.data(), buffer.size())) > 0) {
    for (const char* next = buffer.data(); next < buffer.data() + size;) {
      inotify_event header{};
      std::memcpy(&header, next, sizeof header);
      const char* const name = next + sizeof header;
      next = name + header.len;
      hasChanged = hasChanged || (header.wd == watch_ &&
                                  (isOnFile_ || (header.len > 0 && std::strcmp(name, NAME) == 0)));
    }
  }
  if (hasChanged) {
    Watch();
  }
  return hasChanged;
}

std::optional<std::string> Locator::Master() {
  // Any user can create something in /tmp. The daemon runs as root, or as the indexer's user.
  const util::FileDescriptor file(
      open(PATH, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat status = {};
  if (!file || fstat(file.Get(), &status) != 0 || !S_ISREG(status.st_mode) ||
      (status.st_uid != 0 && status.st_uid != geteuid())) {
    return std::nullopt;
  }
  std::string line(8192, '\0');
  const ssize_t size = read(file.Get(), line.data(), line.size());
  line.resize(static_cast<std::size_t>(std::max<ssize_t>(size, 0)));
  const std::size_t end = line.find('\n');
  if (end == std::string::npos || !line.starts_with(KEY)) {
    return std::nullopt;
  }
  line = line.substr(KEY.size(), end - KEY.size());
  if (!line.ends_with(DATABASE)) {
    return std::nullopt;
  }
  line.resize(line.size() - DATABASE.size());
  while (line.size() > 1 && line.ends_with('/')) {
    line.pop_back();
  }
  return line.starts_with('/') ? std::optional(std::move(line)) : std::nullopt;
}

} // namespace orva::indexer

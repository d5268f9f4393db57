#include "WriteWatch.h"

#include "orvautil/FormatString.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>

namespace orva::test {

namespace fs = std::filesystem;

WriteWatch::WriteWatch(const std::string& root, Except except)
    : inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)), except_(std::move(except)) {
  Add(root);
  for (const auto& entry : fs::recursive_directory_iterator(root)) {
    if (entry.is_directory() && !entry.is_symlink()) {
      Add(entry.path());
    }
  }
}

void WriteWatch::Add(const std::string& directory) {
  constexpr std::uint32_t writes =
      IN_CLOSE_WRITE | IN_MODIFY | IN_CREATE | IN_DELETE | IN_MOVE | IN_ONLYDIR;
  const int watch = inotify_add_watch(inotify_.Get(), directory.c_str(), writes);
  if (watch == -1) {
    throw std::system_error(errno, std::generic_category(), directory);
  }
  directories_[watch] = directory;
}

std::vector<std::string> WriteWatch::Take() {
  std::vector<std::string> writes;
  std::array<char, 65536> events;
  for (ssize_t size = 0; (size = read(inotify_.Get(), events.data(), events.size())) > 0;) {
    for (const char* at = events.data(); at < events.data() + size;) {
      inotify_event event{};
      std::memcpy(&event, at, sizeof event);
      const std::string path =
          directories_[event.wd] + (event.len == 0 ? "" : std::string("/") + (at + sizeof event));
      if (!except_(path)) {
        writes.push_back(path + util::FormatString(": event %x", event.mask));
      }
      at += sizeof event + event.len;
    }
  }
  return writes;
}

} // namespace orva::test

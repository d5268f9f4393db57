#include "FolderWatches.h"

#include "orvautil/FormatString.h"

#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <iterator>

namespace orva::indexer {
namespace {

constexpr std::uint32_t EVENTS = IN_CREATE | IN_MODIFY | IN_CLOSE_WRITE | IN_ATTRIB |
                                 IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE | IN_DELETE_SELF |
                                 IN_MOVE_SELF | IN_EXCL_UNLINK | IN_ONLYDIR;

/// How many reads of the queue before the caller has its turn.
constexpr int MOST_READS = 32;

} // namespace

FolderWatches::FolderWatches() : inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {}

bool FolderWatches::Add(const std::string& path, int descriptor) {
  // Through the descriptor: the name may lead to another folder by now.
  const int watch = inotify_add_watch(
      inotify_.Get(), util::FormatString("/proc/self/fd/%d", descriptor).c_str(), EVENTS);
  if (watch == -1) {
    return false;
  }
  const auto former = byPath_.find(path);
  if (former != byPath_.end() && former->second.watch != watch) {
    byWatch_.erase(former->second.watch);
    inotify_rm_watch(inotify_.Get(), former->second.watch);
  }
  // A folder has one watch, also when it was moved.
  const auto elsewhere = byWatch_.find(watch);
  if (elsewhere != byWatch_.end() && elsewhere->second != path) {
    byPath_.erase(elsewhere->second);
  }
  byWatch_[watch] = path;
  byPath_[path].watch = watch;
  return true;
}

bool FolderWatches::HasOtherAccess(const std::string& path, int descriptor) {
  const auto entry = byPath_.find(path);
  struct stat status {};
  if (entry == byPath_.end() || fstat(descriptor, &status) != 0) {
    return false;
  }
  const Watched former = entry->second;
  entry->second = {.watch = former.watch,
                   .isAccessKnown = true,
                   .passing = status.st_mode & (S_IXGRP | S_IXOTH),
                   .group = status.st_gid};
  return former.isAccessKnown &&
         (former.passing != entry->second.passing || former.group != entry->second.group);
}

void FolderWatches::Forget(const std::string& path) {
  auto entry = byPath_.lower_bound(path);
  while (entry != byPath_.end() && entry->first.starts_with(path)) {
    byWatch_.erase(entry->second.watch);
    inotify_rm_watch(inotify_.Get(), entry->second.watch);
    entry = byPath_.erase(entry);
  }
}

std::vector<FolderWatches::Event> FolderWatches::Read() {
  std::vector<Event> events;
  alignas(inotify_event) std::array<char, 65536> buffer;
  for (int reads = 0; reads < MOST_READS; ++reads) {
    const ssize_t size = read(inotify_.Get(), buffer.data(), buffer.size());
    if (size <= 0) {
      break;
    }
    for (const char* next = buffer.data(); next < buffer.data() + size;) {
      inotify_event header{};
      std::memcpy(&header, next, sizeof header);
      const char* const name = next + sizeof header;
      next = name + header.len;
      if ((header.mask & IN_Q_OVERFLOW) != 0) {
        events.push_back({.mask = header.mask});
        continue;
      }
      const auto watch = byWatch_.find(header.wd);
      if (watch == byWatch_.end()) {
        continue;
      }
      events.push_back({.mask = header.mask,
                        .folder = watch->second,
                        .name = header.len > 0 ? name : std::string()});
      if ((header.mask & IN_IGNORED) != 0) {
        byPath_.erase(watch->second);
        byWatch_.erase(watch);
      }
    }
  }
  return events;
}

} // namespace orva::indexer

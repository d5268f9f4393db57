#include "FolderWatches.h"

#include "orvautil/FormatString.h"

#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <iterator>
#include <utility>

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
  const auto [entry, isNew] = byPath_.try_emplace(path, Watched{.watch = watch});
  if (isNew || entry->second.watch != watch) {
    if (!isNew) {
      End(path, std::exchange(entry->second.watch, watch));
    }
    byWatch_.emplace(watch, path);
  }
  return true;
}

/// Ends the watch at this path. It is kept while another path leads to the same folder.
void FolderWatches::End(const std::string& path, int watch) {
  const auto [begin, end] = byWatch_.equal_range(watch);
  const auto entry =
      std::find_if(begin, end, [&](const auto& item) { return item.second == path; });
  if (entry != end) {
    byWatch_.erase(entry);
  }
  if (!byWatch_.contains(watch)) {
    inotify_rm_watch(inotify_.Get(), watch);
  }
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
    End(entry->first, entry->second.watch);
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
      const auto [begin, end] = byWatch_.equal_range(header.wd);
      for (auto watch = begin; watch != end; ++watch) {
        events.push_back({.mask = header.mask,
                          .folder = watch->second,
                          .name = header.len > 0 ? name : std::string()});
        if ((header.mask & IN_IGNORED) != 0) {
          byPath_.erase(watch->second);
        }
      }
      if ((header.mask & IN_IGNORED) != 0) {
        byWatch_.erase(begin, end);
      }
    }
  }
  return events;
}

} // namespace orva::indexer

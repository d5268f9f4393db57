#include "orva-notify/VolumeWatch.h"

#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <iostream>
#include <iterator>
#include <utility>

namespace orva::notify {
namespace {

const char* const MOUNT_TABLE = "/proc/self/mountinfo";

util::FileDescriptor Checked(int descriptor, const char* what) {
  if (descriptor == -1) {
    throw util::Exception(util::FormatString("cannot watch %s: %s", what, strerror(errno)));
  }
  return util::FileDescriptor(descriptor);
}

// What happened is found out by looking.
void DiscardEvents(int descriptor) {
  std::array<char, 4096> events;
  while (read(descriptor, events.data(), events.size()) > 0) {
  }
}

} // namespace

VolumeWatch::VolumeWatch(bool mounts, const std::vector<std::string>& directories)
    : mounts_(mounts) {
  if (mounts || !directories.empty()) {
    mountTable_ = Checked(open(MOUNT_TABLE, O_RDONLY | O_CLOEXEC), MOUNT_TABLE);
  }
  if (!directories.empty()) {
    events_ = Checked(inotify_init1(IN_NONBLOCK | IN_CLOEXEC), "directories");
  }
  for (const auto& path : directories) {
    if (std::ranges::find(directories_, path, &Directory::path) == directories_.end()) {
      directories_.push_back({.path = path});
    }
  }
}

std::vector<Announcement> VolumeWatch::TakeChanges() {
  std::vector<Announcement> unplugged;
  std::vector<Announcement> plugged;
  if (events_) {
    DiscardEvents(events_.Get());
    WatchParents(); // before the directories are looked at, so that no change is missed
  }
  const Volumes now = mountTable_ ? ReadMounts() : Volumes();
  const VolumeChanges changes = Compare(volumes_, now);
  for (const auto& mountPoint : changes.unplugged) {
    unplugged.push_back({.event = Event::Unplugged, .mountPoint = mountPoint});
  }
  for (const auto& mountPoint : changes.plugged) {
    plugged.push_back({.event = Event::Plugged, .mountPoint = mountPoint});
  }
  for (auto& directory : directories_) {
    const auto identity = now.contains(directory.path) ? std::nullopt : Identify(directory.path);
    if (directory.identity && identity != directory.identity) {
      unplugged.push_back({.event = Event::Unplugged, .mountPoint = directory.path});
    }
    if (identity && identity != directory.identity) {
      plugged.push_back(
          {.event = Event::Plugged, .mountPoint = directory.path, .kind = VolumeKind::Directory});
    }
    directory.identity = identity;
    Report(directory, identity || now.contains(directory.path));
  }
  volumes_ = now;
  std::ranges::copy(plugged, std::back_inserter(unplugged));
  return unplugged;
}

Volumes VolumeWatch::ReadMounts() const {
  std::ifstream table(MOUNT_TABLE);
  Volumes volumes = ReadVolumes(table);
  if (!mounts_) {
    std::erase_if(volumes, [this](const auto& volume) {
      return std::ranges::find(directories_, volume.first, &Directory::path) == directories_.end();
    });
  }
  return volumes;
}

// /shares may have been made, replaced or mounted since the last time.
void VolumeWatch::WatchParents() {
  Watch("/", rootWatch_);
  Watch("/shares", sharesWatch_);
}

void VolumeWatch::Watch(const char* directory, int& watch) {
  // For a directory that is watched already, the kernel returns the same number.
  const int now =
      inotify_add_watch(events_.Get(), directory, IN_CREATE | IN_DELETE | IN_MOVE | IN_ONLYDIR);
  if (now == -1 && errno != ENOENT && errno != ENOTDIR) {
    Warn(directory);
  }
  if (watch != -1 && watch != now) {
    inotify_rm_watch(events_.Get(), watch);
  }
  watch = now;
}

void VolumeWatch::Warn(const char* directory) {
  const char* const reason =
      errno == ENOSPC ? "the limit fs.inotify.max_user_watches is reached" : strerror(errno);
  if (!std::exchange(hasWarned_, true)) {
    std::cout << "cannot watch " << directory << ": " << reason << std::endl;
  }
}

/// Prints why a directory is no volume, once for each reason.
void VolumeWatch::Report(Directory& directory, bool isVolume) {
  struct stat status {};
  std::string problem;
  if (!isVolume && lstat(directory.path.c_str(), &status) != 0) {
    problem = errno == ENOENT ? " does not exist: waiting for it" : " cannot be accessed";
  } else if (!isVolume && !S_ISDIR(status.st_mode)) {
    problem = " is not a directory: it is no volume";
  }
  if (problem != std::exchange(directory.problem, problem) && !directory.problem.empty()) {
    std::cout << directory.path << problem << std::endl;
  }
}

// A mount that is newer than the table of mounts is no directory either.
std::optional<VolumeWatch::Identity> VolumeWatch::Identify(const std::string& path) {
  struct statx status {};
  if (statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW | AT_NO_AUTOMOUNT,
            STATX_TYPE | STATX_INO | STATX_BTIME, &status) != 0 ||
      !S_ISDIR(status.stx_mode) || (status.stx_attributes & STATX_ATTR_MOUNT_ROOT) != 0) {
    return std::nullopt;
  }
  return Identity{.major = status.stx_dev_major,
                  .minor = status.stx_dev_minor,
                  .inode = status.stx_ino,
                  .seconds = status.stx_btime.tv_sec,
                  .nanoseconds = status.stx_btime.tv_nsec};
}

} // namespace orva::notify

#pragma once

#include "orva-notify/MountInfo.h"
#include "orva-notify/Notification.h"
#include "orvautil/FileDescriptor.h"

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace orva::notify {

/// Finds out which volumes are there: mounts directly below /shares, and plain directories. Keeps
/// nothing open on them.
class VolumeWatch {
public:
  /// Watches the mounts, all of them with `mounts`, and `directories`, each of which is directly
  /// below /shares. Such a directory is a volume while it exists; a symbolic link is none. What is
  /// mounted on it is a volume in its place. Prints a line if a directory cannot be watched; its
  /// changes are then seen late. Throws util::Exception.
  VolumeWatch(bool mounts, const std::vector<std::string>& directories);

  /// Polled with POLLPRI for changes of mounts; -1 when nothing is watched.
  int MountTable() const noexcept { return mountTable_.Get(); }

  /// Polled with POLLIN for changes of directories; -1 when none is watched.
  int DirectoryEvents() const noexcept { return events_.Get(); }

  /// The Unplugged and then the Plugged volumes since the last call, mounts before directories: the
  /// daemon elects a master when it hears of the first one. A volume that was replaced is among
  /// both.
  std::vector<Announcement> TakeChanges();

private:
  /// A directory, distinguished from one that replaces it.
  struct Identity {
    std::uint32_t major, minor; ///< of the device
    std::uint64_t inode;
    std::int64_t seconds; ///< when it was made
    std::uint32_t nanoseconds;
    bool operator==(const Identity&) const = default;
  };

  struct Directory {
    std::string path;
    std::optional<Identity> identity{}; ///< while it is a volume
    std::string problem{};              ///< why it is none, as it was printed
  };

  Volumes ReadMounts() const;
  void WatchParents();
  void Watch(const char* directory, int& watch);
  void Warn(const char* directory);
  static void Report(Directory& directory, bool isVolume);
  static std::optional<Identity> Identify(const std::string& path);

  const bool mounts_;
  util::FileDescriptor mountTable_; ///< polled, not read
  util::FileDescriptor events_;     ///< of inotify
  int rootWatch_ = -1;              ///< of "/", where /shares may appear
  int sharesWatch_ = -1;
  bool hasWarned_ = false; ///< that a directory cannot be watched
  Volumes volumes_;        ///< mounts that were announced
  std::vector<Directory> directories_;
};

} // namespace orva::notify

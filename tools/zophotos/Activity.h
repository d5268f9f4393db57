#pragma once

#include "orvautil/FileDescriptor.h"

#include <array>
#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

namespace orva::zophotos {

/// What the indexer does with a volume.
struct Indexing {
  std::string state; ///< walking, watching, timed, read-only or unusable
  std::int64_t foldersWaiting = 0;

  bool operator==(const Indexing&) const = default;
};

/// What the transcoder does with a volume.
struct Rendering {
  std::int64_t waiting = 0; ///< photos
  std::int64_t failed = 0;  ///< photos
  bool isActive = false;

  bool operator==(const Rendering&) const = default;
};

/// What the services that index and render are doing, by mount point, with a separator at its end.
/// The mount points are UTF-8, see ToUtf8.
struct Activity {
  std::optional<std::map<std::string, Indexing>> indexer;     ///< nothing if it does not run
  std::optional<std::map<std::string, Rendering>> transcoder; ///< nothing if it does not run
  bool areInstalled = false; ///< the services belong to this machine

  bool operator==(const Activity&) const = default;
};

/// What the services do with one volume. Null if the service does not run or does not know the
/// volume. Valid as long as the Activity.
struct VolumeActivity {
  const Indexing* indexing = nullptr;
  const Rendering* rendering = nullptr;
};

/// The services that do not run although they are installed or the other one runs:
/// "orva-indexer does not run."; empty if there is none.
std::string DescribeStopped(const Activity& activity);

/// Reads the status files of the services. A missing or malformed file counts as a service that
/// does not run: systemd removes the file when the service ends.
Activity ReadActivity();

/// The volumes that the services know.
std::map<std::string, VolumeActivity> VolumesOf(const Activity& activity);

/// "being indexed, 12 folders waiting; rendering"; a dash for nothing.
std::string Describe(const VolumeActivity& activity);

/// Notices that the status files change.
class ActivityWatch {
public:
  ActivityWatch();

  /// Waits for a change, up to `time`. Returns whether the files may have changed since the last
  /// call; true the first time.
  bool Wait(std::chrono::milliseconds time);

private:
  bool WatchFolders();
  bool TakeEvents() const;

  util::FileDescriptor inotify_;
  std::array<int, 2> folders_{}; ///< watches of the folders; -1 for a missing one
};

} // namespace orva::zophotos

#pragma once

#include "orva-notify/Notification.h"

#include <cstddef>
#include <string>
#include <vector>

namespace orva::notify {

/// What was announced of each volume since it was plugged, in the order of the first announcements.
/// As for the daemon, a mount point with and without a trailing "/" is the same volume.
class VolumeMemory {
public:
  /// The limits of the daemon, which cannot know more volumes either.
  static constexpr std::size_t MAXIMUM_VOLUMES = 1000;
  static constexpr std::size_t MAXIMUM_BYTES = std::size_t{1} << 20; ///< of all mount points

  /// Remembers `announcement`; Unplugged removes the volume. Returns false when the volume is not
  /// known and there are too many.
  bool Remember(const Announcement& announcement);

  /// What a new client has to be told: Plugged for the plugged volumes, mounts before directories,
  /// then Scanned, then End for the volumes of which this was announced.
  std::vector<Announcement> Replay() const;

  /// End for each volume that has ended: a new master is filled with them.
  std::vector<Announcement> Ends() const;

  /// Whether a volume was scanned. The daemon removes rows only then.
  bool HasScanned() const;

private:
  struct Volume {
    std::string mountPoint; ///< as it was first announced
    VolumeKind kind = VolumeKind::Mount;
    bool plugged = false;
    bool scanned = false;
    bool ended = false;
  };

  std::vector<Volume>::iterator Find(const std::string& mountPoint);
  bool HasRoomFor(const std::string& mountPoint) const;
  std::vector<Announcement> Select(Event event, bool Volume::*state) const;

  std::vector<Volume> volumes_;
};

} // namespace orva::notify

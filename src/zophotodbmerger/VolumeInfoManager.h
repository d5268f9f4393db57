#pragma once

#include "VolumeInfo.h"

#include <vector>

namespace orva::dbmerger {

/// The registry of the volumes that the daemon knows, and the master volume elected among them.
/// Used on the listener's thread, and on the main thread before that starts.
class VolumeInfoManager {
public:
  /// The process's registry; null until Instance() is first called, never deleted.
  static VolumeInfoManager* instance;

  /// The process's registry, made by the first call.
  static VolumeInfoManager& Instance();

  /// Registers a copy of `volume` when something exists at its mount point. An existing record
  /// stays as it is, so that the first event that names a volume fixes its capacity. Beyond 1,000
  /// volumes or 1 MiB of mount points, a volume is refused with a log line.
  void addVolumeInfo(VolumeInfo& volume);

  /// Removes `volume`, also as the master.
  void removeVolumeInfo(VolumeInfo& volume);

  /// Keeps an existing master; otherwise elects the largest volume with more than 200 MiB free that
  /// is not marked read-only (notifications never mark one) and has no line feed in its mount
  /// point. For that it sorts the registry by capacity, larger ones first. Returns whether there is
  /// a master now.
  bool reelectMasterVolume();

  const std::vector<VolumeInfo>& getVolumes() const noexcept { return volumes; }

  /// The master; equal to EmptyVolumeInfo when there is none.
  const VolumeInfo& getMasterVolume() const noexcept { return masterVolume; }

private:
  std::vector<VolumeInfo> volumes;
  VolumeInfo masterVolume;
};

} // namespace orva::dbmerger

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

  /// Registers a copy of `volume` when something exists at its mount point. A record that is
  /// there already stays as it is, so the first event that names a volume fixes its capacity. More
  /// than 1000 volumes, or than a mebibyte of mount points, are refused with a line in the log.
  void addVolumeInfo(VolumeInfo& volume);

  /// Forgets `volume`, also as the master.
  void removeVolumeInfo(VolumeInfo& volume);

  /// Keeps the master that there is; otherwise elects the largest writable volume with more than
  /// 200 MiB free. Sorts the registry by capacity, the larger first. Returns whether there is a
  /// master now.
  bool reelectMasterVolume();

  const std::vector<VolumeInfo>& getVolumes() const noexcept { return volumes; }

  /// The master; equal to EmptyVolumeInfo when there is none.
  const VolumeInfo& getMasterVolume() const noexcept { return masterVolume; }

private:
  std::vector<VolumeInfo> volumes;
  VolumeInfo masterVolume;
};

} // namespace orva::dbmerger

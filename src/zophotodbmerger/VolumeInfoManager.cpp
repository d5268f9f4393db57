#include "stdafx.h"

#include "VolumeInfoManager.h"

#include "orvautil/Path.h"

#include <algorithm>

namespace orva::dbmerger {

namespace {

/// A master must have more free bytes than this, for the merged database: 200 MiB.
constexpr double MINIMUM_FREE_SPACE = 209715200.0;

/// More than any appliance has. Every spelling of a path is a volume of its own, so that messages
/// could name any number of volumes.
constexpr std::size_t MOST_VOLUMES = 1000;

/// Bytes of all mount points together. Each may be as long as a path, and mergers copy them all.
constexpr std::size_t MOST_BYTES = 1 << 20;

bool HasRoomFor(const VolumeInfo& added, const std::vector<VolumeInfo>& volumes) {
  std::size_t bytes = added.mountPoint.size();
  for (const VolumeInfo& volume : volumes) {
    bytes += volume.mountPoint.size();
  }
  return volumes.size() < MOST_VOLUMES && bytes <= MOST_BYTES;
}

bool CanBeMaster(const VolumeInfo& volume) {
  // The locator file has one line.
  const bool isOneLine = volume.mountPoint.find('\n') == std::string::npos;
  return volume.capacity - volume.used > MINIMUM_FREE_SPACE && !volume.readOnly && isOneLine;
}

} // namespace

VolumeInfoManager* VolumeInfoManager::instance = nullptr;

VolumeInfoManager& VolumeInfoManager::Instance() {
  if (instance == nullptr) {
    instance = std::make_unique<VolumeInfoManager>().release();
  }
  return *instance;
}

void VolumeInfoManager::addVolumeInfo(VolumeInfo& volume) {
  if (!util::Path(volume.mountPoint).Exists()) {
    syslog(LOG_LOCAL1 | LOG_ERR, "There is no filesystem location for the mountpoint %s",
           volume.mountPoint.c_str());
    return;
  }
  if (std::ranges::find(volumes, volume) != volumes.end()) {
    return;
  }
  if (!HasRoomFor(volume, volumes)) {
    syslog(LOG_LOCAL1 | LOG_ERR, "There are too many volumes to register the mountpoint %s",
           volume.mountPoint.c_str());
    return;
  }
  volumes.push_back(volume);
}

void VolumeInfoManager::removeVolumeInfo(VolumeInfo& volume) {
  if (volume == masterVolume) {
    masterVolume = EmptyVolumeInfo;
  }
  std::erase(volumes, volume);
}

bool VolumeInfoManager::reelectMasterVolume() {
  if (masterVolume != EmptyVolumeInfo) {
    return true;
  }
  std::ranges::sort(volumes, VolumeInfoComp<VolumeInfo>());
  for (const VolumeInfo& volume : volumes) {
    if (CanBeMaster(volume)) {
      masterVolume = volume;
      return true;
    }
    syslog(LOG_LOCAL1 | LOG_ERR, "%s  ---------  is not a candidate \n", volume.mountPoint.c_str());
  }
  return false;
}

} // namespace orva::dbmerger

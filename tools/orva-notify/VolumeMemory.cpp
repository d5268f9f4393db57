#include "orva-notify/VolumeMemory.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace orva::notify {
namespace {

bool IsSame(const std::string& mountPoint, const std::string& other) {
  const auto withSeparator = [](const std::string& text) {
    return text.ends_with('/') ? text : text + '/';
  };
  return withSeparator(mountPoint) == withSeparator(other);
}

} // namespace

bool VolumeMemory::Remember(const Announcement& announcement) {
  if (announcement.mountPoint.empty()) {
    return true; // names no volume
  }
  const auto known = Find(announcement.mountPoint);
  if (announcement.event == Event::Unplugged) {
    if (known != volumes_.end()) {
      volumes_.erase(known);
    }
    return true;
  }
  if (known == volumes_.end() && !HasRoomFor(announcement.mountPoint)) {
    return false;
  }
  Volume& volume = known != volumes_.end()
                       ? *known
                       : volumes_.emplace_back(Volume{.mountPoint = announcement.mountPoint});
  switch (announcement.event) {
  case Event::Plugged:
    if (!std::exchange(volume.plugged, true)) {
      volume.kind = announcement.kind;
    }
    break;
  case Event::TranscodedBatch:
  case Event::End:
  case Event::Purged:
    // The daemon merges the volume. If it does not merge yet, it takes a batch for a scan.
    volume.ended = true;
    volume.scanned = true;
    break;
  case Event::Scanned:
    volume.scanned = true;
    break;
  case Event::Unplugged:
    break;
  }
  return true;
}

std::vector<Announcement> VolumeMemory::Replay() const {
  auto announcements = Select(Event::Plugged, &Volume::plugged);
  // A daemon that starts elects a master when it hears of the first volume.
  std::stable_partition(
      announcements.begin(), announcements.end(),
      [](const Announcement& announcement) { return announcement.kind == VolumeKind::Mount; });
  std::ranges::copy(Select(Event::Scanned, &Volume::scanned), std::back_inserter(announcements));
  std::ranges::copy(Ends(), std::back_inserter(announcements));
  return announcements;
}

std::vector<Announcement> VolumeMemory::Ends() const {
  return Select(Event::End, &Volume::ended);
}

bool VolumeMemory::HasScanned() const {
  return std::ranges::any_of(volumes_, &Volume::scanned);
}

std::vector<VolumeMemory::Volume>::iterator VolumeMemory::Find(const std::string& mountPoint) {
  return std::ranges::find_if(
      volumes_, [&](const Volume& volume) { return IsSame(volume.mountPoint, mountPoint); });
}

bool VolumeMemory::HasRoomFor(const std::string& mountPoint) const {
  std::size_t bytes = mountPoint.size();
  for (const auto& volume : volumes_) {
    bytes += volume.mountPoint.size();
  }
  return volumes_.size() < MAXIMUM_VOLUMES && bytes <= MAXIMUM_BYTES;
}

std::vector<Announcement> VolumeMemory::Select(Event event, bool Volume::*state) const {
  std::vector<Announcement> announcements;
  for (const auto& volume : volumes_) {
    if (volume.*state) {
      announcements.push_back(
          {.event = event, .mountPoint = volume.mountPoint, .kind = volume.kind});
    }
  }
  return announcements;
}

} // namespace orva::notify

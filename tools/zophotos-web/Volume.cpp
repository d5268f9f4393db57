#include "zophotos-web/Volume.h"

#include "zophotos/Activity.h"
#include "zophotos/Text.h"

#include <map>
#include <string_view>
#include <utility>

namespace orva::web {

namespace {

void AddActivity(Volume& volume, const zophotos::VolumeActivity& activity) {
  if (activity.indexing != nullptr) {
    volume.state = activity.indexing->state;
    volume.foldersWaiting = activity.indexing->foldersWaiting;
  }
  if (activity.rendering != nullptr) {
    volume.waiting = activity.rendering->waiting;
    volume.failed = activity.rendering->failed;
    volume.isRendering = activity.rendering->isActive;
  }
  // The usual state of a volume needs no words.
  std::string text = Describe(activity);
  for (const std::string_view usual : {"watched; ", "watched", "-"}) {
    if (text.starts_with(usual)) {
      text.erase(0, usual.size());
    }
  }
  volume.activity = text;
}

} // namespace

std::vector<Volume> Combine(const std::vector<VolumeRow>& rows,
                            const zophotos::Activity& services) {
  std::map<std::string, Volume> volumes;
  std::map<std::string, zophotos::VolumeActivity> others = VolumesOf(services);
  for (const VolumeRow& row : rows) {
    Volume& volume = volumes[row.mountPoint];
    volume = {.mountPoint = row.mountPoint,
              .isMerged = true,
              .isGone = row.isGone,
              .transcoded = row.transcoded,
              .total = row.total,
              .mergedUpTo = row.mergedUpTo};
    // The services name volumes in UTF-8.
    if (const auto other = others.find(zophotos::ToUtf8(row.mountPoint)); other != others.end()) {
      AddActivity(volume, other->second);
      others.erase(other);
    }
  }
  for (const auto& [mountPoint, activity] : others) {
    Volume& volume = volumes[mountPoint];
    volume.mountPoint = mountPoint;
    AddActivity(volume, activity);
  }
  std::vector<Volume> list;
  list.reserve(volumes.size());
  for (auto& [mountPoint, volume] : volumes) {
    list.push_back(std::move(volume));
  }
  return list;
}

} // namespace orva::web

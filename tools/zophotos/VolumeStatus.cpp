#include "VolumeStatus.h"

#include "Text.h"

#include <SQLiteCpp/Statement.h>

#include <algorithm>
#include <limits>
#include <string_view>

namespace orva::zophotos {

void ReadStatistics(SQLite::Database& database, VolumeStatuses& volumes) {
  // Uses only the first row of each volume, like the daemon.
  SQLite::Statement query(database, "SELECT volume, photos_xcoded, photos_total, last_updated_time "
                                    "FROM Statistics ORDER BY id");
  while (query.executeStep()) {
    VolumeStatus& volume = volumes[query.getColumn(0).getString()];
    if (!volume.isMerged) {
      volume.isMerged = true;
      volume.transcoded = query.getColumn(1).getInt64();
      volume.total = query.getColumn(2).getInt64();
      volume.mergedUpTo = query.getColumn(3).getInt64();
    }
  }
}

void Add(std::int64_t& sum, std::int64_t number) {
  if (__builtin_add_overflow(sum, std::max<std::int64_t>(number, 0), &sum)) {
    sum = std::numeric_limits<std::int64_t>::max();
  }
}

VolumeStatus Total(const VolumeStatuses& volumes) {
  VolumeStatus total;
  for (const auto& [name, volume] : volumes) {
    if (!volume.isGone) {
      Add(total.transcoded, volume.transcoded);
      Add(total.total, volume.total);
      Add(total.folders, volume.folders);
      Add(total.files, volume.files);
    }
  }
  return total;
}

std::string ProgressBar(const VolumeStatus& volume, int width) {
  if (volume.isGone) {
    return "gone";
  }
  if (volume.total <= 0) {
    return "-";
  }
  const auto done =
      static_cast<double>(std::clamp<std::int64_t>(volume.transcoded, 0, volume.total));
  // Multiplied first, because the double 0.29 times 100 is less than 29.
  const auto part = [&](int whole) {
    return static_cast<int>(done * whole / static_cast<double>(volume.total));
  };
  const int filled = part(width);
  std::string bar;
  for (int i = 0; i < width; ++i) {
    bar += i < filled ? "█" : "░";
  }
  // Rounded down, so that only all photos are 100 %.
  const std::string percent = std::to_string(part(100));
  return bar + std::string(4 - percent.size(), ' ') + percent + " %";
}

std::string PhotoCounts(const VolumeStatus& volume) {
  return volume.isGone ? "-"
                       : std::to_string(volume.transcoded) + "/" + std::to_string(volume.total);
}

std::string Waiting(const VolumeActivity& volume) {
  return volume.rendering == nullptr ? "-" : std::to_string(volume.rendering->waiting);
}

std::string Failed(const VolumeActivity& volume) {
  return volume.rendering == nullptr ? "-" : std::to_string(volume.rendering->failed);
}

std::optional<std::string> MountPoint(const std::string& path) {
  constexpr std::string_view place = "/.zophotos/zophotos.db";
  if (!path.ends_with(place)) {
    return std::nullopt;
  }
  return path.substr(0, path.size() - place.size());
}

std::string NameOf(const std::string& volume, const std::string& path) {
  return Printable(volume) + (volume == MountPoint(path) ? " (master)" : "");
}

std::string ShortName(const std::string& name, std::optional<std::size_t> terminalWidth) {
  return terminalWidth ? Shorten(name, 32) : name;
}

void AddActivity(Json& object, const Activity& services, const VolumeActivity& volume) {
  if (services.indexer) {
    const Indexing* const indexing = volume.indexing;
    object["state"] = indexing == nullptr ? Json() : Json(indexing->state);
    object["folders_waiting"] = indexing == nullptr ? Json() : Json(indexing->foldersWaiting);
  }
  if (services.transcoder) {
    const Rendering* const rendering = volume.rendering;
    object["waiting"] = rendering == nullptr ? Json() : Json(rendering->waiting);
    object["failed"] = rendering == nullptr ? Json() : Json(rendering->failed);
    object["rendering"] = rendering == nullptr ? Json() : Json(rendering->isActive);
  }
}

std::map<std::string, ShownVolume> Combine(const VolumeStatuses& volumes,
                                           const Activity& services) {
  std::map<std::string, VolumeActivity> others = VolumesOf(services);
  std::map<std::string, ShownVolume> all;
  for (const auto& [name, status] : volumes) {
    const auto activity = others.find(ToUtf8(name));
    all[name] = {.status = status,
                 .activity = activity == others.end() ? VolumeActivity() : activity->second};
  }
  for (const auto& [name, status] : volumes) {
    others.erase(ToUtf8(name));
  }
  for (const auto& [name, activity] : others) {
    all[name] = {.status = std::nullopt, .activity = activity};
  }
  return all;
}

} // namespace orva::zophotos

#pragma once

#include "Activity.h"
#include "Json.h"

#include <SQLiteCpp/Database.h>

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>

namespace orva::zophotos {

/// A volume in the merged database.
struct VolumeStatus {
  bool isMerged = false; ///< has a row of statistics
  bool isGone = false; ///< only the statistics are left: unplugged, or purged and not merged since
  std::int64_t transcoded = 0;
  std::int64_t total = 0;
  std::int64_t mergedUpTo = 0; ///< stamp; 0 for none
  std::int64_t folders = 0;
  std::int64_t files = 0;

  bool operator==(const VolumeStatus&) const = default;
};

/// By mount point, as the database has it.
using VolumeStatuses = std::map<std::string, VolumeStatus>;

/// Adds the statistics to `volumes`. Throws SQLite::Exception.
void ReadStatistics(SQLite::Database& database, VolumeStatuses& volumes);

/// Adds a number of an untrusted source to `sum`, up to the largest number.
void Add(std::int64_t& sum, std::int64_t number);

/// The sums of all volumes that are not gone.
VolumeStatus Total(const VolumeStatuses& volumes);

/// "█████░░░░░  50 %" with a bar of `width` columns; a dash if there are no photos, "gone" for a
/// volume that is gone.
std::string ProgressBar(const VolumeStatus& volume, int width);

/// "1/3": transcoded and all photos; a dash for a volume that is gone.
std::string PhotoCounts(const VolumeStatus& volume);

/// The photos of a volume that wait for their rendition, and those that failed; a dash for unknown.
std::string Waiting(const VolumeActivity& volume);
std::string Failed(const VolumeActivity& volume);

/// The mount point of the volume that holds the database at `path`, as the database names it.
/// Nothing if the daemon does not keep databases at such a path.
std::optional<std::string> MountPoint(const std::string& path);

/// The volume's name for people, with a mark on the one that holds the database at `path`.
std::string NameOf(const std::string& volume, const std::string& path);

/// A printable name for a table in which the activity is shortened first: on a terminal it has at
/// most 32 columns.
std::string ShortName(const std::string& name, std::optional<std::size_t> terminalWidth);

/// Adds to the JSON of a volume what the services that run do with it: null for what they do not
/// know.
void AddActivity(Json& object, const Activity& services, const VolumeActivity& volume);

/// A volume that is in the merged database, or that a service knows.
struct ShownVolume {
  std::optional<VolumeStatus> status; ///< nothing if it is not in the merged database yet
  VolumeActivity activity;
};

/// All volumes, by mount point. Refers to `services`.
std::map<std::string, ShownVolume> Combine(const VolumeStatuses& volumes, const Activity& services);

} // namespace orva::zophotos

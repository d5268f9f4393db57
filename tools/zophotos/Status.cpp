#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"
#include "Table.h"

#include <SQLiteCpp/Statement.h>

#include <algorithm>
#include <limits>
#include <map>
#include <optional>
#include <string_view>

namespace orva::zophotos {

namespace {

struct Volume {
  bool isMerged = false; ///< has a row of statistics
  std::int64_t transcoded = 0;
  std::int64_t total = 0;
  std::int64_t mergedUpTo = 0;
  std::int64_t folders = 0;
  std::int64_t files = 0;
};

using Volumes = std::map<std::string, Volume>;

/// The status row.
struct Row {
  std::string version;
  std::int64_t stamp = 0; ///< when the database was last emptied, in seconds since the epoch
};

/// The time in the status row of a new database, which was never emptied.
constexpr std::int64_t NEVER_EMPTIED = 1000;

/// How the numbers of photos and files differ.
constexpr const char* LEGEND[] = {
    "PHOTOS: transcoded / all of a volume, without hidden ones, at its last merge.",
    "FILES: in the merged database: all transcoded files in visible folders."};

/// Nothing if there is no status row.
std::optional<Row> ReadRow(SQLite::Database& database) {
  SQLite::Statement query(database, "SELECT mc_version, mdate FROM Status WHERE id = 1");
  if (!query.executeStep()) {
    return std::nullopt;
  }
  return Row{.version = query.getColumn(0).getString(), .stamp = query.getColumn(1).getInt64()};
}

/// Reads only the first row of each volume, like the daemon.
void ReadStatistics(SQLite::Database& database, Volumes& volumes) {
  SQLite::Statement query(database, "SELECT volume, photos_xcoded, photos_total, last_updated_time "
                                    "FROM Statistics ORDER BY id");
  while (query.executeStep()) {
    Volume& volume = volumes[query.getColumn(0).getString()];
    if (!volume.isMerged) {
      volume.isMerged = true;
      volume.transcoded = query.getColumn(1).getInt64();
      volume.total = query.getColumn(2).getInt64();
      volume.mergedUpTo = query.getColumn(3).getInt64();
    }
  }
}

Volumes ReadVolumes(SQLite::Database& database) {
  Volumes volumes;
  ReadStatistics(database, volumes);
  // Folder 1 is the shares root, which belongs to no volume.
  SQLite::Statement folders(
      database, "SELECT volume, count(*) FROM Folders WHERE folder_id != 1 GROUP BY volume");
  while (folders.executeStep()) {
    volumes[folders.getColumn(0).getString()].folders = folders.getColumn(1).getInt64();
  }
  SQLite::Statement files(database, "SELECT volume, count(*) FROM Files GROUP BY volume");
  while (files.executeStep()) {
    volumes[files.getColumn(0).getString()].files = files.getColumn(1).getInt64();
  }
  return volumes;
}

/// Whether only the statistics of the volume are left: it was unplugged, or purged and not merged
/// since.
bool IsGone(const Volume& volume) {
  return volume.isMerged && volume.mergedUpTo == 0 && volume.folders == 0 && volume.files == 0;
}

/// Adds a number of an untrusted database, up to the largest number.
void Add(std::int64_t& sum, std::int64_t number) {
  if (__builtin_add_overflow(sum, std::max<std::int64_t>(number, 0), &sum)) {
    sum = std::numeric_limits<std::int64_t>::max();
  }
}

/// The sums of all volumes that are not gone.
Volume Total(const Volumes& volumes) {
  Volume total;
  for (const auto& [name, volume] : volumes) {
    if (!IsGone(volume)) {
      Add(total.transcoded, volume.transcoded);
      Add(total.total, volume.total);
      Add(total.folders, volume.folders);
      Add(total.files, volume.files);
    }
  }
  return total;
}

/// "█████░░░░░  50 %" with a bar of `width` columns; a dash if there are no photos.
std::string Progress(const Volume& volume, int width) {
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

std::string LocalTimeOrDash(std::int64_t seconds, std::int64_t none) {
  return seconds == none ? "-" : LocalTime(seconds);
}

/// The mount point of the volume that holds the database at `path`, as the database names it.
/// Nothing if the daemon does not keep databases at such a path.
std::optional<std::string> MountPoint(const std::string& path) {
  constexpr std::string_view place = "/.zophotos/zophotos.db";
  if (!path.ends_with(place)) {
    return std::nullopt;
  }
  return path.substr(0, path.size() - place.size());
}

/// The daemon's master volume.
std::string Master(const std::string& path) {
  const auto mountPoint = MountPoint(path);
  if (mountPoint == "/shares/") {
    return "none yet";
  }
  return mountPoint ? Printable(*mountPoint) : "-";
}

void AddRow(Table& table, const std::string& name, const Volume& volume, int barWidth) {
  const bool isGone = IsGone(volume);
  table.AddRow(
      {name, isGone ? "gone" : Progress(volume, barWidth),
       isGone ? "-" : std::to_string(volume.transcoded) + "/" + std::to_string(volume.total),
       std::to_string(volume.folders), std::to_string(volume.files),
       LocalTimeOrDash(volume.mergedUpTo, 0)});
}

Table MakeTable(const std::string& path, const Volumes& volumes, int barWidth) {
  Table table({{.heading = "VOLUME", .elastic = true},
               {.heading = "TRANSCODED"},
               {.heading = "PHOTOS", .right = true},
               {.heading = "FOLDERS", .right = true},
               {.heading = "FILES", .right = true},
               {.heading = "MERGED UP TO"}});
  const auto master = MountPoint(path);
  for (const auto& [name, volume] : volumes) {
    AddRow(table, Printable(name) + (name == master ? " (master)" : ""), volume, barWidth);
  }
  AddRow(table, "TOTAL", Total(volumes), barWidth);
  return table;
}

void PrintLegend(std::optional<std::size_t> width) {
  if (width &&
      std::ranges::any_of(LEGEND, [&](const char* line) { return Width(line) > *width; })) {
    return;
  }
  std::cout << '\n';
  for (const char* const line : LEGEND) {
    std::cout << line << '\n';
  }
}

void PrintStatusText(const std::string& path, const std::optional<Row>& row,
                     const Volumes& volumes) {
  std::cout << "Database  " << Printable(path) << "\nMaster    " << Master(path) << "\nVersion   "
            << (row ? Printable(row->version) : "-") << "\nEmptied   "
            << (row ? LocalTimeOrDash(row->stamp, NEVER_EMPTIED) : "-") << "\n\n";
  if (volumes.empty()) {
    std::cout << "No volume has been merged yet.\n";
    return;
  }
  const auto width = TerminalWidth();
  // On a narrow terminal the numbers are more important than the bars.
  const Table table = MakeTable(path, volumes, 10);
  const bool fits = !width || table.NarrowestWidth() <= *width;
  (fits ? table : MakeTable(path, volumes, 0)).Print(std::cout, width);
  PrintLegend(width);
}

void PrintStatusJson(const std::string& path, const std::optional<Row>& row,
                     const Volumes& volumes) {
  Json list = Json::array();
  for (const auto& [name, volume] : volumes) {
    list.push_back({{"volume", ToUtf8(name)},
                    {"transcoded", volume.transcoded},
                    {"total", volume.total},
                    {"folders", volume.folders},
                    {"files", volume.files},
                    {"merged_up_to", JsonStamp(volume.mergedUpTo)}});
  }
  PrintLine({{"database", ToUtf8(path)},
             {"version", row ? Json(ToUtf8(row->version)) : Json()},
             {"stamped", row ? JsonTime(row->stamp) : Json()},
             {"volumes", std::move(list)}});
}

} // namespace

ExitStatus ShowStatus(const std::string& path, Form form) {
  // Counting reads every row, which takes long.
  SQLite::Database database = CopyDatabase(path);
  (form == Form::Json ? PrintStatusJson : PrintStatusText)(path, ReadRow(database),
                                                           ReadVolumes(database));
  return ExitStatus::Success;
}

} // namespace orva::zophotos

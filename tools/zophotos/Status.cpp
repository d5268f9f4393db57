#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"
#include "Table.h"
#include "VolumeStatus.h"

#include <SQLiteCpp/Statement.h>

#include <algorithm>
#include <optional>
#include <utility>

namespace orva::zophotos {

namespace {

/// The status row.
struct Row {
  std::string version;
  std::int64_t stamp = 0; ///< when the database was last emptied, in seconds since the epoch
};

/// The time in the status row of a new database, which was never emptied.
constexpr std::int64_t NEVER_EMPTIED = 1000;

constexpr const char* GONE = "gone: unplugged, or purged and not merged again yet.";

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

VolumeStatuses ReadVolumes(SQLite::Database& database) {
  VolumeStatuses volumes;
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
  for (auto& [name, volume] : volumes) {
    volume.isGone =
        volume.isMerged && volume.mergedUpTo == 0 && volume.folders == 0 && volume.files == 0;
  }
  return volumes;
}

std::string LocalTimeOrDash(std::int64_t seconds, std::int64_t none) {
  return seconds == none ? "-" : LocalTime(seconds);
}

/// Whether the daemon has no master volume yet: it keeps its database there then.
bool HasNoMaster(const std::optional<std::string>& mountPoint) {
  return mountPoint == "/shares/";
}

/// The daemon's master volume.
std::string Master(const std::string& path) {
  const auto mountPoint = MountPoint(path);
  if (HasNoMaster(mountPoint)) {
    return "none yet";
  }
  return mountPoint ? Printable(*mountPoint) : "-";
}

Json JsonMaster(const std::string& path) {
  const auto mountPoint = MountPoint(path);
  return mountPoint && !HasNoMaster(mountPoint) ? Json(ToUtf8(*mountPoint)) : Json();
}

void AddRow(Table& table, const std::string& name, const VolumeStatus& volume, int barWidth) {
  table.AddRow({name, ProgressBar(volume, barWidth), PhotoCounts(volume),
                std::to_string(volume.folders), std::to_string(volume.files),
                LocalTimeOrDash(volume.mergedUpTo, 0)});
}

Table MakeTable(const std::string& path, const VolumeStatuses& volumes, int barWidth) {
  Table table({{.heading = "VOLUME", .elastic = true},
               {.heading = "TRANSCODED"},
               {.heading = "PHOTOS", .right = true},
               {.heading = "FOLDERS", .right = true},
               {.heading = "FILES", .right = true},
               {.heading = "MERGED UP TO"}});
  for (const auto& [name, volume] : volumes) {
    AddRow(table, NameOf(name, path), volume, barWidth);
  }
  AddRow(table, "TOTAL", Total(volumes), barWidth);
  return table;
}

void PrintLegend(bool anyIsGone, std::optional<std::size_t> width) {
  if (width &&
      std::ranges::any_of(LEGEND, [&](const char* line) { return Width(line) > *width; })) {
    return;
  }
  std::cout << '\n';
  for (const char* const line : LEGEND) {
    std::cout << line << '\n';
  }
  if (anyIsGone) {
    std::cout << GONE << '\n';
  }
}

void PrintVolumes(const std::string& path, const VolumeStatuses& volumes) {
  if (volumes.empty()) {
    std::cout << "No volume has been merged yet.\n";
    return;
  }
  const auto width = TerminalWidth();
  // On a narrow terminal the numbers are more important than the bars.
  const Table table = MakeTable(path, volumes, 10);
  const bool fits = !width || table.NarrowestWidth() <= *width;
  (fits ? table : MakeTable(path, volumes, 0)).Print(std::cout, width);
  PrintLegend(std::ranges::any_of(volumes, [](const auto& volume) { return volume.second.isGone; }),
              width);
}

/// Prints what the services are doing with each volume.
void PrintActivity(const Activity& services) {
  const auto volumes = VolumesOf(services);
  if (volumes.empty()) {
    return;
  }
  const auto width = TerminalWidth();
  Table table({{.heading = "VOLUME"},
               {.heading = "WAITING", .right = true},
               {.heading = "FAILED", .right = true},
               {.heading = "ACTIVITY", .elastic = true}});
  std::int64_t failed = 0;
  for (const auto& [name, volume] : volumes) {
    table.AddRow(
        {ShortName(Printable(name), width), Waiting(volume), Failed(volume), Describe(volume)});
    Add(failed, volume.rendering == nullptr ? 0 : volume.rendering->failed);
  }
  std::cout << '\n';
  table.Print(std::cout, width);
  if (failed > 0) {
    std::cout << "\n'zophotos failed' lists the failed photos with the reasons.\n";
  }
}

void PrintStatusText(const std::string& path, const std::optional<Row>& row,
                     const VolumeStatuses& volumes, const Activity& services) {
  std::cout << "Database  " << Printable(path) << "\nMaster    " << Master(path) << "\nVersion   "
            << (row ? Printable(row->version) : "-") << "\nEmptied   "
            << (row ? LocalTimeOrDash(row->stamp, NEVER_EMPTIED) : "-") << "\n\n";
  PrintVolumes(path, volumes);
  PrintActivity(services);
  if (const std::string stopped = DescribeStopped(services); !stopped.empty()) {
    std::cout << '\n' << stopped << '\n';
  }
}

void PrintStatusJson(const std::string& path, const std::optional<Row>& row,
                     const VolumeStatuses& volumes, const Activity& services) {
  Json list = Json::array();
  for (const auto& [name, volume] : Combine(volumes, services)) {
    const VolumeStatus status = volume.status.value_or(VolumeStatus());
    Json object{{"volume", ToUtf8(name)}, {"transcoded", status.transcoded},
                {"total", status.total},  {"folders", status.folders},
                {"files", status.files},  {"merged_up_to", JsonStamp(status.mergedUpTo)},
                {"gone", status.isGone}};
    AddActivity(object, services, volume.activity);
    list.push_back(std::move(object));
  }
  PrintLine({{"database", ToUtf8(path)},
             {"master", JsonMaster(path)},
             {"version", row ? Json(ToUtf8(row->version)) : Json()},
             {"stamped", row && row->stamp != NEVER_EMPTIED ? JsonTime(row->stamp) : Json()},
             {"volumes", std::move(list)}});
}

} // namespace

ExitStatus ShowStatus(const std::string& path, const Activity& services, Form form) {
  // Counting reads every row, which takes long.
  SQLite::Database database = CopyDatabase(path);
  (form == Form::JsonText ? PrintStatusJson : PrintStatusText)(path, ReadRow(database),
                                                               ReadVolumes(database), services);
  return ExitStatus::Success;
}

} // namespace orva::zophotos

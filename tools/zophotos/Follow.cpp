#include "Activity.h"
#include "Commands.h"
#include "Json.h"
#include "LiveDatabase.h"
#include "MergedDatabase.h"
#include "Screen.h"
#include "Table.h"
#include "VolumeStatus.h"

#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Statement.h>

#include <chrono>
#include <ctime>
#include <optional>
#include <sstream>
#include <utility>
#include <vector>

namespace orva::zophotos {

namespace {

using Clock = std::chrono::steady_clock;

/// The shortest time between two reports.
constexpr std::chrono::seconds REPORT_INTERVAL(1);

/// What a report shows.
struct ProgressReport {
  std::string path;   ///< of the database
  std::string reason; ///< why it cannot be read at the moment; empty if it can
  VolumeStatuses volumes;
  Activity services;

  bool operator==(const ProgressReport&) const = default;
};

/// Reads little, since this keeps a merge from committing.
VolumeStatuses ReadProgress(SQLite::Database& database) {
  VolumeStatuses volumes;
  ReadStatistics(database, volumes);
  SQLite::Statement folder(database, "SELECT 1 FROM Folders WHERE volume = ? LIMIT 1");
  for (auto& [name, volume] : volumes) {
    if (volume.mergedUpTo == 0) {
      folder.bind(1, name);
      volume.isGone = !folder.executeStep();
      folder.reset();
    }
  }
  return volumes;
}

/// The sums of what the transcoder does.
Rendering TotalRendering(const Activity& services) {
  Rendering total;
  if (services.transcoder) {
    for (const auto& [mountPoint, rendering] : *services.transcoder) {
      Add(total.waiting, rendering.waiting);
      Add(total.failed, rendering.failed);
    }
  }
  return total;
}

Table MakeTable(const ProgressReport& report, int barWidth,
                std::optional<std::size_t> terminalWidth) {
  const bool hasServices = report.services.indexer || report.services.transcoder;
  std::vector<Table::Column> columns{
      {.heading = "VOLUME"}, {.heading = "TRANSCODED"}, {.heading = "PHOTOS", .right = true}};
  if (hasServices) {
    columns.push_back({.heading = "WAITING", .right = true});
    columns.push_back({.heading = "FAILED", .right = true});
    columns.push_back({.heading = "ACTIVITY", .elastic = true});
  }
  Table table(std::move(columns));
  const auto add = [&](std::vector<std::string> cells, const VolumeActivity& activity,
                       const std::string& text) {
    if (hasServices) {
      cells.insert(cells.end(), {Waiting(activity), Failed(activity), text});
    }
    table.AddRow(std::move(cells));
  };
  for (const auto& [name, volume] : Combine(report.volumes, report.services)) {
    const auto& [status, activity] = volume;
    add({ShortName(NameOf(name, report.path), terminalWidth),
         status ? ProgressBar(*status, barWidth) : "-", status ? PhotoCounts(*status) : "-"},
        activity, Describe(activity));
  }
  const VolumeStatus total = Total(report.volumes);
  const Rendering rendering = TotalRendering(report.services);
  add({"TOTAL", ProgressBar(total, barWidth), PhotoCounts(total)},
      {.rendering = report.services.transcoder ? &rendering : nullptr}, "");
  return table;
}

/// The report for people, in lines of at most `width` columns.
std::string Text(const ProgressReport& report, std::optional<std::size_t> width) {
  const std::size_t limit = width.value_or(std::string::npos);
  std::ostringstream text;
  text << Shorten(LocalTime(std::time(nullptr)) + "  " +
                      Printable(report.reason.empty() ? report.path : report.reason),
                  limit)
       << '\n';
  if (report.volumes.empty() && VolumesOf(report.services).empty()) {
    text << (report.reason.empty() ? "No volume has been merged yet.\n" : "");
    return text.str();
  }
  // On a narrow terminal the numbers are more important than the bars.
  const Table table = MakeTable(report, 10, width);
  (table.NarrowestWidth() <= limit ? table : MakeTable(report, 0, width)).Print(text, width);
  return text.str();
}

void PrintJson(const ProgressReport& report) {
  Json volumes = Json::array();
  for (const auto& [name, volume] : Combine(report.volumes, report.services)) {
    const VolumeStatus status = volume.status.value_or(VolumeStatus());
    Json object{{"volume", ToUtf8(name)},
                {"transcoded", status.transcoded},
                {"total", status.total},
                {"merged_up_to", JsonStamp(status.mergedUpTo)}};
    AddActivity(object, report.services, volume.activity);
    volumes.push_back(std::move(object));
  }
  PrintLine({{"time", JsonTime(std::time(nullptr))},
             {"database", report.path.empty() ? Json() : Json(ToUtf8(report.path))},
             {"reason", report.reason.empty() ? Json() : Json(ToUtf8(report.reason))},
             {"volumes", std::move(volumes)}});
}

/// Follows the database and the status files of the services.
class Follow {
public:
  Follow(const FindPath& findPath, const Following& following, Form form)
      : database_(findPath), following_(following), form_(form) {}

  /// Looks once, prints a report if it differs from the last one, and waits. False if the output
  /// cannot be written.
  bool Look() {
    LookAtDatabase();
    if (following_.services && std::exchange(servicesChanged_, false)) {
      report_.services = ReadActivity();
    }
    const auto now = Clock::now();
    if (printed_ != report_ && now >= nextReport_) {
      nextReport_ = now + REPORT_INTERVAL;
      Print();
      printed_ = report_;
    }
    servicesChanged_ = watch_.Wait(LOOK_INTERVAL);
    return static_cast<bool>(std::cout);
  }

private:
  void LookAtDatabase() {
    try {
      database_.Look([this](SQLite::Database& database, bool /*isNew*/) {
        report_.volumes = ReadProgress(database);
      });
      report_.path = database_.Path();
      report_.reason.clear();
    } catch (const Failure& failure) {
      Lose(failure.what());
    } catch (const SQLite::Exception& error) {
      if (IsLocked(error)) {
        report_.reason = Explain(error, database_.Path());
      } else {
        Lose(Explain(error, database_.Path()));
      }
    }
  }

  /// There is no database at the moment.
  void Lose(const std::string& reason) {
    database_.Close();
    report_.path.clear();
    report_.volumes.clear();
    report_.reason = reason;
  }

  void Print() {
    if (form_ == Form::JsonText) {
      PrintJson(report_);
    } else if (following_.redraws) {
      screen_.Show(Text(report_, TerminalWidth()));
    } else {
      std::cout << (printed_ ? "\n" : "") << Text(report_, TerminalWidth());
    }
    std::cout.flush();
  }

  LiveDatabase database_;
  const Following following_;
  const Form form_;
  ActivityWatch watch_;
  bool servicesChanged_ = true;
  ProgressReport report_;
  std::optional<ProgressReport> printed_; ///< nothing before the first one
  Clock::time_point nextReport_;          ///< not before this time
  Screen screen_;
};

} // namespace

ExitStatus FollowStatus(const FindPath& findPath, const Following& following, Form form) {
  Follow follow(findPath, following, form);
  while (follow.Look()) {
  }
  return ExitStatus::Failed;
}

} // namespace orva::zophotos

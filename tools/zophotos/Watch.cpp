#include "Commands.h"
#include "Json.h"
#include "LiveDatabase.h"
#include "MergedDatabase.h"

#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Statement.h>

#include <boost/algorithm/string/join.hpp>

#include <algorithm>
#include <ctime>
#include <map>
#include <optional>
#include <set>
#include <thread>
#include <utility>
#include <vector>

namespace orva::zophotos {

namespace {

struct Progress {
  std::int64_t transcoded = 0;
  std::int64_t total = 0;
  std::int64_t mergedUpTo = 0;

  bool operator==(const Progress&) const = default;
};

/// The rows of a table. Ids only grow, so the difference of last ids is the number of added rows.
struct Rows {
  std::int64_t count = 0;
  std::int64_t lastId = 0;
};

/// The state of a database, as far as it is compared.
struct State {
  Rows folders;
  Rows files;
  std::map<std::string, Progress> volumes;
};

struct Difference {
  std::int64_t added = 0;
  std::int64_t removed = 0;
};

std::int64_t Number(SQLite::Database& database, const char* sql) {
  return database.execAndGet(sql).getInt64();
}

/// The largest id ever given to a row of the table.
std::int64_t LastId(SQLite::Database& database, const char* table) {
  // The limits keep differences of untrusted values within 64 bits.
  SQLite::Statement query(database, "SELECT min(max(CAST(seq AS INTEGER), 0), 1 << 62) FROM "
                                    "sqlite_sequence WHERE name = ?");
  query.bind(1, table);
  return query.executeStep() ? query.getColumn(0).getInt64() : 0;
}

State ReadState(SQLite::Database& database) {
  State state;
  state.folders = {.count = Number(database, "SELECT count(*) FROM Folders"),
                   .lastId = LastId(database, "Folders")};
  state.files = {.count = Number(database, "SELECT count(*) FROM Files"),
                 .lastId = LastId(database, "Files")};
  SQLite::Statement query(database, "SELECT volume, photos_xcoded, photos_total, last_updated_time "
                                    "FROM Statistics ORDER BY id DESC");
  while (query.executeStep()) {
    state.volumes[query.getColumn(0).getString()] = {.transcoded = query.getColumn(1).getInt64(),
                                                     .total = query.getColumn(2).getInt64(),
                                                     .mergedUpTo = query.getColumn(3).getInt64()};
  }
  return state;
}

Difference Compare(const Rows& before, const Rows& now) {
  // Only in an untrusted database can ids become smaller.
  const auto added = std::max<std::int64_t>(now.lastId - before.lastId, 0);
  return {.added = added, .removed = std::max<std::int64_t>(before.count + added - now.count, 0)};
}

/// Adds the volumes of new rows. All rows of a merge have the same volume, so the first are enough.
void AddVolumes(SQLite::Database& database, const char* newRowsSql, const Rows& before,
                std::set<std::string>& volumes) {
  SQLite::Statement query(database, newRowsSql);
  query.bind(1, before.lastId);
  while (query.executeStep()) {
    volumes.insert(query.getColumn(0).getString());
  }
}

/// "added 1 folder and 2 files", without what is 0; empty if both are.
std::string Describe(const char* verb, std::int64_t folders, std::int64_t files) {
  std::string text;
  if (folders != 0) {
    text = Count(folders, "folder");
  }
  if (files != 0) {
    text += (text.empty() ? "" : " and ") + Count(files, "file");
  }
  return text.empty() ? text : verb + (" " + text);
}

/// What has become of a volume. `before` is null for a new one.
std::string Describe(const Progress* before, const Progress& now) {
  if (now.mergedUpTo == 0 && before != nullptr && before->mergedUpTo != 0) {
    return "unplugged or purged, will be merged from the beginning";
  }
  return std::to_string(now.transcoded) + " of " + Count(now.total, "photo") + " transcoded";
}

/// What has changed between two states.
struct Change {
  State before;
  Difference folders;
  Difference files;
  std::set<std::string> volumes;
};

class Watch {
public:
  Watch(const FindPath& findPath, Form form) : database_(findPath), form_(form) {}

  /// Looks once and prints what has changed since the last time. False if the output cannot be
  /// written.
  bool Look() {
    try {
      PrintNews();
      delay_.clear();
    } catch (const Failure& failure) {
      Lose(failure.what());
    } catch (const SQLite::Exception& error) {
      if (IsLocked(error)) {
        Delay(Explain(error, database_.Path()));
      } else {
        Lose(Explain(error, database_.Path()));
      }
    }
    return static_cast<bool>(std::cout.flush());
  }

private:
  /// Prints whether the database was opened, or what has changed in it. Prints after the
  /// transaction, because a reader of the output may be slow.
  void PrintNews() {
    bool isOpened = false;
    std::optional<Change> change;
    database_.Look([&](SQLite::Database& database, bool isNew) {
      isOpened = isNew;
      if (isNew) {
        state_ = ReadState(database);
      } else {
        change = Update(database);
      }
    });
    if (isOpened) {
      PrintOpened();
    } else if (change) {
      PrintChange(*change);
    }
  }

  void PrintOpened() {
    loss_.clear();
    const std::string& path = database_.Path();
    Print("opened",
          "watching " + Printable(path) + ": " + Count(state_.folders.count, "folder") + ", " +
              Count(state_.files.count, "file"),
          {{"database", ToUtf8(path)},
           {"folders", state_.folders.count},
           {"files", state_.files.count}});
  }

  /// Prints once why the database is lost, and closes it.
  void Lose(const std::string& reason) {
    database_.Close();
    if (reason != loss_) {
      loss_ = reason;
      Print("lost", Printable(reason), {{"reason", ToUtf8(reason)}});
    }
  }

  /// Prints once why the database cannot be read at the moment.
  void Delay(const std::string& reason) {
    if (reason != delay_) {
      delay_ = reason;
      Print("delayed", Printable(reason), {{"reason", ToUtf8(reason)}});
    }
  }

  /// Reads the new state and returns what has changed.
  Change Update(SQLite::Database& database) {
    State now = ReadState(database);
    Change change{.before = {},
                  .folders = Compare(state_.folders, now.folders),
                  .files = Compare(state_.files, now.files),
                  .volumes = {}};
    AddVolumes(database,
               "SELECT volume FROM Folders WHERE folder_id > ? ORDER BY folder_id LIMIT 10000",
               state_.folders, change.volumes);
    AddVolumes(database, "SELECT volume FROM Files WHERE file_id > ? ORDER BY file_id LIMIT 10000",
               state_.files, change.volumes);
    for (const auto& [volume, progress] : now.volumes) {
      const auto known = state_.volumes.find(volume);
      if (known == state_.volumes.end() || known->second != progress) {
        change.volumes.insert(volume);
      }
    }
    change.before = std::exchange(state_, std::move(now));
    return change;
  }

  void PrintChange(const Change& change) {
    const auto& [before, folders, files, changed] = change;
    std::vector<std::string> parts{Describe("added", folders.added, files.added),
                                   Describe("removed", folders.removed, files.removed)};
    Json volumes = Json::array();
    for (const std::string& volume : changed) {
      const Progress progress = state_.volumes[volume];
      const auto known = before.volumes.find(volume);
      parts.push_back(Printable(volume) + ": " +
                      Describe(known == before.volumes.end() ? nullptr : &known->second, progress));
      volumes.push_back({{"volume", ToUtf8(volume)},
                         {"transcoded", progress.transcoded},
                         {"total", progress.total},
                         {"merged_up_to", JsonStamp(progress.mergedUpTo)}});
    }
    std::erase(parts, "");
    Print("changed",
          parts.empty() ? "the daemon wrote to the database, but added and removed nothing"
                        : boost::algorithm::join(parts, "; "),
          {{"folders_added", folders.added},
           {"folders_removed", folders.removed},
           {"files_added", files.added},
           {"files_removed", files.removed},
           {"volumes", std::move(volumes)}});
  }

  void Print(const char* event, const std::string& text, const Json& details) const {
    const std::time_t now = std::time(nullptr);
    if (form_ == Form::JsonText) {
      Json line{{"time", JsonTime(now)}, {"event", event}};
      line.update(details);
      PrintLine(line);
    } else {
      std::cout << LocalTime(now) << "  " << text << '\n';
    }
  }

  LiveDatabase database_;
  Form form_;
  State state_;
  std::string loss_;  ///< the last reason that Lose printed; empty while there is a database
  std::string delay_; ///< the last reason that Delay printed; empty while it can be read
};

} // namespace

ExitStatus WatchDatabase(const FindPath& findPath, Form form) {
  Watch watch(findPath, form);
  while (watch.Look()) {
    std::this_thread::sleep_for(LOOK_INTERVAL);
  }
  return ExitStatus::Failed;
}

} // namespace orva::zophotos

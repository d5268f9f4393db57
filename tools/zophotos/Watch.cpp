#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"

#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Statement.h>
#include <SQLiteCpp/Transaction.h>

#include <boost/algorithm/string/join.hpp>

#include <sys/stat.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <map>
#include <optional>
#include <set>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

namespace orva::zophotos {

namespace {

/// The time between two looks.
constexpr std::chrono::milliseconds INTERVAL(250);

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

/// Identifies a file independent of its name.
using FileIdentity = std::tuple<dev_t, ino_t>;

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

class Watch {
public:
  Watch(const FindPath& findPath, Form form) : findPath_(findPath), form_(form) {}

  /// Looks once and prints what has changed since the last time. False if the output cannot be
  /// written.
  bool Look() {
    try {
      const std::string path = findPath_();
      if (!database_ || path != path_ || Identify(path) != identity_) {
        Open(path);
      } else if (Version(*database_) != version_) {
        PrintChange();
      }
      delay_.clear();
    } catch (const Failure& failure) {
      Lose(failure.what());
    } catch (const SQLite::Exception& error) {
      if (IsLocked(error)) {
        Delay(Explain(error, path_));
      } else {
        Lose(Explain(error, path_));
      }
    }
    return static_cast<bool>(std::cout.flush());
  }

private:
  static std::optional<FileIdentity> Identify(const std::string& path) {
    struct stat status {};
    if (stat(path.c_str(), &status) != 0) {
      return std::nullopt;
    }
    return FileIdentity(status.st_dev, status.st_ino);
  }

  static std::int64_t Version(SQLite::Database& database) {
    return Number(database, "PRAGMA data_version");
  }

  void Open(const std::string& path) {
    path_ = path;
    database_.reset();
    identity_ = Identify(path);
    SQLite::Database database = OpenDatabase(path);
    {
      const SQLite::Transaction oneState(database);
      state_ = ReadState(database);
      version_ = Version(database);
    }
    database_ = std::move(database);
    loss_.clear();
    Print("opened",
          "watching " + Printable(path) + ": " + Count(state_.folders.count, "folder") + ", " +
              Count(state_.files.count, "file"),
          {{"database", ToUtf8(path)},
           {"folders", state_.folders.count},
           {"files", state_.files.count}});
  }

  /// Prints once why the database is lost, and closes it.
  void Lose(const std::string& reason) {
    database_.reset();
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

  void PrintChange() {
    std::set<std::string> changed;
    Difference folders;
    Difference files;
    State before;
    {
      const SQLite::Transaction oneState(*database_);
      State now = ReadState(*database_);
      version_ = Version(*database_);
      folders = Compare(state_.folders, now.folders);
      files = Compare(state_.files, now.files);
      AddVolumes(*database_,
                 "SELECT volume FROM Folders WHERE folder_id > ? ORDER BY folder_id LIMIT 10000",
                 state_.folders, changed);
      AddVolumes(*database_,
                 "SELECT volume FROM Files WHERE file_id > ? ORDER BY file_id LIMIT 10000",
                 state_.files, changed);
      for (const auto& [volume, progress] : now.volumes) {
        const auto known = state_.volumes.find(volume);
        if (known == state_.volumes.end() || known->second != progress) {
          changed.insert(volume);
        }
      }
      before = std::exchange(state_, std::move(now));
    }
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
    if (form_ == Form::Json) {
      Json line{{"time", JsonTime(now)}, {"event", event}};
      line.update(details);
      PrintLine(line);
    } else {
      std::cout << LocalTime(now) << "  " << text << '\n';
    }
  }

  const FindPath& findPath_;
  Form form_;
  std::string path_;
  std::optional<FileIdentity> identity_;
  std::optional<SQLite::Database> database_; ///< empty while there is none
  std::int64_t version_ = 0;
  State state_;
  std::string loss_;  ///< the last reason that Lose printed; empty while there is a database
  std::string delay_; ///< the last reason that Delay printed; empty while it can be read
};

} // namespace

ExitStatus WatchDatabase(const FindPath& findPath, Form form) {
  Watch watch(findPath, form);
  while (watch.Look()) {
    std::this_thread::sleep_for(INTERVAL);
  }
  return ExitStatus::Failed;
}

} // namespace orva::zophotos

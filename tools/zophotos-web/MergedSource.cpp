#include "MergedSource.h"

#include "orvautil/FileDescriptor.h"

#include "zophotos/Failure.h"
#include "zophotos/MergedDatabase.h"

#include <SQLiteCpp/Column.h>
#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Statement.h>
#include <SQLiteCpp/Transaction.h>
#include <sqlite3.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <limits>
#include <mutex>
#include <stop_token>
#include <thread>

namespace orva::web {

namespace {

using Clock = std::chrono::steady_clock;

/// A merge that wants to commit waits for readers.
constexpr std::chrono::milliseconds LOCKED(20);

/// Milliseconds to wait for the daemon's lock. The next update tries again.
constexpr int BUSY_TIMEOUT = 500;

/// For a step in a crafted database. Others take microseconds, unless a disk has to spin up.
constexpr std::chrono::seconds LONGEST_STEP(5);

/// Bytes of a value. A longer one is an error.
constexpr int LONGEST_VALUE = 100'000;

constexpr std::size_t LONGEST_NAME = 4096;
constexpr std::size_t MOST_STATISTICS = 1'000;

/// Interrupts the connection's statements if they still run after LONGEST_STEP.
class WorkLimit {
public:
  explicit WorkLimit(SQLite::Database& database)
      : thread_([handle = database.getHandle()](const std::stop_token& stop) {
          std::mutex mutex;
          std::condition_variable_any end;
          std::unique_lock lock(mutex);
          end.wait_for(lock, stop, LONGEST_STEP, [] { return false; });
          if (!stop.stop_requested()) {
            sqlite3_interrupt(handle);
          }
        }) {}

private:
  std::jthread thread_;
};

std::int64_t Number(SQLite::Database& database, const char* sql) {
  return database.execAndGet(sql).getInt64();
}

/// The daemon's tables are plain, and their ids are the keys. Otherwise reading by id would be slow
/// or run code of the schema.
void RequirePlainTable(SQLite::Database& database, const std::string& path, const char* table,
                       const char* id) {
  SQLite::Statement plain(
      database, "SELECT 1 FROM main.sqlite_schema WHERE type = 'table' AND name = ? COLLATE NOCASE "
                "AND rootpage > 0");
  plain.bind(1, table);
  SQLite::Statement columns(
      database, "SELECT max(pk) = 1 AND max(hidden) = 0 AND sum(pk = 1 AND name = ? AND "
                "upper(type) = 'INTEGER') = 1 FROM pragma_table_xinfo(?)");
  columns.bind(1, id);
  columns.bind(2, table);
  if (!plain.executeStep() || !columns.executeStep() || columns.getColumn(0).getInt() != 1) {
    throw zophotos::Failure(zophotos::ExitStatus::Failed,
                            path + " is not a merged photo database: its table " + table +
                                " is not the daemon's");
  }
}

[[noreturn]] void Throw(const SQLite::Exception& error, const std::string& path) {
  throw zophotos::Failure(zophotos::IsLocked(error) ? zophotos::ExitStatus::Locked
                                                    : zophotos::ExitStatus::Failed,
                          zophotos::Explain(error, path));
}

/// SQLite only says that it cannot open the file.
void RequirePermission(const std::string& path) {
  if (access(path.c_str(), R_OK) != 0 && errno == EACCES) {
    throw zophotos::Failure(zophotos::ExitStatus::Failed,
                            path + ": permission denied: the user of zophotos-web has to be able "
                                   "to read this file and to enter all folders above it");
  }
}

SQLite::Database OpenSource(const std::string& path) try {
  RequirePermission(path);
  SQLite::Database database = zophotos::OpenDatabase(path);
  database.setBusyTimeout(BUSY_TIMEOUT);
  sqlite3_limit(database.getHandle(), SQLITE_LIMIT_LENGTH, LONGEST_VALUE);
  database.exec("PRAGMA cell_size_check = ON; PRAGMA mmap_size = 0; PRAGMA cache_size = -2000");
  const WorkLimit limit(database);
  RequirePlainTable(database, path, "Files", "file_id");
  RequirePlainTable(database, path, "Folders", "folder_id");
  RequirePlainTable(database, path, "Statistics", "id");
  return database;
} catch (const SQLite::Exception& error) {
  Throw(error, path);
}

/// The bytes of a text; nothing if the value is of another type.
std::optional<std::string_view> Text(const SQLite::Statement& row, int column) {
  const SQLite::Column value = row.getColumn(column);
  if (!value.isText()) {
    return std::nullopt;
  }
  const char* const text = value.getText();
  return std::string_view(text, static_cast<std::size_t>(value.getBytes()));
}

std::optional<std::int64_t> Integer(const SQLite::Statement& row, int column) {
  const SQLite::Column value = row.getColumn(column);
  return value.isInteger() ? std::optional(value.getInt64()) : std::nullopt;
}

bool IsSoundText(std::string_view text) {
  return !text.empty() && text.size() <= LONGEST_NAME && text.find('\0') == std::string_view::npos;
}

bool IsSoundName(std::string_view name) {
  return IsSoundText(name) && name.find('/') == std::string_view::npos && name != "." &&
         name != "..";
}

bool IsSoundFolder(std::string_view path) {
  return IsSoundText(path) && path.starts_with('/') && path.ends_with('/') &&
         path.find("/../") == std::string_view::npos && path.find("/./") == std::string_view::npos;
}

bool Is32Bit(std::int64_t number) {
  return number >= std::numeric_limits<std::int32_t>::min() &&
         number <= std::numeric_limits<std::int32_t>::max();
}

template <typename Row>
Row OnlyId(std::int64_t id) {
  Row row;
  row.id = id;
  return row;
}

FolderRow ReadFolder(const SQLite::Statement& row) {
  auto folder = OnlyId<FolderRow>(row.getColumn(0).getInt64());
  const auto parent = Integer(row, 1);
  const auto path = Text(row, 2);
  const auto volume = Text(row, 3);
  if (folder.id > 0 && parent && path && volume && IsSoundFolder(*path) && IsSoundText(*volume)) {
    folder = {.id = folder.id,
              .isSound = true,
              .parent = *parent,
              .path = std::string(*path),
              .volume = std::string(*volume)};
  }
  return folder;
}

FileRow ReadFile(const SQLite::Statement& row) {
  auto file = OnlyId<FileRow>(row.getColumn(0).getInt64());
  const auto folder = Integer(row, 1);
  const auto name = Text(row, 2);
  const auto modified = Integer(row, 3);
  const auto volume = Text(row, 4);
  if (file.id > 0 && folder && name && modified && volume && IsSoundName(*name) &&
      Is32Bit(*modified) && IsSoundText(*volume)) {
    file = {.id = file.id,
            .isSound = true,
            .folder = *folder,
            .name = *name,
            .modified = *modified,
            .volume = *volume};
  }
  return file;
}

/// The time for which one call may lock the database.
class LockedTime {
public:
  /// Whether it is over. To be called after each row: on a slow disk, each may take milliseconds.
  bool IsOver() const { return Clock::now() >= end_; }

private:
  Clock::time_point end_ = Clock::now() + LOCKED;
};

/// Calls `visit` for each row of `query` after the id `after`, which it advances. A row with a
/// value that is too long is skipped: `visit` gets no row for its id. Returns whether it ended
/// because the time was over.
template <typename Visit>
bool ReadRows(SQLite::Database& database, const char* sql, const char* nextId, std::int64_t& after,
              const LockedTime& time, const Visit& visit) {
  for (;;) {
    SQLite::Statement query(database, sql);
    query.bind(1, after);
    int code = SQLITE_ROW;
    while ((code = query.tryExecuteStep()) == SQLITE_ROW) {
      const std::int64_t id = query.getColumn(0).getInt64();
      if (id <= after) {
        throw SQLite::Exception("ids in wrong order", SQLITE_CORRUPT);
      }
      after = id;
      visit(id, &query);
      if (time.IsOver()) {
        return true;
      }
    }
    if (code == SQLITE_DONE) {
      return false;
    }
    if (code != SQLITE_TOOBIG) {
      throw SQLite::Exception(database.getHandle(), code);
    }
    SQLite::Statement next(database, nextId);
    next.bind(1, after);
    if (!next.executeStep() || next.getColumn(0).getInt64() <= after) {
      throw SQLite::Exception("ids in wrong order", SQLITE_CORRUPT);
    }
    after = next.getColumn(0).getInt64();
    visit(after, nullptr);
    if (time.IsOver()) {
      return true;
    }
  }
}

constexpr const char* NEXT_FOLDER =
    "SELECT folder_id FROM Folders WHERE folder_id > ? ORDER BY folder_id LIMIT 1";
constexpr const char* NEXT_FILE =
    "SELECT file_id FROM Files WHERE file_id > ? ORDER BY file_id LIMIT 1";
constexpr const char* NEXT_STATISTICS =
    "SELECT id FROM Statistics WHERE id > ? ORDER BY id LIMIT 1";

/// Where SQLite counts the changes of a file.
constexpr std::size_t CHANGE_COUNTER = 24;
using ChangeCounter = std::array<unsigned char, 4>;

SourceIdentity MakeIdentity(const std::string& path, const struct statx& status,
                            const ChangeCounter& changes) {
  SourceIdentity identity{.file = path, .content = {}};
  const auto add = [](std::string& text, auto number) { text += ' ' + std::to_string(number); };
  add(identity.file, status.stx_dev_major);
  add(identity.file, status.stx_dev_minor);
  add(identity.file, status.stx_ino);
  // The number of a removed file is used again, but not its time of creation.
  const bool hasBirth = (status.stx_mask & STATX_BTIME) != 0;
  add(identity.file, hasBirth ? status.stx_btime.tv_sec : 0);
  add(identity.file, hasBirth ? status.stx_btime.tv_nsec : 0);
  add(identity.content, status.stx_size);
  for (const statx_timestamp& time : {status.stx_mtime, status.stx_ctime}) {
    add(identity.content, time.tv_sec);
    add(identity.content, time.tv_nsec);
  }
  for (const unsigned char byte : changes) {
    add(identity.content, static_cast<unsigned>(byte));
  }
  return identity;
}

/// The identity of the file that is open at `path`, read through SQLite.
std::optional<SourceIdentity> IdentifyOpen(SQLite::Database& database, const std::string& path) {
  struct statx status {};
  sqlite3_file* file = nullptr;
  ChangeCounter changes{};
  if (statx(AT_FDCWD, path.c_str(), 0, STATX_BASIC_STATS | STATX_BTIME, &status) != 0 ||
      sqlite3_file_control(database.getHandle(), "main", SQLITE_FCNTL_FILE_POINTER, &file) !=
          SQLITE_OK ||
      file == nullptr || file->pMethods == nullptr ||
      file->pMethods->xRead(file, changes.data(), static_cast<int>(changes.size()),
                            CHANGE_COUNTER) != SQLITE_OK) {
    return std::nullopt;
  }
  return MakeIdentity(path, status, changes);
}

} // namespace

void MergedRows::Clear() {
  folders.clear();
  files_.clear();
  texts_.clear();
}

void MergedRows::Add(const FileRow& row) {
  Stored stored{.row = row,
                .name = texts_.size(),
                .nameSize = row.name.size(),
                .volume = texts_.size() + row.name.size(),
                .volumeSize = row.volume.size()};
  stored.row.name = {};
  stored.row.volume = {};
  texts_ += row.name;
  // Most files are of the same volume as the one before.
  if (!files_.empty() && files_.back().volumeSize == row.volume.size() &&
      texts_.compare(files_.back().volume, row.volume.size(), row.volume) == 0) {
    stored.volume = files_.back().volume;
  } else {
    texts_ += row.volume;
  }
  files_.push_back(stored);
}

FileRow MergedRows::File(std::size_t index) const {
  const Stored& stored = files_[index];
  FileRow row = stored.row;
  row.name = std::string_view(texts_).substr(stored.name, stored.nameSize);
  row.volume = std::string_view(texts_).substr(stored.volume, stored.volumeSize);
  return row;
}

std::optional<SourceIdentity> Identify(const std::string& path) {
  const util::FileDescriptor file(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct statx status {};
  if (!file ||
      statx(file.Get(), "", AT_EMPTY_PATH, STATX_BASIC_STATS | STATX_BTIME, &status) != 0 ||
      !S_ISREG(status.stx_mode)) {
    return std::nullopt;
  }
  ChangeCounter changes{};
  const ssize_t size = pread(file.Get(), changes.data(), changes.size(), CHANGE_COUNTER);
  return size == static_cast<ssize_t>(changes.size())
             ? std::optional(MakeIdentity(path, status, changes))
             : std::nullopt;
}

MergedSource::MergedSource(const std::string& path) : path_(path), database_(OpenSource(path)) {}

template <typename Work>
auto MergedSource::Try(const Work& work) {
  try {
    const WorkLimit limit(database_);
    return work();
  } catch (const SQLite::Exception& error) {
    Throw(error, path_);
  }
}

std::int64_t MergedSource::DataVersion() {
  return Try([this] { return Number(database_, "PRAGMA data_version"); });
}

bool MergedSource::ReadMore(Position& position, MergedRows& rows) {
  return Try([&] {
    const SQLite::Transaction oneState(database_);
    const LockedTime time;
    return ReadRows(database_,
                    "SELECT folder_id, parent_folder_id, name, volume FROM Folders "
                    "WHERE folder_id > ? ORDER BY folder_id",
                    NEXT_FOLDER, position.folder, time,
                    [&](std::int64_t id, const SQLite::Statement* row) {
                      rows.folders.push_back(row == nullptr ? OnlyId<FolderRow>(id)
                                                            : ReadFolder(*row));
                    }) ||
           ReadRows(database_,
                    "SELECT file_id, folder_id, name, modified_date, volume FROM Files "
                    "WHERE file_id > ? ORDER BY file_id",
                    NEXT_FILE, position.file, time,
                    [&](std::int64_t id, const SQLite::Statement* row) {
                      rows.Add(row == nullptr ? OnlyId<FileRow>(id) : ReadFile(*row));
                    });
  });
}

bool MergedSource::ReadFolderIds(std::int64_t& after, std::vector<std::int64_t>& ids) {
  return Try([&] {
    const LockedTime time;
    return ReadRows(database_,
                    "SELECT folder_id FROM Folders WHERE folder_id > ? ORDER BY folder_id",
                    NEXT_FOLDER, after, time,
                    [&](std::int64_t id, const SQLite::Statement*) { ids.push_back(id); });
  });
}

bool MergedSource::ReadFileIds(std::int64_t& after, std::vector<std::uint32_t>& ids) {
  return Try([&] {
    const LockedTime time;
    return ReadRows(database_, "SELECT file_id FROM Files WHERE file_id > ? ORDER BY file_id",
                    NEXT_FILE, after, time, [&](std::int64_t id, const SQLite::Statement*) {
                      ids.push_back(static_cast<std::uint32_t>(id & 0x7FFF'FFFF));
                    });
  });
}

bool MergedSource::ReadStatistics(std::int64_t& after, Statistics& statistics) {
  return Try([&] {
    const LockedTime time;
    const bool hasMore = ReadRows(
        database_,
        "SELECT id, volume, photos_xcoded, photos_total, last_updated_time FROM Statistics "
        "WHERE id > ? ORDER BY id",
        NEXT_STATISTICS, after, time, [&](std::int64_t, const SQLite::Statement* row) {
          const auto volume = row == nullptr ? std::nullopt : Text(*row, 1);
          // Only the first row of each volume counts, as for the daemon.
          if (volume && IsSoundText(*volume) && statistics.size() < MOST_STATISTICS) {
            statistics.try_emplace(std::string(*volume),
                                   StatisticsRow{.transcoded = Integer(*row, 2).value_or(0),
                                                 .total = Integer(*row, 3).value_or(0),
                                                 .mergedUpTo = Integer(*row, 4).value_or(0)});
          }
        });
    return hasMore && statistics.size() < MOST_STATISTICS;
  });
}

std::int64_t MergedSource::EstimateFiles() {
  constexpr std::int64_t FILES_ON_A_PAGE = 40;
  return Try([this] {
    const std::int64_t last =
        Number(database_, "SELECT ifnull((SELECT max(file_id) FROM Files), 0)");
    return std::clamp<std::int64_t>(last, 0,
                                    FILES_ON_A_PAGE * Number(database_, "PRAGMA page_count"));
  });
}

MergedSource::State MergedSource::ReadState() {
  return Try([this] {
    const SQLite::Transaction oneState(database_);
    // A crafted database may have any number of sequences.
    State state{.lastFile = Number(database_, "SELECT ifnull((SELECT seq FROM (SELECT name, seq "
                                              "FROM sqlite_sequence LIMIT 100) WHERE name = "
                                              "'Files' AND typeof(seq) = 'integer'), 0)"),
                .identity = IdentifyOpen(database_, path_)};
    state.dataVersion = Number(database_, "PRAGMA data_version");
    return state;
  });
}

} // namespace orva::web

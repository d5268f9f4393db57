#include "SnapshotReader.h"

#include "SearchIndex.h"
#include "SnapshotFile.h"

#include "zophotos/MergedDatabase.h"

#include <SQLiteCpp/Column.h>
#include <SQLiteCpp/Database.h>
#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Statement.h>
#include <SQLiteCpp/Transaction.h>
#include <sqlite3.h>

#include <algorithm>
#include <ctime>
#include <functional>
#include <limits>
#include <map>
#include <string_view>
#include <tuple>

namespace orva::web {

namespace {

/// Rows of one answer.
constexpr std::size_t MOST_ROWS = 1'000;
constexpr std::size_t MOST_ANCESTORS = 100;

constexpr std::int64_t SMALLEST = 0;
constexpr std::int64_t LARGEST = std::numeric_limits<std::int64_t>::max();

/// Ids from `first` to `last`.
struct Range {
  PhotoId first = SMALLEST;
  PhotoId last = LARGEST;
};

std::int64_t Clamp32(std::int64_t seconds) {
  return std::clamp<std::int64_t>(seconds, std::numeric_limits<std::int32_t>::min(),
                                  std::numeric_limits<std::int32_t>::max());
}

/// The ids of photos from the first to the last second; no ids if there can be none.
Range RangeOf(const Filter& filter) {
  if (!filter.times) {
    return {};
  }
  const auto [first, last] = *filter.times;
  if (first > last || first != Clamp32(first) || last != Clamp32(last)) {
    const bool isEmpty = first > last || first > Clamp32(first) || last < Clamp32(last);
    return isEmpty ? Range{.first = LARGEST, .last = SMALLEST}
                   : Range{.first = MakePhotoId(Clamp32(first), 0),
                           .last = MakePhotoId(Clamp32(last), -1)};
  }
  return {.first = MakePhotoId(first, 0), .last = MakePhotoId(last, -1)};
}

int LimitOf(std::size_t count) {
  return static_cast<int>(std::min(count, MOST_ROWS));
}

/// The month that contains a time, and the first second after it.
std::pair<Month, std::int64_t> MonthOf(std::int64_t seconds) {
  const std::time_t time = seconds;
  std::tm fields{};
  localtime_r(&time, &fields);
  const Month month{.year = fields.tm_year + 1900, .month = fields.tm_mon + 1};
  fields.tm_mon += 1;
  fields.tm_mday = 1;
  fields.tm_hour = fields.tm_min = fields.tm_sec = 0;
  fields.tm_isdst = -1;
  return {month, std::max<std::int64_t>(std::mktime(&fields), seconds + 1)};
}

} // namespace

class SnapshotReader::Implementation {
public:
  explicit Implementation(const Snapshot& snapshot) : snapshot_(snapshot) {}

  /// Returns what `work` reads from one state of the snapshot.
  template <typename Work>
  auto Read(const Work& work) {
    for (;;) {
      const std::string path = snapshot_.File();
      try {
        if (path != path_ || !database_) {
          Open(path);
        }
        const SQLite::Transaction oneState(*database_);
        const ResetAll reset(statements_);
        return work();
      } catch (const SQLite::Exception& error) {
        Close();
        // A new snapshot may have replaced this one before it was open.
        if (snapshot_.File() == path) {
          if (zophotos::IsDamage(error)) {
            snapshot_.ReportDamage();
          }
          throw;
        }
      }
    }
  }

  SQLite::Statement& Prepared(const char* sql) {
    auto found = statements_.find(std::string_view(sql));
    if (found == statements_.end()) {
      found = statements_
                  .emplace(std::piecewise_construct, std::forward_as_tuple(sql),
                           std::forward_as_tuple(*database_, sql))
                  .first;
    }
    found->second.reset();
    return found->second;
  }

  /// The expression for MATCH; empty if it does not matter, nothing if no photo can match.
  std::optional<std::string> Expression(const Filter& filter) {
    SearchTerms terms{.words = filter.words, .volume = std::nullopt, .folder = filter.folder};
    if (filter.volume) {
      SQLite::Statement& query = Prepared("SELECT number FROM Volumes WHERE mountPoint = ?");
      query.bind(1, *filter.volume);
      if (!query.executeStep()) {
        return std::nullopt;
      }
      terms.volume = query.getColumn(0).getInt64();
    }
    if (filter.folder && *filter.folder <= 0) {
      return std::nullopt;
    }
    return MatchExpression(terms,
                           filter.words.empty() ? std::vector<VolumeWords>() : AllVolumeWords(),
                           frequent_, [this](const std::string& from) { return NextWord(from); });
  }

  std::int64_t Version() {
    SQLite::Statement& query = Prepared("SELECT version FROM State");
    query.executeStep();
    return query.getColumn(0).getInt64();
  }

  /// The ids of the newest photos in a range, newest first, or of the oldest, oldest first.
  std::vector<PhotoId> Ids(const std::string& expression, const Range& range, bool newest,
                           int count) {
    const bool isSearch = !expression.empty();
    SQLite::Statement& query =
        Prepared(isSearch ? newest ? "SELECT rowid FROM Search WHERE Search MATCH ?4 AND rowid >= "
                                     "?1 AND rowid <= ?2 ORDER BY rowid DESC LIMIT ?3"
                                   : "SELECT rowid FROM Search WHERE Search MATCH ?4 AND rowid >= "
                                     "?1 AND rowid <= ?2 ORDER BY rowid LIMIT ?3"
                 : newest ? "SELECT id FROM Photos WHERE id >= ?1 AND id <= ?2 ORDER BY id DESC "
                            "LIMIT ?3"
                          : "SELECT id FROM Photos WHERE id >= ?1 AND id <= ?2 ORDER BY id LIMIT "
                            "?3");
    query.bind(1, range.first);
    query.bind(2, range.last);
    query.bind(3, count);
    if (isSearch) {
      query.bind(4, expression);
    }
    std::vector<PhotoId> ids;
    while (query.executeStep()) {
      ids.push_back(query.getColumn(0).getInt64());
    }
    return ids;
  }

  std::optional<Photo> Find(PhotoId id) {
    SQLite::Statement& query =
        Prepared("SELECT p.folder, f.path, p.name, v.mountPoint FROM Photos p JOIN Folders f ON "
                 "f.id = p.folder JOIN Volumes v ON v.number = p.volume WHERE p.id = ?");
    query.bind(1, id);
    if (!query.executeStep()) {
      return std::nullopt;
    }
    Photo photo{.id = id,
                .folder = query.getColumn(0).getInt64(),
                .path = query.getColumn(1).getString(),
                .name = query.getColumn(2).getString(),
                .volume = query.getColumn(3).getString(),
                .modified = TimeOf(id)};
    photo.path += photo.name;
    return photo;
  }

  std::vector<Photo> Load(const std::vector<PhotoId>& ids) {
    std::vector<Photo> photos;
    for (const PhotoId id : ids) {
      auto photo = Find(id);
      if (photo) {
        photos.push_back(std::move(*photo));
      }
    }
    return photos;
  }

  /// Completes a folder that a query with these columns has: id, parent, path, mount point.
  Folder ReadFolder(const SQLite::Statement& row) {
    Folder folder{.id = row.getColumn(0).getInt64(),
                  .parent = row.getColumn(1).getInt64(),
                  .path = row.getColumn(2).getString(),
                  .volume = row.getColumn(3).getString()};
    SQLite::Statement& inside = Prepared("SELECT 1 FROM Folders WHERE parent = ? LIMIT 1");
    inside.bind(1, folder.id);
    folder.hasFolders = inside.executeStep();
    folder.hasPhotos = !Ids('"' + FolderMark(folder.id) + '"', {}, false, 1).empty();
    return folder;
  }

  std::optional<Folder> FindFolder(std::int64_t id) {
    SQLite::Statement& query =
        Prepared("SELECT f.id, f.parent, f.path, v.mountPoint FROM Folders f JOIN Volumes v ON "
                 "v.number = f.volume WHERE f.id = ?");
    query.bind(1, id);
    return query.executeStep() ? std::optional(ReadFolder(query)) : std::nullopt;
  }

  std::vector<Month> Months(const Filter& filter) {
    std::vector<Month> months;
    const auto expression =
        Expression({.folder = filter.folder, .volume = filter.volume, .words = {}, .times = {}});
    // From the oldest one: FTS5 finds a place in a long list faster in this direction.
    Range range;
    while (expression) {
      const std::vector<PhotoId> oldest = Ids(*expression, range, false, 1);
      if (oldest.empty()) {
        break;
      }
      const auto [month, end] = MonthOf(TimeOf(oldest.front()));
      if (months.empty() || months.back() != month) {
        months.push_back(month);
      }
      if (end != Clamp32(end)) {
        break;
      }
      range.first = MakePhotoId(end, 0);
    }
    std::ranges::reverse(months);
    return months;
  }

private:
  using Statements = std::map<std::string, SQLite::Statement, std::less<>>;

  /// Resets the statements, so that the transaction can end.
  class ResetAll {
  public:
    explicit ResetAll(Statements& statements) : statements_(statements) {}
    ~ResetAll() {
      for (auto& [sql, statement] : statements_) {
        statement.tryReset();
      }
    }
    ResetAll(const ResetAll&) = delete;
    ResetAll& operator=(const ResetAll&) = delete;

  private:
    Statements& statements_;
  };

  /// The smallest word of the index that is not smaller than `from`. The answers for the present
  /// version are kept: FTS5 reads all photos of a word to find the next one.
  std::optional<std::string> NextWord(const std::string& from) {
    constexpr std::size_t mostWords = 1'000;
    const std::int64_t version = Version();
    if (version != wordsVersion_ || nextWords_.size() >= mostWords) {
      nextWords_.clear();
      wordsVersion_ = version;
    }
    const auto found = nextWords_.find(from);
    if (found != nextWords_.end()) {
      return found->second;
    }
    SQLite::Statement& query = Prepared("SELECT term FROM temp.Words WHERE term >= ? LIMIT 1");
    query.bind(1, from);
    auto word = query.executeStep() ? std::optional(query.getColumn(0).getString()) : std::nullopt;
    nextWords_.emplace(from, word);
    return word;
  }

  /// The words of all mount points. They are kept for the present version.
  const std::vector<VolumeWords>& AllVolumeWords() {
    const std::int64_t version = Version();
    if (volumeWords_.empty() || version != volumeWordsVersion_) {
      volumeWords_.clear();
      SQLite::Statement& query = Prepared("SELECT number, mountPoint FROM Volumes");
      while (query.executeStep()) {
        VolumeWords& volume = volumeWords_.emplace_back();
        volume.volume = query.getColumn(0).getInt64();
        AppendWords(query.getColumn(1).getString(), volume.words);
      }
      volumeWordsVersion_ = version;
    }
    return volumeWords_;
  }

  void Open(const std::string& path) {
    Close();
    database_.emplace(OpenForReading(path));
    // In the connection's own memory.
    database_->exec("CREATE VIRTUAL TABLE temp.Words USING fts5vocab(main, Search, instance)");
    frequent_ = ReadFrequentPrefixes(*database_);
    path_ = path;
  }

  void Close() {
    statements_.clear();
    database_.reset();
    nextWords_.clear();
    volumeWords_.clear();
  }

  const Snapshot& snapshot_;
  std::string path_;
  std::optional<SQLite::Database> database_;
  Statements statements_;
  FrequentPrefixes frequent_;
  std::map<std::string, std::optional<std::string>> nextWords_;
  std::int64_t wordsVersion_ = 0;
  std::vector<VolumeWords> volumeWords_;
  std::int64_t volumeWordsVersion_ = 0;
};

SnapshotReader::SnapshotReader(const Snapshot& snapshot)
    : implementation_(std::make_unique<Implementation>(snapshot)) {}

SnapshotReader::~SnapshotReader() = default;

std::vector<Photo> SnapshotReader::Photos(const Filter& filter, std::optional<PhotoId> before,
                                          std::size_t count) {
  return implementation_->Read([&]() -> std::vector<Photo> {
    Range range = RangeOf(filter);
    if (before) {
      if (*before <= SMALLEST) {
        return {};
      }
      range.last = std::min(range.last, *before - 1);
    }
    const auto expression = implementation_->Expression(filter);
    if (!expression) {
      return {};
    }
    return implementation_->Load(implementation_->Ids(*expression, range, true, LimitOf(count)));
  });
}

std::vector<Photo> SnapshotReader::PhotosAfter(const Filter& filter, PhotoId after,
                                               std::size_t count) {
  return implementation_->Read([&]() -> std::vector<Photo> {
    Range range = RangeOf(filter);
    if (after == LARGEST) {
      return {};
    }
    range.first = std::max(range.first, after + 1);
    const auto expression = implementation_->Expression(filter);
    if (!expression) {
      return {};
    }
    std::vector<PhotoId> ids = implementation_->Ids(*expression, range, false, LimitOf(count));
    std::ranges::reverse(ids);
    return implementation_->Load(ids);
  });
}

std::optional<Photo> SnapshotReader::Find(PhotoId id) {
  return implementation_->Read([&] { return implementation_->Find(id); });
}

std::vector<Folder> SnapshotReader::Folders(std::int64_t parent, const std::optional<Folder>& after,
                                            std::size_t count) {
  return implementation_->Read([&] {
    SQLite::Statement& query = implementation_->Prepared(
        "SELECT f.id, f.parent, f.path, v.mountPoint FROM Folders f JOIN Volumes v ON v.number = "
        "f.volume WHERE f.parent = ? AND (f.path, f.id) > (?, ?) ORDER BY f.path, f.id LIMIT ?");
    query.bind(1, parent);
    query.bind(2, after ? after->path : "");
    query.bind(3, after ? after->id : 0);
    query.bind(4, LimitOf(count));
    std::vector<Folder> folders;
    while (query.executeStep()) {
      folders.push_back(implementation_->ReadFolder(query));
    }
    return folders;
  });
}

std::optional<Folder> SnapshotReader::FindFolder(std::int64_t id) {
  return implementation_->Read([&] { return implementation_->FindFolder(id); });
}

std::vector<Folder> SnapshotReader::Ancestors(std::int64_t folder) {
  return implementation_->Read([&] {
    std::vector<Folder> ancestors;
    auto current = implementation_->FindFolder(folder);
    while (current && current->parent != -1 && ancestors.size() < MOST_ANCESTORS) {
      current = implementation_->FindFolder(current->parent);
      if (current) {
        ancestors.push_back(*current);
      }
    }
    std::ranges::reverse(ancestors);
    return ancestors;
  });
}

std::vector<VolumeRow> SnapshotReader::Volumes(std::size_t mostBytes) {
  return implementation_->Read([&] {
    SQLite::Statement& query =
        implementation_->Prepared("SELECT mountPoint, transcoded, total, mergedUpTo, isGone FROM "
                                  "Statistics ORDER BY mountPoint LIMIT ?");
    query.bind(1, static_cast<int>(MOST_ROWS));
    std::vector<VolumeRow> volumes;
    std::size_t bytes = 0;
    while (bytes <= mostBytes && query.executeStep()) {
      volumes.push_back({.mountPoint = query.getColumn(0).getString(),
                         .transcoded = query.getColumn(1).getInt64(),
                         .total = query.getColumn(2).getInt64(),
                         .mergedUpTo = query.getColumn(3).getInt64(),
                         .isGone = query.getColumn(4).getInt() != 0});
      bytes += volumes.back().mountPoint.size();
    }
    return volumes;
  });
}

std::vector<Month> SnapshotReader::Months(const Filter& filter) {
  return implementation_->Read([&] { return implementation_->Months(filter); });
}

std::int64_t SnapshotReader::Version() {
  return implementation_->Read([&] { return implementation_->Version(); });
}

} // namespace orva::web

#pragma once

#include <SQLiteCpp/Database.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace orva::web {

/// A row of the merged database's Files. If it cannot be the daemon's, only the id is set.
struct FileRow {
  std::int64_t id = 0;
  bool isSound = false;
  std::int64_t folder = 0;
  std::string_view name;
  std::int64_t modified = 0;
  std::string_view volume;
};

/// The same for a row of Folders.
struct FolderRow {
  std::int64_t id = 0;
  bool isSound = false;
  std::int64_t parent = 0;
  std::string path;
  std::string volume;
};

/// Rows in memory, in the order of their ids.
class MergedRows {
public:
  void Clear();
  void Add(const FileRow& row);

  std::size_t Files() const noexcept { return files_.size(); }
  /// Refers to this object.
  FileRow File(std::size_t index) const;

  std::vector<FolderRow> folders;

private:
  struct Stored {
    FileRow row; ///< without its texts
    std::size_t name;
    std::size_t nameSize;
    std::size_t volume;
    std::size_t volumeSize;
  };

  std::vector<Stored> files_;
  std::string texts_;
};

/// A row of Statistics.
struct StatisticsRow {
  std::int64_t transcoded = 0;
  std::int64_t total = 0;
  std::int64_t mergedUpTo = 0;
};

/// By volume.
using Statistics = std::map<std::string, StatisticsRow, std::less<>>;

/// Identifies a file, and its content at a time. Valid until the next start of the system.
struct SourceIdentity {
  std::string file;
  std::string content;

  bool operator==(const SourceIdentity&) const = default;
};

/// The identity of the merged database at `path`; nothing if no file is there. Must not be called
/// while a MergedSource is open: to close a file ends SQLite's locks on it.
std::optional<SourceIdentity> Identify(const std::string& path);

/// The merged database, open to be read in place. It is untrusted: the work of each call is
/// limited, and so is the memory. Each call locks the database for about 20 milliseconds at most.
/// All operations throw zophotos::Failure.
class MergedSource {
public:
  explicit MergedSource(const std::string& path);

  const std::string& Path() const noexcept { return path_; }

  /// Changes with each commit of the daemon.
  std::int64_t DataVersion();

  /// The largest ids that were read.
  struct Position {
    std::int64_t folder = 0;
    std::int64_t file = 0;
  };

  /// Appends rows with larger ids than `position`, which it advances: first all folders, then
  /// files, so that the folder of a file is known. Returns whether there are more.
  bool ReadMore(Position& position, MergedRows& rows);

  /// Appends ids of rows that are larger than `after`, which it advances. Returns whether there
  /// are more. Of files only the lower 31 bits.
  bool ReadFolderIds(std::int64_t& after, std::vector<std::int64_t>& ids);
  bool ReadFileIds(std::int64_t& after, std::vector<std::uint32_t>& ids);

  /// Adds the first row of each volume with a larger id than `after`, which it advances, up to
  /// 1,000 volumes. Returns whether there are more.
  bool ReadStatistics(std::int64_t& after, Statistics& statistics);

  /// About how many files there are. Counting them takes as long as reading all their ids.
  std::int64_t EstimateFiles();

  struct State {
    std::int64_t dataVersion = 0;
    std::int64_t lastFile = 0;              ///< largest id that a file ever had
    std::optional<SourceIdentity> identity; ///< of the file at the path
  };
  State ReadState();

private:
  template <typename Work>
  auto Try(const Work& work);

  std::string path_;
  SQLite::Database database_;
};

} // namespace orva::web

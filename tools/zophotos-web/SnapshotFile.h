#pragma once

#include "MergedSource.h"
#include "SearchIndex.h"

#include <SQLiteCpp/Database.h>
#include <SQLiteCpp/Statement.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace orva::web {

/// Opens a snapshot's file to read it. Throws SQLite::Exception.
SQLite::Database OpenForReading(const std::string& path);

/// The frequent prefixes of the search index in an open snapshot.
FrequentPrefixes ReadFrequentPrefixes(SQLite::Database& database);

/// A photo's id: the time and 31 bits that tell photos of the same time apart. Never negative: FTS5
/// (SQLite 3.40) writes beyond its memory when it merges lists with negative ids.
constexpr std::int64_t MakePhotoId(std::int64_t modified, std::int64_t number) {
  constexpr std::int64_t smallestTime = -0x8000'0000LL;
  return (modified - smallestTime) << 31 | (number & 0x7FFF'FFFF);
}

/// The time in a photo's id.
constexpr std::int64_t TimeOf(std::int64_t id) {
  return (id >> 31) - 0x8000'0000LL;
}

/// The lower 31 bits of the id of a photo's row.
constexpr std::int64_t RowOf(std::int64_t id, std::int64_t firstNumber) {
  return (id - firstNumber) & 0x7FFF'FFFF;
}

/// Another merged database gives the ids of rows to other photos. The numbers in its photos' ids
/// begin elsewhere among 2^30, so that an id from a page that is still open finds no other photo.
std::int64_t FirstNumber(const SourceIdentity& source);

/// What a snapshot's file says about itself.
struct SnapshotState {
  std::int64_t version = 0; ///< see SnapshotReader::Version
  MergedSource::Position position;
  std::int64_t photos = 0;
  std::int64_t folders = 0;
  std::int64_t filesLeftOut = 0; ///< rows of the merged database that the snapshot does not have
  std::int64_t foldersLeftOut = 0;
  std::int64_t changes = 0;     ///< photos added and removed since it was built
  std::int64_t firstNumber = 0; ///< in photos' ids, of the row 0
  std::string boot;             ///< identifies the start of the system
  SourceIdentity source;        ///< what the snapshot agrees with; the content may be empty
};

/// Photos to be added, in memory.
class PhotoBatch {
public:
  struct Row {
    std::int64_t id;
    std::int64_t folder;
    std::uint32_t volume;
    std::uint32_t nameSize;
    std::size_t name; ///< its place in the names
  };

  void Add(std::int64_t id, const FileRow& file, std::int64_t volume);
  void Sort();
  void Clear();

  const std::vector<Row>& Rows() const noexcept { return rows_; }
  std::string_view Name(const Row& row) const {
    return std::string_view(names_).substr(row.name, row.nameSize);
  }
  std::size_t Bytes() const noexcept { return rows_.capacity() * sizeof(Row) + names_.capacity(); }

private:
  std::vector<Row> rows_;
  std::string names_;
};

/// The file of a snapshot, open for writing: an SQLite database of our own. Used by one thread. All
/// operations throw SQLite::Exception.
class SnapshotFile {
public:
  /// Creates the file for a new snapshot. It is faster to fill, but useless after a crash, until
  /// Complete.
  static SnapshotFile Create(const std::string& path);

  /// Opens a complete snapshot of this version of the program; nothing if the file is none.
  static std::optional<SnapshotFile> Open(const std::string& path);

  SnapshotFile(SnapshotFile&&) = default;
  SnapshotFile& operator=(SnapshotFile&&) = delete;

  const std::string& Path() const noexcept { return path_; }
  SnapshotState& State() noexcept { return state_; }

  /// The size of the database, in bytes.
  std::int64_t Bytes();

  void Begin();
  /// Saves the state as well.
  void Commit();
  void Rollback();

  /// Adds a folder, or counts it as left out.
  void AddFolder(const FolderRow& folder);

  /// Adds a file to the batch, or counts it as left out: files without a folder, and those of too
  /// many volumes. Returns whether it was added.
  bool Collect(const FileRow& file, PhotoBatch& batch);

  /// Adds the photos of a sorted batch, and adds them to the search index if `index` is set.
  void AddPhotos(const PhotoBatch& batch, bool index);

  /// The words of a photo as the search index has them. Valid until the next call.
  const std::string& SearchText(std::int64_t folder, std::int64_t volume, std::string_view name);

  /// Sets the frequent prefixes, before anything is in the search index.
  void SetFrequentPrefixes(const std::vector<std::string>& prefixes);

  /// Adds all photos to the empty search index. Calls `progress` now and then.
  void IndexAll(const std::function<void(std::int64_t done)>& progress);

  /// Calls `visit` for each photo's id.
  void ForEachPhoto(const std::function<void(std::int64_t id)>& visit);
  void ForEachFolder(const std::function<void(std::int64_t id)>& visit);

  void RemovePhotos(const std::vector<std::int64_t>& ids);
  /// Removes a folder and photos that are still in it.
  void RemoveFolder(std::int64_t id);

  /// Gives each folder whose parent is missing the nearest one of its path that exists.
  void AdoptFolders();

  /// Returns whether that changed anything.
  bool ReplaceStatistics(const Statistics& statistics);

  /// Makes the file safe to be read while it is written.
  void Complete();

  /// Merges parts of the search index for some milliseconds. Returns whether there may be more to
  /// do.
  bool Tidy();

private:
  SnapshotFile(std::string path, SQLite::Database database);
  struct FolderWords {
    bool exists = false;
    std::string text; ///< the part of SearchText that is the same for all photos of the folder
  };

  /// A statement that is compiled once, reset.
  SQLite::Statement& Prepared(const char* sql);
  const FolderWords& WordsOf(std::int64_t folder);
  std::optional<std::int64_t> VolumeNumber(std::string_view mountPoint);
  bool HasRows(std::int64_t volume);
  std::int64_t NearestFolder(std::string_view path);
  void LoadState();
  void SaveState();

  std::string path_;
  SQLite::Database database_;
  SnapshotState state_;
  FrequentPrefixes frequent_;
  std::map<std::string, SQLite::Statement, std::less<>> statements_;
  std::map<std::string, std::int64_t, std::less<>> volumes_;
  std::unordered_map<std::int64_t, FolderWords> folderWords_; ///< of some folders
  std::size_t folderWordsSize_ = 0;
  std::string searchText_;
};

} // namespace orva::web

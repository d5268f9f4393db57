#pragma once

#include "Snapshot.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace orva::web {

/// Identifies a photo in the snapshot, and sorts by modification time. Never negative. A photo has
/// another id after the election of another master or a purge of its volume; its former id then
/// means no other photo.
using PhotoId = std::int64_t;

struct Photo {
  PhotoId id = 0;
  std::int64_t folder = 0;
  std::string path;          ///< absolute; bytes of the file system
  std::string name;          ///< the last component of the path
  std::string volume;        ///< mount point, "/shares/Photos/"
  std::int64_t modified = 0; ///< seconds since the epoch

  bool operator==(const Photo&) const = default;
};

struct Folder {
  std::int64_t id = 0;
  std::int64_t parent = -1; ///< -1: none in the snapshot
  std::string path;         ///< absolute, with a "/" at its end
  std::string volume;       ///< mount point; "<DUMMY>" for the root
  bool hasFolders = false;
  bool hasPhotos = false;

  bool operator==(const Folder&) const = default;
};

/// A volume in the merged database's statistics.
struct VolumeRow {
  std::string mountPoint;
  std::int64_t transcoded = 0;
  std::int64_t total = 0;
  std::int64_t mergedUpTo = 0; ///< stamp; 0 for none
  bool isGone = false;         ///< unplugged, or purged and not merged since

  bool operator==(const VolumeRow&) const = default;
};

/// A calendar month in local time; `month` is 1 to 12.
struct Month {
  int year = 0;
  int month = 0;

  bool operator==(const Month&) const = default;
};

/// Selects photos: all conditions hold.
struct Filter {
  std::optional<std::int64_t> folder; ///< directly in this folder
  std::optional<std::string> volume;  ///< mount point
  /// Words of the path below the volume, in any order. Each matches the beginning of a word,
  /// without regard to case and accents. Any text; it has no syntax. Without any letter or digit:
  /// all.
  std::string words;
  std::optional<std::pair<std::int64_t, std::int64_t>> times; ///< first and last second
};

/// Reads the snapshot; each call reads one state of it. Throws std::exception on errors. Each
/// thread has its own reader. The snapshot must outlive the reader.
class SnapshotReader {
public:
  explicit SnapshotReader(const Snapshot& snapshot);
  ~SnapshotReader();
  SnapshotReader(const SnapshotReader&) = delete;
  SnapshotReader& operator=(const SnapshotReader&) = delete;

  /// The newest photos, newest first, at most `count`; with `before`, those with smaller ids.
  std::vector<Photo> Photos(const Filter& filter, std::optional<PhotoId> before, std::size_t count);

  /// The photos that precede `after` in that order: the nearest `count` ones, newest first.
  std::vector<Photo> PhotosAfter(const Filter& filter, PhotoId after, std::size_t count);

  std::optional<Photo> Find(PhotoId id);

  /// Folders in `parent`, in the order of their paths' bytes and ids, at most `count`; with
  /// `after`, only those that follow it.
  std::vector<Folder> Folders(std::int64_t parent, const std::optional<Folder>& after,
                              std::size_t count);

  std::optional<Folder> FindFolder(std::int64_t id);

  /// The folders that contain a folder, from the top; at most 100.
  std::vector<Folder> Ancestors(std::int64_t folder);

  /// By mount point; at most 1,000. The last one is the first whose name, with those before it, has
  /// more than `mostBytes` bytes.
  std::vector<VolumeRow> Volumes(std::size_t mostBytes = SIZE_MAX);

  /// The months that have photos, in local time, newest first. Only the folder and the volume
  /// of the filter count.
  std::vector<Month> Months(const Filter& filter);

  /// Grows with each change that readers can see, also over restarts of the program.
  std::int64_t Version();

private:
  class Implementation;
  std::unique_ptr<Implementation> implementation_;
};

} // namespace orva::web

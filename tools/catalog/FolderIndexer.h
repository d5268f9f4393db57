#pragma once

#include "Classification.h"
#include "RenditionAccess.h"

#include <ctime>
#include <deque>
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace orva::db {
class DB;
class Statement;
} // namespace orva::db

namespace orva::catalog {

class VolumeRoot;

/// What was found and changed.
struct IndexSummary {
  long long folders = 0; ///< on the volume
  long long files = 0;   ///< on the volume
  long long photos = 0;  ///< of the files
  long long rows = 0;    ///< of these files; those that may not be entered yet have none

  // Numbers of files that were changed in the catalog.
  long long added = 0;
  long long changed = 0;
  long long deleted = 0;
  long long revived = 0;
  long long linked = 0; ///< of those that were changed, files with several names

  /// A message for each folder or file that could not be read. Its rows and those of what is below
  /// it are unchanged, because it may still exist.
  std::vector<std::string> unreadable;
};

/// The state of new and changed photos.
enum class NewPhotos {
  Finished, ///< listed by merged databases at once
  Waiting   ///< for the transcoder
};

/// A folder that has a row, or the root of the volume, which has none and an empty path.
struct IndexedFolder {
  long long id = -1;
  std::string path{}; ///< relative to the volume, ending in "/"
  Flags flags{};
  std::time_t lastModifiedDate = 0;
  bool revived = false; ///< its row was marked deleted until now
};

/// Brings the rows of single folders up to date with the volume. Lists a folder and reads its rows;
/// memory grows with the largest folder on the volume only, whatever the catalog holds. An object
/// belongs to one transaction of its caller, on the catalog's thread. Links are not followed; file
/// systems mounted below the volume are. Failures of the database are thrown as std::string, others
/// as util::Exception.
class FolderIndexer {
public:
  /// What tells whether a file is still changing.
  struct FileState {
    long long size = 0;
    timespec statusChanged{}; ///< its ctime

    bool operator==(const FileState& other) const noexcept {
      return size == other.size && statusChanged.tv_sec == other.statusChanged.tv_sec &&
             statusChanged.tv_nsec == other.statusChanged.tv_nsec;
    }
  };

  /// What the caller does meanwhile. Each may be empty.
  struct Hooks {
    /// Called with the descriptor of the folder before it is listed.
    std::function<void(const IndexedFolder&, int)> opened{};
    /// Whether a new or changed file of the folder may be entered. Otherwise its row stays as it
    /// is.
    std::function<bool(const IndexedFolder&, const std::string&, const FileState&)> isComplete{};
    /// Whether a photo of the folder was written or replaced since its row was. Then it has
    /// changed, even if it has the same size and time.
    std::function<bool(const IndexedFolder&, const std::string&)> wasWritten{};
    /// Called often. What it throws ends the update.
    std::function<void()> pulse{};
  };

  /// `catalog` is open for writing, has its schema and describes `volume`; both outlive the object.
  /// `now` is the time of the changes.
  FolderIndexer(const db::DB& catalog, const VolumeRoot& volume, NewPhotos newPhotos,
                std::time_t now, Hooks hooks);

  /// Updates the rows of what is directly in `folder`, and marks all rows below a folder that is
  /// gone. Returns the folders in it, each with its row.
  std::vector<IndexedFolder> Update(const IndexedFolder& folder);

  /// The folder with this path, if its row is not marked deleted.
  std::optional<IndexedFolder> Find(const std::string& path) const;

  /// Marks rows deleted that no folder leads to. Only a damaged or crafted catalog has such rows,
  /// so they are looked for only if there are other numbers of rows than a walk of the whole volume
  /// has found. Returns the number of files that are not marked deleted. Throws
  /// CatalogError for a damaged catalog.
  long long DeleteUnreachableRows(long long folders, long long files);

  const IndexSummary& Summary() const noexcept { return summary_; }

  /// Whether the last update has done everything. Otherwise, many rows had vanished, and the folder
  /// has to be updated again.
  bool IsFinished() const noexcept { return isFinished_; }

  /// Whether a row was changed.
  bool HasChanged() const noexcept { return stamp_ != 0; }

  /// Whether photos or folders were changed. Merged databases and the transcoder read nothing else,
  /// and of a folder only whether it is there.
  bool HasVisibleChanges() const noexcept { return hasVisibleChanges_; }

private:
  /// A file or folder found in a folder.
  struct Entry {
    std::string name;
    bool isFolder = false;
    bool isKnown = true; ///< false: its row must stay as it is
    std::time_t lastModifiedDate = 0;
    long long size = 0;
    bool isLinked = false; ///< a file with several names
    PhotoAccess access{};  ///< of a file
  };
  /// What the catalog says about one of them.
  struct FolderRow {
    const Entry* entry = nullptr;
    IndexedFolder folder;
    bool isDeleted = false;
  };
  /// The folders of the catalog that are in a folder.
  struct FolderRows {
    std::vector<FolderRow> known;    ///< by name
    std::vector<long long> vanished; ///< ids
    std::vector<long long> crafted;  ///< ids; their names are too long for any file system
    bool areAll = true;              ///< otherwise, some more have vanished
  };
  struct FileRow {
    long long id = 0;
    int status = 0;
    bool isPhoto = false;
    bool isDeleted = false;
    long long tombstone = 0; ///< the id of a second row for the path; 0 if there is none
  };
  struct Listing {
    std::vector<Entry> folders; ///< by name
    std::deque<Entry> files;    ///< by name
    bool isWhole = true;
  };
  /// A file whose row must be written.
  struct FileChange {
    const Entry* entry = nullptr;
    std::optional<FileRow> row;
  };
  /// The differences between a folder and its rows.
  struct FileChanges {
    std::deque<FileChange> written;
    std::vector<FileRow> vanished;
  };

  std::time_t Stamp();
  void Pulse(std::size_t count) const;
  Listing List(const IndexedFolder& folder, int descriptor);
  void Examine(const IndexedFolder& folder, int descriptor, const char* name, Listing& listing);
  FolderRows ReadFolderRows(const IndexedFolder& folder, const Listing& listing) const;
  std::vector<IndexedFolder> UpdateFolders(const IndexedFolder& folder, const Listing& listing);
  IndexedFolder UpdateFolder(const IndexedFolder& parent, const Entry& entry,
                             const FolderRow* known);
  FileChanges CompareFiles(const IndexedFolder& folder, const Listing& listing);
  bool IsUpToDate(const db::Statement& row, const IndexedFolder& folder, const Entry& entry) const;
  bool MayBeOpenedNow(const db::Statement& row, const Entry& entry) const;
  void UpdateFile(const IndexedFolder& folder, const FileChange& change);
  void DeleteFile(const FileRow& file);
  void MarkFolderDeleted(long long id);
  void DeleteTree(const std::string& path);
  void DeleteFiles(const std::string& begin, const std::string& end);
  void DeleteUnreachableFolders();
  void DeleteUnreachableFiles();
  void LeaveAlone(const std::string& path, const std::string& reason);
  bool IsLeftAlone(const std::string& path) const;

  const db::DB& catalog_;
  const VolumeRoot& volume_;
  const NewPhotos newPhotos_;
  const std::time_t now_;
  const Hooks hooks_;
  std::time_t stamp_ = 0; ///< 0 until the first change
  bool hasVisibleChanges_ = false;
  bool isFinished_ = true;
  long long nextFolderId_ = 1;
  long long nextFileId_ = 1;
  std::vector<std::string> leftAlone_; ///< paths, without a trailing separator
  IndexSummary summary_;
};

} // namespace orva::catalog

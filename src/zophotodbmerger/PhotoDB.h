#pragma once

#include "Status.h"

#include "orvadb/DB.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace orva::db {
class File;
class Folder;
class Statement;
} // namespace orva::db

namespace orva::dbmerger {

struct File;
struct Folder;
struct Statistics;

/// The id that stands for a missing folder.
constexpr long long NO_FOLDER = -1;

/// The path of the folder that holds the folder at `path`, with its trailing separator.
std::string_view ParentPath(std::string_view path);

/// The path of the folder that holds the file at `path`, with its trailing separator.
std::string_view FolderPath(std::string_view path);

/// The merged photo database: one SQLite file with the folders and photo files of all volumes.
/// Made on the stack for one piece of work: construct, Init, operate, destroy. One thread.
///
/// Failures of the database layer pass through as std::string. The operations on single rows open
/// no transaction. The volume of an operation is the mount point of the volume that the row came
/// from.
class PhotoDB : public db::DB {
public:
  /// A location that cannot hold the database.
  class Error {
  public:
    explicit Error(std::string message) : message_(std::move(message)) {}
    const std::string& Message() const noexcept { return message_; }

  private:
    std::string message_;
  };

  /// Makes sure that the directory for the database exists at `location`; opens nothing. Throws
  /// Error when something else is in its place, and util::Exception when a new one cannot be made
  /// accessible to everybody.
  explicit PhotoDB(const std::string& location);

  /// Opens the database; creates it when there is none, else loads `status` from it.
  void Init();

  /// Create the schema, with the status row and the root folder, in the open database. Called by
  /// Init.
  void CreateTables();
  void CreateIndices();

  /// Replaces the database file with an empty one without a schema, and opens that.
  void Clear();

  /// Kept for compatibility of the interface; does nothing.
  void DumpTable(const std::string& table) const;

  /// Whether the tables of folders and files are those that CreateTables makes, with their indexes
  /// and positive new ids. A database that was found on a volume may have others.
  bool HasOwnSchema() const;

  // Folders and files.

  /// The folder with this id, or null.
  std::unique_ptr<Folder> GetFolder(long long folderId) const;
  /// The folder with this full path on this volume, or null.
  std::unique_ptr<Folder> GetFolder(const std::string& name, const std::string& volume) const;

  /// The id of the first folder with this full path, under any volume.
  std::optional<long long> FindFolder(std::string_view path) const;
  /// The id of the first folder with this full path on this volume.
  std::optional<long long> FindFolder(std::string_view path, std::string_view volume) const;

  /// Adds a catalog's folder below its parent, unless its path is there already, under any
  /// volume. If the parent is missing, the folder is silently skipped, so add parents first.
  void AddFolder(std::string volume, db::Folder& folder) const;

  /// Removes every folder but the root, every file and all statistics, in one transaction, and then
  /// compacts the file: when only that fails, the rows are removed. In a transaction of the caller
  /// it takes part in that and does not compact.
  void DeleteVolumes() const;

  /// Removes the folders and files of `volume`; its statistics stay, but its next merge starts
  /// from the beginning. In one transaction, or in that of the caller.
  void DeleteVolume(const std::string& volume) const;

  /// The file with this id, or null.
  std::unique_ptr<File> GetFile(long long fileId) const;

  /// Adds a catalog's file to its folder, unless it is there already. If its folder is missing on
  /// this volume, the file is silently skipped.
  void AddFile(const std::string& volume, db::File& file) const;

  /// Removes one folder and its own files, but not its subfolders.
  void DeleteFolder(const std::string& volume, db::Folder& folder) const;

  /// Removes one file, found by its folder's path and its name; `volume` is ignored.
  void DeleteFile(const std::string& volume, db::File& file) const;

  /// Appends the files of a folder to `files`; the caller owns them.
  void GetFolderFiles(long long folderId, std::vector<File*>& files) const;

  /// Appends the subfolders of a folder on `volume` to `folders`; the caller owns them.
  void GetFolderFolders(long long parentId, const std::string& volume,
                        std::vector<Folder*>& folders) const;

  // Status and statistics.

  /// The statistics of `volume`, or null; its counts as 32-bit integers.
  std::unique_ptr<Statistics> GetStatistics(std::string volume) const;

  /// Adds a row of zeros for `volume`, without looking for one. A failure is logged.
  void InsertStatistics(const std::string& volume);

  /// Writes the row of `stats.volume`. A failure is logged.
  void UpdateStatistics(const Statistics& stats);

  using DB::UpdateStatus;
  /// Writes `status` to the status row.
  void UpdateStatus() const;

private:
  std::string FilePath() const;
  void LoadStatus();
  std::string dbLocation; ///< the directory of the database file

public:
  /// The status row in memory; UpdateStatus writes it. DeleteVolumes does not set `mdate`: its
  /// caller does.
  Status status;
};

} // namespace orva::dbmerger

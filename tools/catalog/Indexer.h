#pragma once

#include "Classification.h"

#include <ctime>
#include <functional>
#include <string>
#include <unordered_map>
#include <vector>

namespace orva::db {
class DB;
} // namespace orva::db

namespace orva::catalog {

/// What a run found and changed.
struct IndexSummary {
  long long folders = 0; ///< on the volume
  long long files = 0;   ///< on the volume
  long long photos = 0;  ///< of the files

  // Numbers of files that this run changed.
  long long added = 0;
  long long changed = 0;
  long long deleted = 0;
  long long revived = 0;

  /// A message for each folder or file that could not be read. Its rows and those of what is below
  /// it are unchanged, because it may still exist.
  std::vector<std::string> unreadable;
};

/// Brings the catalog of a volume up to date with the files on it. An object makes one run, on the
/// catalog's thread. Links are not followed; file systems mounted below the volume are.
class Indexer {
public:
  /// Called after each folder with the counts so far.
  using Progress = std::function<void(const IndexSummary&)>;

  /// `catalog` is open for writing, has its schema and outlives the indexer. `mountPoint` is the
  /// volume that it describes; `now` is the time of the run.
  Indexer(const db::DB& catalog, std::string mountPoint, std::time_t now, Progress progress = {});

  /// Walks the volume and writes every change in one transaction. Memory grows with the rows of
  /// the catalog. Throws std::string (database) or util::Exception (the volume cannot be read).
  IndexSummary Run();

private:
  /// What the catalog says about a path, and whether the run has seen it.
  struct KnownFolder {
    long long id = 0;
    std::time_t lastModifiedDate = 0;
    bool isDeleted = false;
    bool seen = false;
  };
  struct KnownFile {
    long long id = 0;
    std::time_t lastModifiedDate = 0;
    long long size = 0;
    bool isDeleted = false;
    bool seen = false;
  };
  /// A file or folder found in a folder.
  struct Entry {
    std::string name;
    bool isFolder = false;
    std::time_t lastModifiedDate = 0;
    long long size = 0;
  };
  /// A folder that is being walked. The root of the volume has no row and an empty path.
  struct Place {
    long long id = -1;
    std::string path;
    Flags flags{};
    bool revived = false;
  };

  void LoadRows();
  void Visit(const Place& place);
  std::vector<Entry> List(const Place& place);
  void Examine(const std::string& path, const std::string& name, std::vector<Entry>& entries);
  Place UpdateFolder(const Place& parent, const Entry& entry);
  void UpdateFile(const Place& folder, const Entry& entry);
  void DeleteVanished();
  void LeaveAlone(const std::string& path, const std::string& reason);
  bool IsLeftAlone(const std::string& path) const;

  const db::DB& catalog_;
  const std::string mountPoint_;
  const std::time_t now_;
  const Progress progress_;
  std::time_t stamp_ = 0;
  std::unordered_map<std::string, KnownFolder> folders_; ///< by path
  std::unordered_map<std::string, KnownFile> files_;     ///< by path
  long long nextFolderId_ = 1;
  long long nextFileId_ = 1;
  std::vector<std::string> leftAlone_; ///< paths, without a trailing separator
  IndexSummary summary_;
};

} // namespace orva::catalog

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

/// What a run found and did.
struct IndexSummary {
  long long folders = 0; ///< on the volume
  long long files = 0;   ///< on the volume
  long long photos = 0;  ///< of the files

  // Of the files, by this run.
  long long added = 0;
  long long changed = 0;
  long long deleted = 0;
  long long revived = 0;

  /// A message for each folder or file that could not be read. What the catalog says about it and
  /// what is below it was left alone: it is not known to be gone.
  std::vector<std::string> unreadable;
};

/// Brings the catalog of a volume up to date with what is on it: one object, one run, on the
/// catalog's thread. Links are not followed; other file systems mounted below are.
class Indexer {
public:
  /// Told of the counts so far, folder by folder.
  using Progress = std::function<void(const IndexSummary&)>;

  /// `catalog` is open for writing, has its schema, and outlives the indexer; `mountPoint` is the
  /// volume that it describes; `now` is the time of the run.
  Indexer(const db::DB& catalog, std::string mountPoint, std::time_t now, Progress progress = {});

  /// Walks the volume and writes every change in one transaction. Memory grows with the rows of
  /// the catalog. Throws std::string (database) or util::Exception (the volume cannot be read).
  IndexSummary Run();

private:
  /// What the catalog knew of a path, and what the run has found out.
  struct KnownFolder {
    long long id;
    std::time_t lastModifiedDate;
    bool isDeleted;
    bool seen;
  };
  struct KnownFile {
    long long id;
    std::time_t lastModifiedDate;
    long long size;
    bool isDeleted;
    bool seen;
  };
  /// A name in a folder.
  struct Entry {
    std::string name;
    bool isFolder;
    std::time_t lastModifiedDate;
    long long size;
  };
  /// A folder that is being walked; the volume itself has no row and an empty path.
  struct Place {
    long long id = -1;
    std::string path;
    Flags flags;
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

#pragma once

#include "Disk.h"

#include <map>
#include <string>
#include <vector>

namespace orva::test {

/// The content of a merged database without ids and without the status row, and a simple model of
/// the daemon's changes to it.
class Content {
public:
  /// The content of a new database.
  Content();

  /// The content of the database at `location`; that of a new one when there is none.
  static Content At(const std::string& location);

  /// Applies the changes of the disk's catalog since the last merge.
  void Merge(const Disk& disk);

  /// Removes the volume's rows, but not its counts.
  void RemoveVolume(const std::string& mountPoint);

  /// The content as sorted lines of text; only for the volumes `of`, unless that is empty.
  std::vector<std::string> Lines(const std::vector<std::string>& of = {}) const;

  bool operator==(const Content&) const = default;

private:
  struct Folder {
    std::string parent; ///< its path; NOTHING when that row has been removed
    std::string modified;
    std::string volume;
    bool operator==(const Folder&) const = default;
  };
  struct File {
    std::string modified;
    std::string created;
    std::string volume;
    bool operator==(const File&) const = default;
  };
  struct Statistics {
    std::string transcoded;
    std::string total;
    long updated = 0;
    bool operator==(const Statistics&) const = default;
  };

  void ApplyFolders(const Disk& disk);
  void AddFolder(const std::string& path, const std::string& modified, const std::string& volume);
  void DeleteFolder(const std::string& path, const std::string& volume);
  long ApplyFiles(const Disk& disk, long since);

  std::map<std::string, Folder> folders_; ///< by path
  std::map<std::string, File> files_;     ///< by path
  std::map<std::string, Statistics> statistics_;
};

} // namespace orva::test

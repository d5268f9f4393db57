#pragma once

#include "Disk.h"

#include <map>
#include <string>
#include <vector>

namespace orva::test {

/// What a merged database holds, without ids and without the status row; and what the daemon's work
/// makes of it, put as plainly as it can be.
class Content {
public:
  /// A new database.
  Content();

  /// The database at `location`; a new one's content when there is none.
  static Content At(const std::string& location);

  /// Applies the disk's catalog: what has changed since the last time, or, for a merger that was
  /// told to stop, the counts alone.
  void Merge(const Disk& disk, bool stopped);

  /// Takes the volume's rows and leaves its counts.
  void RemoveVolume(const std::string& mountPoint);

  /// The content as text, line by line, in order; of some volumes only when `of` names any.
  std::vector<std::string> Lines(const std::vector<std::string>& of = {}) const;

  bool operator==(const Content&) const = default;

private:
  struct Folder {
    std::string parent; ///< its path; NOTHING when the row has gone
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

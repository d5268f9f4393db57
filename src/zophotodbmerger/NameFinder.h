#pragma once

#include "orvadb/Statement.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace orva::dbmerger {

class PhotoDB;

/// A file of the merged database.
struct FoundFile {
  std::uint32_t name = 0; ///< which of the names
  bool isOwn = false;     ///< on the volume that is merged
  long long id = 0;
  long long folderId = 0;
};

/// Finds files of the merged database by their names, folder by folder. For a database with the own
/// schema. Throws std::string.
class NameFinder {
public:
  /// For files of `volume`, which must outlive the object.
  NameFinder(const PhotoDB& photos, const std::string& volume)
      : photos_(photos), volume_(volume), files_(photos) {}

  /// The files with one of `names` in the folders with these ids. Two searches take turns, row by
  /// row: one through the folders and one through the files of each name, whatever their folder.
  /// The first to finish has the answer, so the cost is at most twice that of the better one.
  /// `names` are sorted and different. Cheapest if the ids ascend from call to call.
  std::vector<FoundFile> Find(std::span<const std::string_view> names,
                              std::span<const long long> folderIds);

private:
  class FolderSearch;
  class NameSearch;

  /// Goes along the index of the files by their folders' ids, and searches it only where the next
  /// file is not in the folder.
  class FilesByFolder {
  public:
    explicit FilesByFolder(const PhotoDB& photos) : photos_(photos) {}

    // Both return whether there is such a file.

    /// Moves to the first file of the folder.
    bool First(long long folderId);
    /// Moves to the next file of the folder.
    bool Next();

    /// The current file: its id, name and volume are the columns 1 to 3.
    const db::Statement& Row() const { return *query_; }

  private:
    bool IsBefore(long long folderId) const;
    bool IsInFolder() const;
    void Search(long long folderId);
    void Advance();

    const PhotoDB& photos_;
    std::optional<db::Statement> query_; ///< at a file, unless it is at the end
    bool isAtEnd_ = false;
    bool isId_ = false;      ///< whether the file's folder is an integer
    long long position_ = 0; ///< that integer
    long long folderId_ = 0; ///< the last one given to First
  };

  const PhotoDB& photos_;
  const std::string& volume_;
  FilesByFolder files_;
};

} // namespace orva::dbmerger

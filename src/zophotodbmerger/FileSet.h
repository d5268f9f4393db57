#pragma once

#include "LargeBlocks.h"
#include "MergeList.h"

#include <atomic>
#include <cstdint>
#include <ctime>
#include <limits>
#include <memory_resource>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace orva::dbmerger {

class FolderFinder;
class NameFinder;
class PhotoDB;
class StandardOutput;

/// Applies a list of files to the merged database: each run of additions or removals in the list is
/// one set. Rows, ids and lines are those of PhotoDB::AddFile and PhotoDB::DeleteFile in the order
/// of the list. For a database with the own schema; lives in one transaction. Throws std::string.
///
/// First finds, folder by folder, which of the names are there. Then goes through the list, knowing
/// what each row changes.
class FileSet {
public:
  FileSet(const PhotoDB& photos, const std::string& volume, const std::atomic<bool>& stopRequested);

  FileSet(const FileSet&) = delete;
  FileSet& operator=(const FileSet&) = delete;
  ~FileSet() = default;

  /// Applies the files, in the order of their paths. Ends early when a stop is requested. Returns
  /// the time of the newest one applied, or `since` if none is newer.
  std::time_t Apply(std::span<const MergeItem> files, std::time_t since);

private:
  using Index = std::uint32_t;
  static constexpr Index NONE = std::numeric_limits<Index>::max();

  /// A folder of the list: the files with its path in front.
  struct Group {
    std::string_view path{};
    long long target = 0;  ///< id of the folder that additions go to, or NO_FOLDER
    long long source = 0;  ///< id of the folder that removals are from, or NO_FOLDER
    Index firstFolder = 0; ///< index in folderIds_ of the ids of all folders at the path
    Index folderCount = 0;
    Index begin = 0; ///< index in byGroup_
    Index end = 0;
  };

  /// A file of the list.
  struct Entry {
    Index group = NONE; ///< none for a file that changes nothing
    Index name = NONE;  ///< the first file of the group with its name, which has the following
    Index found = NONE; ///< the first of the files with that name, in found_
    Index ownCount = 0; ///< how many of them are on the volume
    bool isSourceFound = false; ///< the path of a removal has a folder
    bool isAdded = false;       ///< by this list
    bool isSourceTaken = false; ///< no file that was found is left in the source
  };

  /// A file of the merged database with the name of an entry.
  struct Found {
    long long id = 0;
    long long folderId = 0;
    bool isOwn = false;
    Index next = NONE;
  };
  class AdditionRows;

  void MakeGroups();
  void FindFolders();
  void FindFoldersOf(Group& group, FolderFinder& finder);
  Index GroupWithoutFolder();
  void SortByGroup();
  void NameFiles(const Group& group);
  void FindFiles(const Group& group, NameFinder& finder);

  void WriteLines(Index file) const;
  void Add(Index file);
  void Remove(Index file);
  void TakeFound(Entry& name, long long folderId);
  void TakeFromNoFolder(std::string_view name);
  void Flush();
  void DeleteFiles();

  const PhotoDB& photos_;
  const std::string& volume_;
  const std::atomic<bool>& stopRequested_;
  StandardOutput& output_;

  std::span<const MergeItem> files_;
  std::pmr::vector<Entry> entries_{LargeBlocks()}; ///< one for each file
  std::vector<Group> groups_;
  std::vector<long long> folderIds_;
  std::pmr::vector<Index> byGroup_{LargeBlocks()}; ///< the files, group by group, in each by name
  std::pmr::vector<Found> found_{LargeBlocks()};

  /// Removals without a folder: as from a folder with an id that stands for it.
  Index groupWithoutFolder_ = NONE;
  /// The group whose path has a folder with that id, too.
  Index groupOfNoFolder_ = NONE;

  std::pmr::vector<Index> additions_{LargeBlocks()}; ///< the current set, if it is one of additions
  std::pmr::vector<long long> removals_{
      LargeBlocks()}; ///< the current set, if it is one of removals
  std::pmr::vector<long long> addedIds_{
      LargeBlocks()};                  ///< of each entry; empty if the list has no removals
  std::vector<long long> idsToRemove_; ///< ids of the files that an entry removes
};

} // namespace orva::dbmerger

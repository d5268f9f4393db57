#pragma once

#include "FolderFinder.h"
#include "MergeList.h"

#include <atomic>
#include <cstddef>
#include <limits>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

namespace orva::dbmerger {

class PhotoDB;
class StandardOutput;

/// Applies a list of folders to the merged database: each run of additions or removals in the list
/// is one set. Rows, ids and lines are those of PhotoDB::AddFolder and PhotoDB::DeleteFolder in the
/// order of the list. For a database with the own schema; lives in one transaction. Throws
/// std::string.
class FolderSet {
public:
  FolderSet(const PhotoDB& photos, const std::string& volume,
            const std::atomic<bool>& stopRequested);

  FolderSet(const FolderSet&) = delete;
  FolderSet& operator=(const FolderSet&) = delete;
  ~FolderSet() = default;

  /// Applies the folders, in the order of their paths. Ends early when a stop is requested.
  void Apply(std::span<const MergeItem> folders);

private:
  static constexpr std::size_t NONE = std::numeric_limits<std::size_t>::max();

  /// A folder to be added. Its parent may be an addition of the same set.
  struct Addition {
    const MergeItem* folder = nullptr;
    long long parentId = 0;
    std::size_t parent = NONE; ///< index of the parent's addition
    long long id = 0;          ///< once it has been added
  };
  class AdditionRows;

  /// A folder of the list that may hold the next one.
  struct Ancestor {
    std::string_view path;
    std::optional<long long> id;
    std::size_t addition = NONE; ///< index of its addition, as long as it has no id
  };

  /// The folders at one path that are left, in the order in which statements find them.
  class Candidates {
  public:
    void Reset(std::span<const long long> ids) {
      ids_.assign(ids.begin(), ids.end());
      next_ = 0;
    }
    std::optional<long long> FirstLeft(const std::unordered_set<long long>& removed);

  private:
    std::vector<long long> ids_;
    std::size_t next_ = 0;
  };

  void ApplyPath(std::span<const MergeItem> folders);
  void Add(const MergeItem& folder);
  void Remove(const MergeItem& folder);
  Addition MakeAddition(const MergeItem& folder);
  std::optional<long long> FirstAt(std::string_view path);
  void FindOwn(std::string_view path);
  void Flush();
  void ExecuteAdditions();

  const PhotoDB& photos_;
  const std::string& volume_;
  const std::atomic<bool>& stopRequested_;
  StandardOutput& output_;
  FolderFinder finder_;

  std::vector<Ancestor> ancestors_; ///< each path is the beginning of the next one
  std::vector<Addition> additions_; ///< the current set, if it is one of additions
  std::vector<long long> removals_; ///< the current set, if it is one of removals
  /// A folder that was not found was removed by the id NO_FOLDER, which a row may have had.
  bool isNoFolderRemoved_ = false;

  // Of the current path.
  Candidates any_;
  Candidates own_; ///< on the volume; filled for a path with a removal
  std::unordered_set<long long> removed_;
  std::size_t addition_ = NONE; ///< index of the path's addition in the set
};

} // namespace orva::dbmerger

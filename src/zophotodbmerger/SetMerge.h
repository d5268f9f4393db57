#pragma once

#include <atomic>
#include <ctime>
#include <string>

namespace orva::dbmerger {

class MergeList;
class PhotoDB;

/// Applies the lists of one merge to the merged database, folders before files, with few statements
/// for each run of additions or removals. Rows, ids and lines are the same as with the operations
/// of PhotoDB on single rows, in the order of the lists. Lives in one transaction on the database.
/// Throws std::string.
class SetMerge {
public:
  /// For the rows of `volume`. The lists are not applied further once `stopRequested` is set.
  SetMerge(const PhotoDB& photos, const std::string& volume,
           const std::atomic<bool>& stopRequested);

  void ApplyFolders(const MergeList& folders) const;

  /// Returns the time of the newest file applied, or `since` if no file is newer.
  std::time_t ApplyFiles(const MergeList& files, std::time_t since) const;

private:
  void ApplySingleFolders(const MergeList& folders) const;
  std::time_t ApplySingleFiles(const MergeList& files, std::time_t since) const;

  const PhotoDB& photos_;
  const std::string& volume_;
  const std::atomic<bool>& stopRequested_;
  bool inSets_; ///< false for a database whose tables may work in another way
};

} // namespace orva::dbmerger

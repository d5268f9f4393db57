#pragma once

#include "orvautil/FileDescriptor.h"

#include <cstdint>
#include <string>
#include <vector>

namespace orva::web {

/// The directory of the snapshot, locked for this process.
class CacheDirectory {
public:
  /// Creates the directory, for its owner only, if it is missing and its parent exists. Throws
  /// std::runtime_error if the directory belongs to another user, if other users may use it, or if
  /// another process has locked it.
  explicit CacheDirectory(const std::string& path);

  /// The path of the snapshot's file with this number.
  std::string File(std::uint64_t number) const;

  /// The numbers of the snapshots' files that exist, ascending.
  std::vector<std::uint64_t> Numbers() const;

  /// The first number after `after` that no name in the directory has.
  std::uint64_t FreeNumber(std::uint64_t after) const;

  /// Removes the regular files that have the names of snapshots' files, apart from those with the
  /// number `kept`. Everything else stays.
  void RemoveOthers(std::uint64_t kept) const;

private:
  std::string path_; ///< without links
  util::FileDescriptor lock_;
};

} // namespace orva::web

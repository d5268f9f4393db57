#pragma once

#include "orvautil/FileDescriptor.h"

#include <cstdint>
#include <string>
#include <vector>

namespace orva::web {

/// The directory of the snapshot, locked for this process.
class CacheDirectory {
public:
  /// Creates the directory if its parent exists. Only its owner may use it afterwards. Throws
  /// std::runtime_error if it belongs to another user, or if another process has locked it.
  explicit CacheDirectory(const std::string& path);

  /// The path of the snapshot's file with this number.
  std::string File(std::uint64_t number) const;

  /// The numbers of the snapshots' files that exist, ascending.
  std::vector<std::uint64_t> Numbers() const;

  /// Removes everything that has the name of a snapshot's file, apart from that with the number
  /// `kept`. Other names stay.
  void RemoveOthers(std::uint64_t kept) const;

private:
  std::string path_; ///< without links
  util::FileDescriptor lock_;
};

} // namespace orva::web

#pragma once

#include <cstdint>
#include <ctime>
#include <string>

namespace orva::dbmerger {

/// One mounted volume, as it was when its record was made.
struct VolumeInfo {
  std::string mountPoint = "DUMMY_MOUNT_POINT"; ///< as it was notified, with a trailing "/"
  double capacity = 1.0;                        ///< size of the file system in bytes
  double used = 1.0;                            ///< used bytes
  std::int64_t photoDbSize = 0;                 ///< size of the volume's photo database
  std::time_t timestamp = std::time(nullptr);   ///< when the record was made
  bool readOnly = false; ///< set by no notification: read-only volumes can be elected

  /// The record as text for the log, over several lines.
  std::string ToString() const;

  /// Volumes are equal when their mount points are, byte for byte.
  friend bool operator==(const VolumeInfo& a, const VolumeInfo& b) {
    return a.mountPoint == b.mountPoint;
  }
};

/// The order of an election: larger capacities first.
template <typename Volume>
struct VolumeInfoComp {
  bool operator()(const Volume& a, const Volume& b) const { return a.capacity > b.capacity; }
};

} // namespace orva::dbmerger

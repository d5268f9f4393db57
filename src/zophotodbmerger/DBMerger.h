#pragma once

#include "orvautil/Thread.h"

#include <atomic>
#include <latch>
#include <mutex>
#include <string>

namespace orva::dbmerger {

/// Applies volumes' catalogs to the merged database on the master volume. All merges run on the
/// caller's thread, each with connections of its own; the merger's own thread only logs the
/// registered volumes. The owner sets `stopRequested` and waits before destroying it.
class DBMerger final : public util::Thread {
public:
  /// Starts the thread, and returns when the thread has copied the registry. Throws what Create
  /// throws.
  DBMerger();

  /// Logs the mount points that are registered when the merger is made.
  void Run() override;

  // These throw what PhotoDB throws.

  /// Merges what has changed in the volume's catalog since its last merge, in one transaction. A
  /// failure of the database layer is logged and leaves the merged database as it was.
  void MergeDB(const std::string& masterMountPoint, const std::string& volumeMountPoint);

  /// Removes the volume's rows and merges its whole catalog.
  void ReMergeDB(const std::string& masterMountPoint, const std::string& volumeMountPoint);

  /// Removes the volume's rows.
  void RemoveVolume(const std::string& masterMountPoint, const std::string& volumeMountPoint);

  /// Makes Run and MergeDB end early from now on; set by any thread. A merge that ends early still
  /// commits: files that it has not reached may be missing until a ReMergeDB.
  std::atomic<bool> stopRequested{false};

private:
  std::mutex mergeMutex; ///< held for the whole of MergeDB
  std::latch registryCopied_{1};
};

} // namespace orva::dbmerger

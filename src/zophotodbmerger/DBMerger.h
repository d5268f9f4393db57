#pragma once

#include "orvautil/Thread.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <string>

namespace orva::dbmerger {

/// Applies volumes' catalogs to the merged database on the master volume. All merges run on the
/// caller's thread, each with connections of its own; the merger's own thread only logs the
/// registered volumes. The owner sets `stopRequested` and waits before destroying it. Without that
/// the thread continues to its end, but does not use the merger.
class DBMerger final : public util::Thread {
  /// What Run uses; also owned by the thread.
  struct RunState {
    std::atomic<bool> stopRequested{false};
    std::atomic<bool> registryCopied{false};
  };
  const std::shared_ptr<RunState> runState_ = std::make_shared<RunState>();

public:
  /// Starts the thread, and returns when the thread has copied the registry. Throws what Create
  /// throws.
  DBMerger();

  /// Logs the mount points that are registered when it is called. The thread calls it once; other
  /// calls are harmless.
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
  std::atomic<bool>& stopRequested = runState_->stopRequested;

private:
  std::mutex mergeMutex; ///< held for the whole of MergeDB
};

} // namespace orva::dbmerger

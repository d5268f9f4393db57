#pragma once

#include "Batch.h"
#include "Volume.h"

#include "notifications/Observer.h"
#include "orvautil/FileDescriptor.h"
#include "service/StatusFile.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <semaphore>
#include <string>
#include <thread>
#include <vector>

namespace orva::transcoder {

/// The service: renders the photos that wait on all volumes. One thread does everything with the
/// volumes; one thread for each batch waits for the programs that render it. There is one batch
/// more than processors, so that photos are copied while others are rendered. Others need no free
/// processor: one of a volume that has no other batch, and those of slow photos. Batches that are
/// rendered may wait until they are stored.
class Transcoder {
public:
  using Clock = std::chrono::steady_clock;

  /// With its working folders in `directory`, which exists. Throws util::Exception.
  explicit Transcoder(const std::string& directory);
  Transcoder(const Transcoder&) = delete;
  Transcoder& operator=(const Transcoder&) = delete;
  /// Waits for the batches.
  ~Transcoder() = default;

  /// Does not return.
  [[noreturn]] void Run();

private:
  /// A volume, and what has to be announced about it.
  struct Known {
    Volume volume;
    std::string name;              ///< the mount point as it is announced
    bool isScanned = false;        ///< the indexer has walked through it: it may be announced
    bool isEndDue = true;          ///< the end has not been announced since the last change
    std::size_t changes = 0;       ///< that were not announced
    Clock::time_point changedAt{}; ///< the first of them
  };
  /// A batch that is rendered or waits to be stored.
  struct Running {
    std::unique_ptr<Batch> batch;
    bool isAdditional = false; ///< of a volume without other batches
    std::jthread thread{};
    bool isRendered = false; ///< guarded by mutex_ until the thread has ended
  };

  void Receive();
  void Handle(const notifications::Notification& notification);
  void StoreRendered();
  void StoreRendered(Known& known);
  static void AddChanges(Known& known, std::size_t changes);
  bool IsUseless(const Batch& batch);
  void LookAgain();
  void StageNext();
  bool Stage(Known& known);
  bool StageSlow(Known& known);
  bool Stage(Known& known, const BatchLimits& limits, bool isAdditional);
  void CleanNext();
  bool Clean(Known& known);
  void Announce();
  void Announce(Known& known);
  bool Send(const std::string& message);
  void UpdateStatus();
  void Wait();
  void WakeAt(Clock::time_point time);

  void Start(std::unique_ptr<Batch> batch, bool isAdditional);
  bool IsRendered(const Running& running);
  std::size_t Unrendered();
  bool HasRoom();
  bool HasFreeProcessor();
  bool MayAdd(const std::string& mountPoint);
  bool MayAddSlow();
  bool IsRendering(const std::string& mountPoint) const;
  Volume::IsInBatch InBatchOf(const std::string& mountPoint) const;
  long long FreeSpace() const;
  BatchLimits LimitsOfNext(const Volume& volume) const;

  const std::string staging_;
  const std::size_t processors_;
  util::FileDescriptor wake_; ///< an eventfd: a batch was rendered
  notifications::Observer observer_;
  service::StatusFile status_;
  std::map<std::string, Known> volumes_; ///< by mount point
  std::string lastStaged_;               ///< mount point
  std::string lastStagedSlow_;           ///< the same for slow photos
  std::string lastCleaned_;              ///< mount point
  unsigned long long batches_ = 0;       ///< so far
  bool isConnected_ = false;
  std::string error_;                            ///< of the last batch with one
  std::optional<Clock::time_point> pausedUntil_; ///< after such an error
  std::optional<Clock::time_point> sendAgainAt_; ///< after the service could not be reached
  std::optional<Clock::time_point> wakeAt_;
  bool hasMoreWork_ = false; ///< that needs no event
  std::mutex mutex_;
  std::counting_semaphore<> processor_;
  std::vector<std::unique_ptr<Running>> running_; ///< destroyed first: the threads use the others
};

} // namespace orva::transcoder

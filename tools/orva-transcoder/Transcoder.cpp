#include "Transcoder.h"

#include "Renderer.h"

#include "orva-notify/Control.h"
#include "orva-notify/MountInfo.h"
#include "orva-notify/Notification.h"
#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "service/Log.h"
#include "service/Turns.h"

#include <nlohmann/json.hpp>

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <exception>
#include <iterator>
#include <ranges>
#include <system_error>
#include <utility>

namespace orva::transcoder {
namespace {

using notifications::Notification;

constexpr long long MOST_STAGED = LARGEST_PHOTO + (64LL << 20); // bytes of all batches
constexpr long long MOST_BYTES = 128LL << 20;                   // of several photos in a batch
// Photos in a batch. The programs of each batch take about as long to start as two photos to
// render.
constexpr std::size_t MOST_PHOTOS = 50;
constexpr std::size_t FEWEST_PHOTOS = 10;
constexpr std::size_t BATCHES_PER_PROCESSOR = 4; // including those that are rendered
constexpr std::size_t ANNOUNCED_CHANGES = 500;
constexpr std::chrono::seconds ANNOUNCE_INTERVAL(2);
constexpr std::chrono::seconds SEND_AGAIN(5);
constexpr std::chrono::seconds ERROR_PAUSE(60);

} // namespace

Transcoder::Transcoder(const std::string& directory)
    : staging_(directory + "/staging"),
      processors_(std::max(std::thread::hardware_concurrency(), 1U)),
      wake_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)), observer_(core::ORVA_NOTIFICATION_SOCKET),
      status_(directory), processor_(static_cast<std::ptrdiff_t>(processors_)) {
  if (!wake_) {
    throw util::Exception("no eventfd: " + std::generic_category().message(errno));
  }
  PrepareStaging(staging_);
}

void Transcoder::Run() {
  for (;;) {
    wakeAt_.reset();
    hasMoreWork_ = false;
    Receive();
    StoreRendered();
    LookAgain();
    StageNext();
    CleanNext();
    Announce();
    UpdateStatus();
    Wait();
  }
}

void Transcoder::Receive() {
  for (const Notification& notification : observer_.Receive()) {
    Handle(notification);
  }
}

void Transcoder::Handle(const Notification& notification) {
  using Event = Notification::Event;
  const std::string& mountPoint = notification.mountPoint;
  switch (notification.event) {
  case Event::Connected:
    // The service now names all volumes that are there.
    volumes_.clear();
    sendAgainAt_.reset();
    return;
  case Event::Plugged:
    if (notify::ContainsShares(mountPoint)) {
      service::LogError(service::Printable(mountPoint) +
                        ": not rendered: the volumes are below it");
    } else if (!volumes_.contains(mountPoint)) {
      using Kind = catalog::VolumeRoot::Kind;
      volumes_.emplace(
          mountPoint,
          Known{.volume =
                    Volume(mountPoint, notification.isDirectory ? Kind::Directory : Kind::Mount),
                .name = mountPoint.substr(0, std::max<std::size_t>(mountPoint.size() - 1, 1))});
    }
    break;
  case Event::Unplugged:
    volumes_.erase(mountPoint);
    return;
  case Event::Scanned:
  case Event::TranscodedBatch:
  case Event::End:
  case Event::Purged:
    break;
  }
  const auto known = volumes_.find(mountPoint);
  if (known != volumes_.end()) {
    known->second.isScanned = known->second.isScanned || notification.event != Event::Plugged;
    known->second.volume.Look();
  }
}

void Transcoder::StoreRendered() {
  eventfd_t count = 0;
  eventfd_read(wake_.Get(), &count);
  std::erase_if(running_, [this](const auto& running) {
    return IsRendered(*running) && IsUseless(*running->batch);
  });
  for (auto& [mountPoint, known] : volumes_) {
    StoreRendered(known);
  }
}

/// Whether nothing was rendered, or the volume is gone.
bool Transcoder::IsUseless(const Batch& batch) {
  if (batch.error.empty()) {
    return !volumes_.contains(batch.mountPoint);
  }
  if (batch.error != error_) {
    error_ = batch.error;
    service::LogError(service::Printable(error_));
  }
  pausedUntil_ = Clock::now() + ERROR_PAUSE;
  return true;
}

/// Stores all batches of the volume that are rendered, if it is time.
void Transcoder::StoreRendered(Known& known) {
  Volume& volume = known.volume;
  const auto rendered =
      std::stable_partition(running_.begin(), running_.end(), [&](const auto& running) {
        return running->batch->mountPoint != volume.MountPoint() || !IsRendered(*running);
      });
  if (rendered == running_.end()) {
    return;
  }
  if (Clock::now() < volume.StoreAt()) {
    WakeAt(volume.StoreAt());
    return;
  }
  error_.clear();
  std::vector<Batch*> batches;
  std::transform(rendered, running_.end(), std::back_inserter(batches),
                 [](const auto& running) { return running->batch.get(); });
  if (volume.Store(batches) == Volume::Stored::Later) {
    WakeAt(volume.StoreAt());
    return;
  }
  running_.erase(rendered, running_.end());
  const std::size_t changes = volume.TakeChanges();
  if (changes == 0) {
    return;
  }
  for (auto& [mountPoint, other] : volumes_) {
    // A disk that is mounted twice is two volumes with one catalog.
    const std::string& identity = other.volume.Identity();
    if (&other == &known || (!identity.empty() && identity == volume.Identity())) {
      AddChanges(other, changes);
    }
  }
}

void Transcoder::AddChanges(Known& known, std::size_t changes) {
  if (known.changes == 0) {
    known.changedAt = Clock::now();
  }
  known.changes += changes;
  known.isEndDue = true;
}

void Transcoder::LookAgain() {
  if (pausedUntil_ && Clock::now() >= *pausedUntil_) {
    pausedUntil_.reset();
    for (auto& [mountPoint, known] : volumes_) {
      known.volume.Look(); // for the photos of the batches that were lost
    }
  }
  if (pausedUntil_) {
    WakeAt(*pausedUntil_);
  }
  for (auto& [mountPoint, known] : volumes_) {
    if (known.volume.LookAgainAt() && Clock::now() >= *known.volume.LookAgainAt()) {
      known.volume.LookAgain();
    }
    if (known.volume.LookAgainAt()) {
      WakeAt(*known.volume.LookAgainAt());
    }
  }
}

/// Stages batches, from one volume after the other.
void Transcoder::StageNext() {
  if (pausedUntil_) {
    return;
  }
  const auto stageAll = [this](std::string& last, bool (Transcoder::*stage)(Known&)) {
    const auto isStaged = [&](auto& entry) { return (this->*stage)(entry.second); };
    for (auto staged = service::NextInTurn(volumes_, last, isStaged); staged != volumes_.end();
         staged = service::NextInTurn(volumes_, last, isStaged)) {
      last = staged->first;
    }
  };
  stageAll(lastStaged_, &Transcoder::Stage);
  stageAll(lastStagedSlow_, &Transcoder::StageSlow);
}

bool Transcoder::Stage(Known& known) {
  const std::string& mountPoint = known.volume.MountPoint();
  if (!known.volume.HasWork()) {
    return false;
  }
  const bool isAdditional = !(HasRoom() && HasFreeProcessor()) && MayAdd(mountPoint);
  return (isAdditional || HasRoom()) && Stage(known, LimitsOfNext(known.volume), isAdditional);
}

/// Stages a slow photo.
bool Transcoder::StageSlow(Known& known) {
  if (!known.volume.HasSlow() || !MayAddSlow()) {
    return false;
  }
  BatchLimits limits = LimitsOfNext(known.volume);
  limits.photos = 1;
  limits.isSlow = true;
  return Stage(known, limits, false);
}

bool Transcoder::Stage(Known& known, const BatchLimits& limits, bool isAdditional) {
  Volume& volume = known.volume;
  auto batch = volume.Stage(staging_ + '/' + std::to_string(++batches_), limits,
                            InBatchOf(volume.MountPoint()));
  if (!batch) {
    hasMoreWork_ = hasMoreWork_ || ((limits.isSlow ? volume.HasSlow() : volume.HasWork()) &&
                                    (running_.empty() || !volume.NeedsSpace()));
    return false;
  }
  Start(std::move(batch), isAdditional);
  return true;
}

void Transcoder::Start(std::unique_ptr<Batch> batch, bool isAdditional) {
  running_.push_back(
      std::make_unique<Running>(Running{.batch = std::move(batch), .isAdditional = isAdditional}));
  Running& running = *running_.back();
  running.thread = std::jthread([this, &running] {
    const bool needsProcessor = !running.isAdditional && !running.batch->isSlow;
    if (needsProcessor) {
      processor_.acquire();
    }
    Render(*running.batch);
    if (needsProcessor) {
      processor_.release();
    }
    {
      const std::lock_guard lock(mutex_);
      running.isRendered = true;
    }
    eventfd_write(wake_.Get(), 1);
  });
}

bool Transcoder::IsRendered(const Running& running) {
  const std::lock_guard lock(mutex_);
  return running.isRendered;
}

/// The batches that need a processor, or wait for one.
std::size_t Transcoder::Unrendered() {
  return static_cast<std::size_t>(std::ranges::count_if(running_, [this](const auto& running) {
    return !running->isAdditional && !running->batch->isSlow && !IsRendered(*running);
  }));
}

/// Whether another such batch may be staged. Some batches more may be rendered and not stored yet.
bool Transcoder::HasRoom() {
  return Unrendered() <= processors_ && running_.size() <= BATCHES_PER_PROCESSOR * processors_;
}

bool Transcoder::HasFreeProcessor() {
  return Unrendered() < processors_;
}

/// Whether a batch of this volume may be rendered although no processor is free: other volumes may
/// keep them for a long time.
bool Transcoder::MayAdd(const std::string& mountPoint) {
  return std::ranges::none_of(running_, [&](const auto& running) {
    return (running->isAdditional && !IsRendered(*running)) ||
           (!running->batch->isSlow && running->batch->mountPoint == mountPoint);
  });
}

/// Whether another slow photo may be rendered: one beside other photos, or one per processor.
bool Transcoder::MayAddSlow() {
  const auto slow = std::ranges::count_if(running_, [this](const auto& running) {
    return running->batch->isSlow && !IsRendered(*running);
  });
  const bool isAlone =
      std::ranges::all_of(running_, [](const auto& running) { return running->batch->isSlow; }) &&
      std::ranges::none_of(volumes_,
                           [](const auto& entry) { return entry.second.volume.HasWork(); });
  return static_cast<std::size_t>(slow) < (isAlone ? processors_ : 1) &&
         running_.size() <= BATCHES_PER_PROCESSOR * processors_;
}

bool Transcoder::IsRendering(const std::string& mountPoint) const {
  return std::ranges::any_of(running_, [&mountPoint](const auto& running) {
    return running->batch->mountPoint == mountPoint;
  });
}

Volume::IsInBatch Transcoder::InBatchOf(const std::string& mountPoint) const {
  std::set<long long> ids;
  for (const auto& running : running_) {
    if (running->batch->mountPoint == mountPoint) {
      for (const BatchPhoto& photo : running->batch->photos) {
        ids.insert(photo.photo.id);
      }
    }
  }
  return [ids = std::move(ids)](long long id) { return ids.contains(id); };
}

long long Transcoder::FreeSpace() const {
  long long space = MOST_STAGED;
  for (const auto& running : running_) {
    for (const BatchPhoto& photo : running->batch->photos) {
      space -= photo.status.st_size <= LARGEST_PHOTO ? photo.status.st_size : 0;
    }
  }
  return std::max(space, 0LL);
}

/// A batch takes one processor's share of the photos that wait, and of the memory: so all
/// processors work until the last photo.
BatchLimits Transcoder::LimitsOfNext(const Volume& volume) const {
  std::size_t staged = 0;
  for (const auto& running : running_) {
    staged += running->batch->mountPoint == volume.MountPoint() ? running->batch->photos.size() : 0;
  }
  const std::size_t waiting = volume.Waiting() - std::min(staged, volume.Waiting());
  const auto batches = static_cast<long long>(processors_) + 2; // with an additional one
  const StagingSpace fileSystem = SpaceFor(staging_);
  const long long space = std::min(FreeSpace(), fileSystem.now);
  return {.photos = std::clamp(waiting / processors_, FEWEST_PHOTOS, MOST_PHOTOS),
          .bytes = std::min({space, MOST_BYTES, MOST_STAGED / batches}),
          .space = space,
          .most = fileSystem.most,
          .isOnly = running_.empty()};
}

/// Removes renditions without a photo, one piece at a time, from one volume after the other.
void Transcoder::CleanNext() {
  const auto cleaned = service::NextInTurn(volumes_, lastCleaned_,
                                           [this](auto& entry) { return Clean(entry.second); });
  if (cleaned != volumes_.end()) {
    lastCleaned_ = cleaned->first;
    hasMoreWork_ = true;
  }
}

/// Renditions are compared with the catalog only when there is nothing to stage.
bool Transcoder::Clean(Known& known) {
  Volume& volume = known.volume;
  if (!volume.HasVanished() && !(volume.HasUncheckedRenditions() && HasRoom())) {
    return false;
  }
  if (Clock::now() < volume.PieceAt()) {
    WakeAt(volume.PieceAt());
    return false;
  }
  if (volume.HasVanished()) {
    volume.RemoveVanished();
  } else {
    volume.CheckRenditions(InBatchOf(volume.MountPoint()));
  }
  return true;
}

void Transcoder::Announce() {
  for (auto& [mountPoint, known] : volumes_) {
    Announce(known);
  }
}

void Transcoder::Announce(Known& known) {
  using notify::Event;
  if (!known.isScanned || !known.isEndDue) {
    return;
  }
  if (sendAgainAt_ && Clock::now() < *sendAgainAt_) {
    WakeAt(*sendAgainAt_);
    return;
  }
  const bool isAtEnd = !known.volume.HasWork() && !known.volume.HasSlow() &&
                       !known.volume.HasUncheckedRenditions() &&
                       !IsRendering(known.volume.MountPoint());
  if (isAtEnd) {
    if (Send(notify::Compose(Event::End, known.name))) {
      known.isEndDue = false;
      known.changes = 0;
    }
  } else if (known.changes > 0) {
    const auto due = known.changedAt + ANNOUNCE_INTERVAL;
    if (known.changes < ANNOUNCED_CHANGES && Clock::now() < due) {
      WakeAt(due);
    } else if (Send(notify::Compose(Event::TranscodedBatch, known.name))) {
      known.changes = 0;
    }
  }
}

bool Transcoder::Send(const std::string& message) {
  try {
    notify::Ask(core::ORVA_NOTIFICATION_SOCKET, {.message = message}, std::chrono::seconds(2));
    sendAgainAt_.reset();
    return true;
  } catch (const std::exception&) {
    // When the service is back, it is asked for the state of all volumes, which are then announced.
    sendAgainAt_ = Clock::now() + SEND_AGAIN;
    WakeAt(*sendAgainAt_);
    return false;
  }
}

void Transcoder::UpdateStatus() {
  nlohmann::ordered_json volumes = nlohmann::ordered_json::array();
  bool isBusy = false;
  for (const auto& [mountPoint, known] : volumes_) {
    volumes.push_back({{"mountPoint", mountPoint},
                       {"waiting", known.volume.Waiting()},
                       {"failed", known.volume.Failed()},
                       {"rendering", IsRendering(mountPoint)}});
    isBusy = isBusy || IsRendering(mountPoint);
  }
  if (const auto time = status_.Update(volumes, isBusy)) {
    WakeAt(*time);
  }
}

void Transcoder::WakeAt(Clock::time_point time) {
  wakeAt_ = std::min(wakeAt_.value_or(time), time);
}

void Transcoder::Wait() {
  std::array<pollfd, 2> events{pollfd{observer_.Descriptor(), POLLIN, 0},
                               pollfd{wake_.Get(), POLLIN, 0}};
  int timeout = -1;
  if (hasMoreWork_) {
    timeout = 0;
  } else if (wakeAt_) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*wakeAt_ - Clock::now());
    timeout = static_cast<int>(std::max<long long>(left.count(), 0));
  }
  if (poll(events.data(), events.size(), timeout) == -1 && errno != EINTR) {
    throw util::Exception("cannot wait: " + std::generic_category().message(errno));
  }
}

} // namespace orva::transcoder

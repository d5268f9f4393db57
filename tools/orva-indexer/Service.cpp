#include "Service.h"

#include "orva-notify/Descriptors.h"
#include "orva-notify/MountInfo.h"
#include "orvautil/Exception.h"
#include "orvautil/Path.h"
#include "service/Log.h"
#include "service/Turns.h"

#include <nlohmann/json.hpp>

#include <fcntl.h>
#include <poll.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <set>
#include <system_error>
#include <utility>

namespace orva::indexer {
namespace {

using namespace std::chrono_literals;
using catalog::VolumeRoot;
using notify::Event;
using service::LogError;
using service::LogInfo;
using service::Printable;
using Notice = notifications::Notification::Event;

constexpr auto INPUT_INTERVAL = 100ms;
constexpr auto ANNOUNCE_RETRY = 30s;
constexpr auto MASTER_QUIET = 2s;

/// The notification service sends the plugged volumes as soon as a client has connected.
constexpr auto REPLAY_TIME = 5s;

/// A master at /shares itself is no volume.
constexpr char SHARES[] = "/shares";
constexpr char NO_VOLUME[] = "-";

constexpr char MOUNT_INFO[] = "/proc/self/mountinfo";

util::FileDescriptor OpenMountInfo() {
  return notify::CheckedDescriptor(open(MOUNT_INFO, O_RDONLY | O_CLOEXEC), MOUNT_INFO);
}

std::set<std::string> ReadMountPoints() {
  std::ifstream table(MOUNT_INFO);
  return notify::ReadMountPoints(table);
}

} // namespace

Service::Service(Settings settings)
    : settings_(std::move(settings)), signals_(notify::CatchStopSignals()),
      mountInfo_(OpenMountInfo()), remembered_(settings_.stateDirectory),
      observer_(settings_.notificationSocket),
      announcer_(settings_.notificationSocket,
                 [this](const Announcer::Announcement& announcement,
                        std::optional<std::size_t> clients) { Announced(announcement, clients); }),
      status_(settings_.runtimeDirectory) {
  std::error_code ignored;
  std::filesystem::create_directories(settings_.runtimeDirectory, ignored);
}

void Service::Run() {
  while (!isStopped_) {
    ReadInput();
    HandleNotifications();
    announcer_.Proceed();
    WorkOnNext();
    announcer_.Proceed();
    PublishStatus();
    if (!isStopped_) {
      Wait();
    }
  }
}

// --- Input -------------------------------------------------------------------------------------

void Service::Wait() {
  const auto now = Clock::now();
  std::vector<pollfd> descriptors;
  const auto add = [&descriptors](int descriptor, short events) {
    descriptors.push_back({.fd = descriptor, .events = events, .revents = 0});
  };
  add(mountInfo_.Get(), POLLPRI);
  add(signals_.Get(), POLLIN);
  add(observer_.Descriptor(), POLLIN);
  add(announcer_.Descriptor(), announcer_.Events());
  add(locator_.Descriptor(), POLLIN);
  auto next = std::min({announceAgain_, checkPurges_, replayEnd_, statusDue_});
  for (const auto& [mountPoint, known] : volumes_) {
    next = std::min(next, known->volume.NextWork());
    add(known->volume.Descriptor(now), POLLIN);
    if (descriptors.back().fd == -1) {
      next = std::min(next, known->volume.NextEvents());
    }
  }
  int timeout = -1;
  if (next != Clock::time_point::max()) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(next - now);
    timeout = next <= now ? 0 : static_cast<int>(std::min<long long>(left.count(), 1'000'000'000));
  }
  if (poll(descriptors.data(), descriptors.size(), timeout) == -1 && errno != EINTR) {
    throw util::Exception("cannot wait for events: " + std::generic_category().message(errno));
  }
  if ((descriptors.front().revents & POLLPRI) != 0) {
    const std::set<std::string> mountPoints = ReadMountPoints();
    for (const auto& [mountPoint, known] : volumes_) {
      known->volume.HandleMounts(mountPoints);
    }
  }
}

/// Reads what has arrived, without acting on it.
void Service::ReadInput() {
  const auto now = Clock::now();
  inputRead_ = now;
  signalfd_siginfo signal{};
  isStopped_ = isStopped_ || read(signals_.Get(), &signal, sizeof signal) > 0;
  for (notifications::Notification& notification : observer_.Receive()) {
    received_.push_back(std::move(notification));
  }
  for (const auto& [mountPoint, known] : volumes_) {
    if (known->volume.Descriptor(now) != -1) {
      known->volume.ReadEvents();
    }
  }
}

/// Called often while a volume is worked on.
void Service::Pulse() {
  if (Clock::now() - inputRead_ < INPUT_INTERVAL) {
    return;
  }
  ReadInput();
  PublishStatus();
  const bool isUnplugged = std::ranges::any_of(received_, [this](const auto& notification) {
    return notification.event == Notice::Unplugged &&
           notification.mountPoint == working_->volume.MountPoint();
  });
  if (isStopped_ || isUnplugged) {
    throw Volume::Interrupted();
  }
}

void Service::HandleNotifications() {
  for (const notifications::Notification& notification : std::exchange(received_, {})) {
    Handle(notification);
  }
  if (locator_.HasChanged()) {
    CheckPurgesSoon();
  }
  if (Clock::now() >= checkPurges_) {
    CheckPurges();
  }
  if (Clock::now() >= replayEnd_) {
    ForgetOthers();
  }
  if (Clock::now() >= announceAgain_) {
    AnnounceAgain();
  }
}

void Service::Handle(const notifications::Notification& notification) {
  switch (notification.event) {
  case Notice::Connected:
    AwaitReplay();
    break;
  case Notice::Plugged:
    Plug(notification.mountPoint, notification.isDirectory);
    break;
  case Notice::Unplugged:
    Forget(notification.mountPoint);
    break;
  default:
    // Announced by us, or by the transcoder, which has then given out stamps.
    const auto found = volumes_.find(notification.mountPoint);
    if (found != volumes_.end()) {
      Known& known = *found->second;
      if (known.echoes > 0) {
        --known.echoes;
      } else if (known.volume.IsWalked()) {
        known.volume.ReadStamp();
      }
    }
  }
}

void Service::Plug(const std::string& mountPoint, bool isDirectory) {
  const auto kind = isDirectory ? VolumeRoot::Kind::Directory : VolumeRoot::Kind::Mount;
  const auto found = volumes_.find(mountPoint);
  if (found != volumes_.end()) {
    if (found->second->volume.Kind() == kind && found->second->volume.IsInPlace()) {
      Confirm(*found->second);
      return;
    }
    Forget(mountPoint);
  }
  if (notify::ContainsShares(mountPoint)) {
    LogError("Volume " + Printable(mountPoint) + ": not indexed: the volumes are below it");
    return;
  }
  LogInfo("Volume " + Printable(mountPoint) + ": walking");
  const auto known = volumes_.emplace(mountPoint, std::make_unique<Known>(mountPoint, kind)).first;
  known->second->volume.HandleMounts(ReadMountPoints());
}

/// The notification service was started again, or was not there. It sends the volumes that are
/// plugged next.
void Service::AwaitReplay() {
  for (const auto& [mountPoint, known] : volumes_) {
    known->isPlugged = false;
    known->isScanned = false;
    known->echoes = 0;
    known->purgedFor.clear();
  }
  replayEnd_ = volumes_.empty() ? Clock::time_point::max() : Clock::now() + REPLAY_TIME;
}

/// The volume is plugged for the service that we are connected to.
void Service::Confirm(Known& known) {
  if (!std::exchange(known.isPlugged, true) && known.volume.IsWalked()) {
    AnnounceScanned(known);
  }
}

void Service::ForgetOthers() {
  replayEnd_ = Clock::time_point::max();
  std::vector<std::string> others;
  for (const auto& [mountPoint, known] : volumes_) {
    if (!known->isPlugged) {
      others.push_back(mountPoint);
    }
  }
  for (const std::string& mountPoint : others) {
    Forget(mountPoint);
  }
}

void Service::Forget(const std::string& mountPoint) {
  if (volumes_.erase(mountPoint) > 0) {
    LogInfo("Volume " + Printable(mountPoint) + ": gone");
    announcer_.Forget(util::Path(mountPoint).Basic());
  }
}

// --- Work --------------------------------------------------------------------------------------

/// Does one piece of work. Walks of whole volumes alternate with changes, so that a change waits
/// for one piece of one walk at most. Of either kind, each volume has its turn.
void Service::WorkOnNext() {
  const auto now = Clock::now();
  const auto find = [this, now](bool isWalk) {
    return service::NextInTurn(volumes_, lastWorked_[isWalk ? 1 : 0], [&](const auto& entry) {
      const Volume& volume = entry.second->volume;
      return volume.NextWork() <= now && volume.IsWalkingAll() == isWalk;
    });
  };
  auto next = find(!wasWalk_);
  if (next == volumes_.end()) {
    next = find(wasWalk_);
  }
  if (next == volumes_.end()) {
    return;
  }
  const std::string mountPoint = next->first;
  Known& known = *next->second;
  wasWalk_ = known.volume.IsWalkingAll();
  lastWorked_[wasWalk_ ? 1 : 0] = mountPoint;
  working_ = &known;
  const auto found = [this](const db::DB& catalog) {
    remembered_.ForgetOthers(working_->volume.MountPoint(), catalog);
  };
  const Volume::Result result = known.volume.Work([this] { Pulse(); }, found, LatestStamp(known));
  working_ = nullptr;
  if (result.isGone) {
    Forget(mountPoint);
  } else {
    AnnounceResult(known, result);
    if (result.hasChanged) {
      AnnounceOtherMounts(known);
    }
  }
}

/// A disk that is mounted twice is two volumes with one catalog. Only one of them finds a change.
void Service::AnnounceOtherMounts(const Known& changed) {
  for (const auto& [mountPoint, known] : volumes_) {
    if (known.get() != &changed && known->volume.Identity() == changed.volume.Identity()) {
      AnnounceResult(*known, {.hasChanged = true});
    }
  }
}

std::time_t Service::LatestStamp(const Known& known) const {
  // Without a battery the clock may be years late after a start, and it may be set back later.
  return std::max(
      {std::time(nullptr), remembered_.NewestStamp(), known.volume.State().newestStamp});
}

// --- Announcements -----------------------------------------------------------------------------

void Service::AnnounceResult(Known& known, const Volume::Result& result) {
  known.hasChanged = known.hasChanged || result.hasChanged;
  if (!known.volume.IsWalked() || !known.isPlugged) {
    return; // Scanned comes first
  }
  if (result.isFirstWalk) {
    known.hasChanged = false;
    AnnounceScanned(known);
    CheckPurgesSoon(); // if this is the master, it is known only now
  } else if (known.isScanned) {
    AnnounceChanges(known);
  }
}

void Service::AnnounceChanges(Known& known) {
  const bool isIdle = known.volume.IsIdle();
  if (known.hasChanged && !isIdle) {
    known.hasChanged = false;
    known.isEndDue = true;
    Announce(known, Event::TranscodedBatch);
  } else if (known.hasChanged || (known.isEndDue && isIdle)) {
    known.hasChanged = false;
    known.isEndDue = false;
    Announce(known, Event::End);
  } else if (const auto master = Master(); master && !IsPurgeOwed(known, *master)) {
    Remember(known, *master); // stamps of the transcoder
  }
}

/// An announcement has failed.
void Service::AnnounceAgain() {
  announceAgain_ = Clock::time_point::max();
  for (const auto& [mountPoint, known] : volumes_) {
    known->echoes = 0;
    known->purgedFor.clear();
    if (known->isPlugged && known->volume.IsWalked()) {
      AnnounceScanned(*known);
    }
  }
}

/// The daemon may elect a master then. So the answer is waited for before the master is looked up.
void Service::AnnounceScanned(Known& known) {
  Announce(known, Event::Scanned, true);
}

void Service::Announce(Known& known, Event event, bool handled) {
  if (announcer_.Announce(
          {.event = event, .mountPoint = known.volume.Path(), .handled = handled})) {
    ++known.echoes;
  }
}

/// One announcement is done; the next ones about the volume follow.
void Service::Announced(const Announcer::Announcement& announcement,
                        std::optional<std::size_t> clients) {
  if (!clients) {
    announceAgain_ = std::min(announceAgain_, Clock::now() + ANNOUNCE_RETRY);
    return;
  }
  const auto found = volumes_.find(announcement.mountPoint + '/');
  if (found == volumes_.end()) {
    return;
  }
  Known& known = *found->second;
  const auto master = Master();
  switch (announcement.event) {
  case Event::Scanned:
    known.isScanned = true;
    if (*clients > 0) {
      PurgeOrEnd(known);
    } else {
      Announce(known, Event::End); // no daemon: it writes the locator file when it starts
    }
    break;
  case Event::Purged: {
    const std::string purgedFor = std::exchange(known.purgedFor, {});
    if (*clients > 0 && master == purgedFor) {
      Remember(known, *master);
      Announce(known, Event::End);
    } else if (*clients > 0) {
      PurgeOrEnd(known); // another volume has become the master
    }
    break;
  }
  default:
    if (*clients > 0 && master && !IsPurgeOwed(known, *master)) {
      Remember(known, *master);
    }
    remembered_.StoreStamp(known.volume.State().newestStamp);
  }
}

/// The master has changed, or its identity has become known. A daemon that starts has several
/// masters one after the other, until it knows all volumes.
void Service::CheckPurgesSoon() {
  checkPurges_ = Clock::now() + MASTER_QUIET;
}

void Service::CheckPurges() {
  checkPurges_ = Clock::time_point::max();
  const auto master = Master();
  for (const auto& [mountPoint, known] : volumes_) {
    if (master && known->isScanned && known->volume.IsWalked() && known->purgedFor != *master &&
        IsPurgeOwed(*known, *master)) {
      PurgeOrEnd(*known);
    }
  }
}

void Service::PurgeOrEnd(Known& known) {
  const auto master = Master();
  if (master && IsPurgeOwed(known, *master)) {
    known.purgedFor = *master;
    Announce(known, Event::Purged, true);
  } else {
    Announce(known, Event::End);
  }
}

/// Whether merged rows of the volume may come from another catalog.
bool Service::IsPurgeOwed(const Known& known, const std::string& master) const {
  const auto remembered = remembered_.Find(master, known.volume.MountPoint());
  return !remembered || remembered->identity != known.volume.Identity();
}

void Service::Remember(const Known& known, const std::string& master) {
  const bool isOther = IsPurgeOwed(known, master);
  remembered_.Store(master, known.volume.MountPoint(), known.volume.State());
  // A backup of the master that was made before has rows of another catalog.
  Known* const volume = isOther ? MasterVolume() : nullptr;
  if (volume != nullptr && volume->volume.Identity() == master) {
    volume->volume.TakeStamp();
  }
}

/// The volume that is the master; null if the shares root is, or while it is not known.
Service::Known* Service::MasterVolume() const {
  const auto path = Locator::Master();
  const auto found = path ? volumes_.find(*path + '/') : volumes_.end();
  return found == volumes_.end() ? nullptr : found->second.get();
}

/// The identity of the catalog on the master volume; nothing while that is not known.
std::optional<std::string> Service::Master() const {
  if (Locator::Master() == SHARES) {
    return NO_VOLUME;
  }
  const Known* const volume = MasterVolume();
  return volume == nullptr || volume->volume.Identity().empty()
             ? std::nullopt
             : std::optional(volume->volume.Identity());
}

// --- Status ------------------------------------------------------------------------------------

void Service::PublishStatus() {
  nlohmann::ordered_json list = nlohmann::ordered_json::array();
  bool isBusy = working_ != nullptr;
  for (const auto& [mountPoint, known] : volumes_) {
    const VolumeStatus status = known->volume.Status();
    list.push_back({{"mountPoint", status.mountPoint},
                    {"state", status.state},
                    {"foldersWaiting", status.foldersWaiting},
                    {"files", status.files}});
    isBusy = isBusy || !known->volume.IsIdle();
  }
  statusDue_ = status_.Update(list, isBusy).value_or(Clock::time_point::max());
}

} // namespace orva::indexer

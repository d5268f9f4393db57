#pragma once

#include "Announcer.h"
#include "Locator.h"
#include "RememberedCatalogs.h"
#include "Volume.h"

#include "notifications/Observer.h"
#include "orvautil/FileDescriptor.h"
#include "service/StatusFile.h"

#include <array>
#include <chrono>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace orva::indexer {

/// The indexer: hears of volumes from the notification service, keeps their catalogs up to date and
/// announces what has changed. One thread, one loop.
class Service {
public:
  struct Settings {
    std::string notificationSocket; ///< address
    std::string stateDirectory;     ///< what must outlive the process
    std::string runtimeDirectory;   ///< for the status file
  };

  /// From now on, SIGINT and SIGTERM stop the service. Throws util::Exception and std::string.
  explicit Service(Settings settings);

  /// Works until SIGINT or SIGTERM.
  void Run();

private:
  /// A volume with what is to be announced about it.
  struct Known {
    explicit Known(std::string mountPoint, catalog::VolumeRoot::Kind kind)
        : volume(std::move(mountPoint), kind) {}

    Volume volume;
    bool isPlugged = true;   ///< for the notification service that we are connected to
    bool isScanned = false;  ///< it was
    bool hasChanged = false; ///< since the last announcement
    bool isEndDue = false;   ///< after a batch
    std::string purgedFor{}; ///< master for which Purged is being announced; else empty
    int echoes = 0;          ///< announcements of ours that come back
  };

  void Wait();
  void ReadInput();
  void Pulse();
  void HandleNotifications();
  void Handle(const notifications::Notification& notification);
  void Plug(const std::string& mountPoint, bool isDirectory);
  void AwaitReplay();
  void Confirm(Known& known);
  void ForgetOthers();
  void Forget(const std::string& mountPoint);
  void AnnounceAgain();
  void WorkOnNext();
  void AnnounceResult(Known& known, const Volume::Result& result);
  void AnnounceOtherMounts(const Known& changed);
  void AnnounceChanges(Known& known);
  void AnnounceScanned(Known& known);
  void Announce(Known& known, notify::Event event, bool handled = false);
  void Announced(const Announcer::Announcement& announcement, std::optional<std::size_t> clients);
  void CheckPurgesSoon();
  void CheckPurges();
  void PurgeOrEnd(Known& known);
  bool IsPurgeOwed(const Known& known, const std::string& master) const;
  void Remember(const Known& known, const std::string& master);
  Known* MasterVolume() const;
  std::optional<std::string> Master() const;
  std::time_t LatestStamp(const Known& known) const;
  void PublishStatus();

  const Settings settings_;
  util::FileDescriptor signals_;
  util::FileDescriptor mountInfo_; ///< polled for changes
  RememberedCatalogs remembered_;
  notifications::Observer observer_;
  Announcer announcer_;
  Locator locator_;
  std::map<std::string, std::unique_ptr<Known>> volumes_; ///< by mount point, ending in "/"
  std::vector<notifications::Notification> received_;
  bool wasWalk_ = false;                  ///< the last piece of work
  std::array<std::string, 2> lastWorked_; ///< mount points, of the last change and the last walk
  const Known* working_ = nullptr;
  bool isStopped_ = false;
  Clock::time_point inputRead_{};
  Clock::time_point announceAgain_ = Clock::time_point::max();
  Clock::time_point checkPurges_ = Clock::time_point::max();
  Clock::time_point replayEnd_ = Clock::time_point::max(); ///< what is not plugged then is gone
  service::StatusFile status_;
  Clock::time_point statusDue_ = Clock::time_point::max(); ///< when it is too early to write it
};

} // namespace orva::indexer

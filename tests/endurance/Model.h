#pragma once

#include "Content.h"
#include "Disk.h"

#include "orva-notify/Notification.h"

#include <iosfwd>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace orva::test {

/// The disks of a run, by mount point.
using Disks = std::map<std::string, std::unique_ptr<Disk>>;

/// The merged databases by location: a disk's own directory (`Disk::Keeper`), the shares root, or
/// the daemon's working directory for a location that does not exist.
using Contents = std::map<std::string, Content>;

/// The result of a notification, as the log shows it.
struct Result {
  std::string mergedInto; ///< the master that a merge was announced with; empty when none was
  int merges = 0;         ///< merges that were completed
  bool gaveUp = false;    ///< a merge failed and was ignored
  bool refused = false;   ///< the notification could not be handled
  bool operator==(const Result&) const = default;
};
std::ostream& operator<<(std::ostream& stream, const Result& result);

/// A model of the daemon: its rules for volumes, masters and states, and what each notification
/// changes in the merged databases.
class Model {
public:
  explicit Model(const Disks& disks) : disks_(disks) {}

  /// What disturbed the handling of a notification.
  struct Circumstances {
    bool removalLocked = false;     ///< a reader kept rows from being removed
    bool mergeLocked = false;       ///< a reader kept a merge from being written
    std::optional<bool> readable{}; ///< whether a pulled volume was read before the pull
  };

  /// Handles a notification for a volume, and changes `databases` as the daemon should.
  Result Handle(notify::Event event, const std::string& mountPoint, Contents& databases,
                Circumstances circumstances);

  enum class State { Default, Plugged, Scanned };
  State CurrentState() const { return state_; }

  /// Mount point of the master; empty when there is none.
  const std::string& Master() const { return master_; }
  /// Where the master's database is.
  std::string MasterLocation() const { return Location(master_); }

  /// The content of the locator file.
  const std::string& Locator() const { return locator_; }

  /// Whether the shares root would become the master, and remain the master, without this volume.
  bool KeepsTheSharesRootOut(const std::string& mountPoint) const;

private:
  struct Record {
    std::string mountPoint;
    double capacity;
    double free;
  };

  void Register(notify::Event event, const std::string& mountPoint);
  void Unregister(const std::string& mountPoint);
  bool Elect();
  void Dispatch(notify::Event event, const std::string& mountPoint);
  void Unplugged(const std::string& mountPoint);
  bool IsUnfinished() const;
  void Move();
  void MoveAfterFailure();
  void EnterScanned();
  void FallBack();
  void Merge(const std::string& mountPoint);
  bool HasCatalog(const Disk& disk) const;
  void RemoveVolume(const std::string& mountPoint);
  void Open(const std::string& location) const;
  std::string Location(const std::string& mountPoint) const;
  bool IsWritable(const std::string& location) const;
  Content& DatabaseOf(const std::string& mountPoint);

  const Disks& disks_;
  std::vector<Record> volumes_;
  std::string master_;
  State state_ = State::Default;
  bool stopped_ = false; ///< the merger has been stopped by a move that failed
  std::string locator_ = "zophotos_db_path=/shares//.zophotos/zophotos.db\n";

  // While a notification is handled.
  Contents* databases_ = nullptr;
  Circumstances circumstances_;
  Result result_;
};

/// Where the daemon puts a database whose location does not exist: its working directory.
inline const std::string NO_PLACE = "/tmp/daemon";

} // namespace orva::test

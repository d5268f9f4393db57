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

/// The merged databases by location: a disk's keeper, the shares root, or the daemon's directory,
/// which stands in for a place that there is not.
using Contents = std::map<std::string, Content>;

/// What a notification comes to, as the log shows it.
struct Result {
  std::string mergedInto; ///< the master that a merge was announced with; empty when none was
  int merges = 0;         ///< merges that came to their end
  bool gaveUp = false;    ///< a merge failed and was ignored
  bool refused = false;   ///< the notification could not be handled
  bool operator==(const Result&) const = default;
};
std::ostream& operator<<(std::ostream& stream, const Result& result);

/// What the daemon should know and do: its rules about volumes, masters and states. The databases
/// are told to it, and it says what a notification makes of them.
class Model {
public:
  explicit Model(const Disks& disks) : disks_(disks) {}

  /// What stood in the way of a notification.
  struct Circumstances {
    bool removalLocked = false; ///< rows could not be removed because somebody read the database
    bool mergeLocked = false;   ///< the same of a merge
    std::optional<bool> readable{}; ///< whether a volume that was just pulled was read before
  };

  /// Handles a notification for a volume, changing `databases` as it should.
  Result Handle(notify::Event event, const std::string& mountPoint, Contents& databases,
                Circumstances circumstances);

  enum class State { Default, Plugged, Scanned };
  State CurrentState() const { return state_; }

  /// Mount point of the master; empty when there is none.
  const std::string& Master() const { return master_; }
  /// Where the master's database is.
  std::string MasterLocation() const { return Location(master_); }

  /// What the locator file says.
  const std::string& Locator() const { return locator_; }

  /// Whether without this volume the shares root would be the master, once and for all.
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
  bool stopped_ = false; ///< the merger has been told to stop
  std::string locator_ = "zophotos_db_path=/shares//.zophotos/zophotos.db\n";

  // While a notification is handled.
  Contents* databases_ = nullptr;
  Circumstances circumstances_;
  Result result_;
};

/// Where the daemon puts a database of no place: its working directory.
inline const std::string NO_PLACE = "/tmp/daemon";

} // namespace orva::test

#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <stop_token>
#include <string>

namespace orva::web {

/// How far the snapshot is, for people.
struct SnapshotStatus {
  enum class State {
    NoDatabase, ///< the daemon has no merged database at the moment: the snapshot is empty
    Building,   ///< a new snapshot is being built; the former one, if any, is still read
    Current,    ///< as the merged database was at the last update
    Failed      ///< the merged database cannot be read; the former snapshot is still read
  };

  State state = State::Building;
  std::int64_t done = 0;  ///< photos that the new snapshot has, while building
  std::int64_t total = 0; ///< photos that it will have, about; 0 for unknown
  std::string reason;     ///< of NoDatabase and Failed; not escaped
};

/// The state for programs: "no_database", "building", "current" or "failed".
const char* NameOf(SnapshotStatus::State state);

/// A private copy of the merged database with a search index, in a directory of its own. It is
/// read by any number of SnapshotReaders, which never touch the merged database. The directory is a
/// cache: whatever it holds may be removed while no process uses it.
class Snapshot {
public:
  /// Returns the path of the merged database, or throws zophotos::Failure.
  using FindPath = std::function<std::string()>;

  /// Uses `directory`, which is created if its parent exists. Continues with the snapshot that is
  /// there. Files with the names of snapshots that are damaged or of another version are removed.
  /// Throws std::runtime_error if another process uses the directory, or if it cannot be used.
  Snapshot(const std::string& directory, FindPath findPath);
  ~Snapshot();
  Snapshot(const Snapshot&) = delete;
  Snapshot& operator=(const Snapshot&) = delete;

  /// Brings the snapshot up to date if the locator or the merged database has changed. Locks the
  /// merged database for about 20 milliseconds at a time, and does not keep it open afterwards.
  /// Returns whether readers see a change. Errors become the status; after an error, the next try
  /// may be a minute later. One thread; `stop` ends a long update early. Calls `tellBuild` when the
  /// status has become Building.
  bool Update(const std::stop_token& stop = {}, const std::function<void()>& tellBuild = {});

  /// Any thread.
  SnapshotStatus Status() const;

  /// The path of the snapshot's file that readers are to read. It changes when a new snapshot is
  /// complete; the former file is then removed, but can be read while it is open. Any thread.
  std::string File() const;

  /// For readers that found damage in the file: the next update replaces it. Any thread.
  void ReportDamage() const;

private:
  class Implementation;
  std::unique_ptr<Implementation> implementation_;
};

} // namespace orva::web

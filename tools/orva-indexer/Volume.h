#pragma once

#include "FolderWatches.h"

#include "CatalogSchema.h"
#include "FolderIndexer.h"
#include "UntrustedCatalog.h"
#include "VolumeRoot.h"

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <ctime>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

namespace orva::indexer {

using Clock = std::chrono::steady_clock;

/// What the indexer does with a volume.
struct VolumeStatus {
  std::string mountPoint; ///< ends in "/"
  const char* state = ""; ///< "walking", "watching", "timed", "read-only" or "unusable"
  std::size_t foldersWaiting = 0;
  long long files = 0;
};

/// One volume: the folders that wait to be walked, the watches that add to them, and the work on
/// its catalog. Nothing of the volume is open between two calls. On the program's thread.
class Volume {
public:
  /// What a piece of work has changed.
  struct Result {
    bool isGone = false;      ///< the volume is not there any more
    bool hasChanged = false;  ///< changes were committed that other programs can see
    bool isFirstWalk = false; ///< the first whole walk of this catalog has ended
  };

  /// Thrown by a pulse to end a piece of work early.
  struct Interrupted {};

  /// Called with a catalog that was not there before, or that was replaced by a copy of an earlier
  /// time, before the indexer gives out stamps in it.
  using Found = std::function<void(const db::DB& catalog)>;

  /// For the volume at `mountPoint`, which ends in "/". The first walk is waiting.
  Volume(std::string mountPoint, catalog::VolumeRoot::Kind kind);

  const std::string& MountPoint() const noexcept { return mountPoint_; }
  catalog::VolumeRoot::Kind Kind() const noexcept { return kind_; }

  /// The path of the volume, without a separator at its end.
  const std::string& Path() const noexcept { return path_; }

  /// The identity of its catalog; empty until it was opened.
  const std::string& Identity() const noexcept { return state_.identity; }

  /// Whether the catalog with this identity was walked wholly.
  bool IsWalked() const noexcept { return isWalked_; }

  /// The state of its catalog after the latest piece of work.
  const catalog::CatalogState& State() const noexcept { return state_; }

  /// Whether the volume at the path is still the one that was walked.
  bool IsInPlace() const;

  /// The descriptor to be polled for ReadEvents; -1 if there is none, or nothing to be read yet.
  int Descriptor(Clock::time_point now) const;

  /// When that changes.
  Clock::time_point NextEvents() const;

  /// Notes which folders have changed.
  void ReadEvents();

  /// When the next piece of work is due.
  Clock::time_point NextWork() const;

  /// Whether no folder is being walked or waits to be walked now.
  bool IsIdle() const noexcept { return ready_.empty() && !isWalkingAll_; }

  /// Whether a walk of all folders has not ended.
  bool IsWalkingAll() const noexcept { return isWalkingAll_; }

  /// Walks folders for at most two seconds and commits. Calls `pulse` often. `latest` is the time
  /// of the latest stamp that its catalog may have.
  Result Work(const std::function<void()>& pulse, const Found& found, std::time_t latest);

  /// Something was mounted or unmounted: a volume that could not be written is tried again, and
  /// mount points below the volume are looked at. `mountPoints` are all that there are.
  void HandleMounts(const std::set<std::string>& mountPoints);

  /// Another program has written to the catalog: reads its newest stamp.
  void ReadStamp() { isStampWanted_ = true; }

  /// Gives out a stamp in the catalog with the next piece of work, so that a copy of it of an
  /// earlier time is recognized.
  void TakeStamp() { isStampDue_ = true; }

  VolumeStatus Status() const;

private:
  /// A folder that waits to be walked.
  struct Task {
    std::string path;
    bool recursive = false; ///< with all folders below it
    bool revived = false;
  };
  /// A folder with events.
  struct Pending {
    Clock::time_point due;
    Clock::time_point latest; ///< when it is walked although it is not quiet
  };
  /// A file that was written and not closed since.
  struct OpenFile {
    Clock::time_point written;
    bool hasContent = false;
  };
  /// A file with a ctime in the future.
  struct Look {
    catalog::FolderIndexer::FileState state;
    Clock::time_point when;
  };
  /// Why the catalog is not kept up to date at the moment.
  enum class Trouble { None, ReadOnly, Unusable };

  using Folder = catalog::IndexedFolder;

  void StartAgain();
  void WalkAll();
  void MarkDirty(const std::string& folder);
  void CheckLater(const std::string& folder, Clock::time_point when);
  void Handle(const FolderWatches::Event& event);
  void NoteFile(const FolderWatches::Event& event);
  void TakeDue();
  bool IsWalkNeeded() const { return !watches_ || isWalkWanted_; }
  std::unique_ptr<db::VolumeDB> OpenCatalog(const catalog::VolumeRoot& root, std::time_t latest);
  void SetAside(const catalog::VolumeRoot& root, const std::string& reason);
  void CheckIdentity(const db::DB& catalog, const Found& found);
  Result WorkOn(const catalog::VolumeRoot& root, const std::function<void()>& pulse,
                const Found& found, std::time_t latest);
  void WalkNext(catalog::FolderIndexer& indexer);
  void FinishWalk(Result& result, long long files);
  void LogUnreadable();
  void Opened(const Folder& folder, int descriptor);
  void GiveUpWatches(int error);
  bool IsComplete(const catalog::VolumeRoot& root, const Folder& folder, const std::string& name,
                  const catalog::FolderIndexer::FileState& state);
  bool IsBeingWritten(const catalog::VolumeRoot& root, const std::string& folder,
                      const std::string& name, Clock::duration age);
  void Fail(Trouble trouble, const std::string& reason, bool isMedium = false);
  bool IsStillFull(const catalog::VolumeRoot& root);
  void Recover();
  void WaitForLock();

  const std::string mountPoint_;
  const std::string path_;
  const catalog::VolumeRoot::Kind kind_;
  const std::string name_; ///< for the log

  std::unique_ptr<FolderWatches> watches_; ///< null where folders are not watched
  bool isLimitLogged_ = false;
  bool hasNoEvents_ = false; ///< the file system reports no changes of others
  bool isUnmounted_ = false;
  bool isUncommitted_ = false;   ///< folders were walked, and that is not committed
  std::set<std::string> mounts_; ///< below the volume, as paths of folders
  Clock::time_point eventsRead_{};

  std::vector<Task> ready_; ///< the last one is next
  std::map<std::string, Pending> pending_;
  std::unordered_map<std::string, OpenFile> openFiles_; ///< as events say
  /// Paths of photos that were written or replaced since their rows were.
  std::unordered_set<std::string> written_;
  std::vector<std::string> uncommitted_; ///< those whose rows were written since the last commit
  std::size_t asked_ = 0;                ///< files of this walk, whether they are open for writing
  std::unordered_map<std::string, Look> looks_;
  Clock::time_point notBefore_{};                ///< no work earlier
  Clock::time_point nextWalk_{};                 ///< of all folders, if one is needed
  std::optional<Clock::time_point> lockedSince_; ///< by another program
  bool isLockLogged_ = false;
  bool isWalkWanted_ = false; ///< also where the folders are watched
  bool isStampWanted_ = false;
  bool isStampDue_ = false;     ///< of TakeStamp
  bool hasOtherAccess_ = false; ///< the folder that is walked lets other users pass than before

  dev_t device_ = 0; ///< of the root, as it was walked
  ino_t inode_ = 0;
  catalog::CatalogState state_;
  bool isWalked_ = false;    ///< wholly, since the volume appeared or its catalog was replaced
  bool isWalkingAll_ = true; ///< a walk of all folders has not ended
  Clock::time_point walkBegin_{};
  Clock::duration walkTime_{}; ///< of work, without pauses
  long long walkedFolders_ = 0;
  long long walkedFiles_ = 0;
  long long unreadable_ = 0; ///< folders and files, in this walk
  std::string unreadableExample_;
  bool isUnreadableLogged_ = false;
  long long files_ = 0; ///< on the volume, as far as known
  Trouble trouble_ = Trouble::None;
  bool isRetry_ = false; ///< of a volume with trouble, which is not watched yet
  bool wasJustSetAside_ = false;
  Clock::time_point retryAt_{};            ///< of a volume with trouble
  std::optional<long long> spaceWhenFull_; ///< bytes that were free; nothing if it is not full
};

} // namespace orva::indexer

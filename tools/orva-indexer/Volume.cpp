#include "Volume.h"

#include "Classification.h"
#include "OpenFiles.h"
#include "Sql.h"

#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"
#include "orvautil/Path.h"
#include "service/Log.h"

#include <sys/inotify.h>
#include <sys/stat.h>
#include <sys/statfs.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <iterator>
#include <system_error>
#include <utility>

namespace orva::indexer {
namespace {

using namespace std::chrono_literals;
using catalog::CatalogProblem;
using catalog::FolderIndexer;
using catalog::VolumeRoot;
using service::LogError;
using service::LogInfo;
using service::Printable;
using util::FormatString;

/// A folder is walked when it was quiet for QUIET, or LATEST after its first event.
constexpr auto QUIET = 1s;
constexpr auto LATEST = 8s;

/// Events are not read more often, so that a large copy does not wake the program for each write.
constexpr auto EVENT_INTERVAL = 100ms;

/// How long a piece of work may take before its commit. After a commit that took a stamp, the next
/// piece begins no earlier than this after the begin of the last one, so that stamps do not outrun
/// the clock.
constexpr auto MOST_WORK = 2s;

/// Between two pieces of work, so that the volume can be unmounted.
constexpr auto REST = 200ms;

/// A file that was created but neither written nor closed may be a link, for which there is no
/// other event. One that was written and not closed waits no longer even if it is still open.
constexpr auto LONGEST_EMPTY = 8s;
constexpr auto LONGEST_OPEN = 600s;

/// How long a locked catalog is waited for, in milliseconds: all volumes wait then. The next
/// attempts come after pauses that grow with the time since it was found locked.
constexpr unsigned BUSY_TIMEOUT = 100;
constexpr Clock::duration SHORTEST_BUSY_PAUSE = 250ms;
constexpr Clock::duration LONGEST_BUSY_PAUSE = 8s;

/// After this time, a locked catalog is logged.
constexpr auto LONGEST_LOCK = 5s;

constexpr auto RETRY = 60s;
constexpr auto SPACE_CHECK = 2s; ///< of a full volume
constexpr auto SHORT_RETRY = 1s;

/// A walk on a timer takes at most a twentieth of the time.
constexpr auto SHORTEST_PAUSE = 60s;
constexpr int PAUSE_FACTOR = 20;

/// Bounds the memory for files that are being written.
constexpr std::size_t MOST_FILES = 10'000;

// statfs(2), linux/magic.h and the kernel's sources. They do not report changes that are made
// elsewhere.
constexpr std::array<std::uint32_t, 13> REMOTE_FILE_SYSTEMS = {
    0x6969,     // NFS
    0xFF534D42, // CIFS
    0xFE534D42, // SMB 2
    0x517B,     // SMB
    0x01021997, // 9P
    0x65735546, // FUSE
    0x65735543, // FUSE control
    0x00C36400, // Ceph
    0x5346414F, // AFS
    0x6B414653, // kAFS
    0x73757245, // Coda
    0x01161970, // GFS2
    0x786F4256, // folders shared with a virtual machine
};

bool HasNoEvents(const VolumeRoot& root) {
  struct statfs status = {};
  return fstatfs(root.Descriptor(), &status) == 0 &&
         std::ranges::find(REMOTE_FILE_SYSTEMS, static_cast<std::uint32_t>(status.f_type)) !=
             REMOTE_FILE_SYSTEMS.end();
}

/// The path of the folder that contains the folder at `path`, which is not the root.
std::string FolderOf(const std::string& path) {
  const std::size_t end = path.rfind('/', path.size() - 2);
  return end == std::string::npos ? std::string() : path.substr(0, end + 1);
}

bool IsPhoto(const std::string& name) {
  return catalog::CategoryOf(catalog::ExtensionOf(name)) == catalog::PHOTO;
}

/// When to look again at a file that is open, by the time since it was written. Usually its end is
/// reported before, but not if it was renamed meanwhile or its folder was not watched.
Clock::time_point NextCheck(Clock::duration age) {
  return Clock::now() + std::max<Clock::duration>(LATEST, age / 2);
}

bool IsProductFolder(const FolderWatches::Event& event) {
  static const std::string home = core::GetORVA_HOME("");
  return event.folder.empty() && (event.name == home || event.name == ".zophotos");
}

} // namespace

Volume::Volume(std::string mountPoint, VolumeRoot::Kind kind)
    : mountPoint_(std::move(mountPoint)), path_(util::Path(mountPoint_).Basic()), kind_(kind),
      name_("Volume " + Printable(mountPoint_)) {
  StartAgain();
}

bool Volume::IsInPlace() const {
  struct stat status = {};
  return !isUnmounted_ && lstat(path_.c_str(), &status) == 0 &&
         (inode_ == 0 || (status.st_dev == device_ && status.st_ino == inode_));
}

// --- Events ------------------------------------------------------------------------------------

int Volume::Descriptor(Clock::time_point now) const {
  return watches_ && now - eventsRead_ >= EVENT_INTERVAL ? watches_->Descriptor() : -1;
}

Clock::time_point Volume::NextEvents() const {
  return watches_ ? eventsRead_ + EVENT_INTERVAL : Clock::time_point::max();
}

void Volume::ReadEvents() {
  if (!watches_) {
    return;
  }
  for (const FolderWatches::Event& event : watches_->Read()) {
    eventsRead_ = Clock::now();
    Handle(event);
    if (!watches_) {
      return;
    }
  }
}

void Volume::Handle(const FolderWatches::Event& event) {
  if ((event.mask & IN_Q_OVERFLOW) != 0) {
    LogInfo(name_ + ": too many changes at once; walking all of it");
    StartAgain();
  } else if ((event.mask & IN_UNMOUNT) != 0 && event.folder.empty()) {
    isUnmounted_ = true;
    notBefore_ = {};
  } else if ((event.mask & IN_UNMOUNT) != 0) { // a file system mounted below the volume
    watches_->Forget(event.folder);
    MarkDirty(FolderOf(event.folder));
  } else if ((event.mask & (IN_IGNORED | IN_DELETE_SELF | IN_MOVE_SELF)) != 0) {
    if (event.folder.empty() && (event.mask & IN_IGNORED) == 0) {
      MarkDirty(""); // the root: finds out whether the volume is still there
    }
  } else if (!IsProductFolder(event)) {
    if ((event.mask & IN_ISDIR) != 0) {
      if ((event.mask & (IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE | IN_CREATE)) != 0) {
        // Also for a new folder: another one may have had its name.
        watches_->Forget(event.folder + event.name + '/');
      }
    } else {
      NoteFile(event);
    }
    MarkDirty(event.folder);
  } else if ((event.mask & (IN_DELETE | IN_MOVED_FROM)) != 0) {
    MarkDirty(""); // makes the catalog again
  }
}

void Volume::NoteFile(const FolderWatches::Event& event) {
  const std::string path = event.folder + event.name;
  if ((event.mask & (IN_CREATE | IN_MODIFY | IN_MOVED_TO)) != 0 && IsPhoto(event.name) &&
      written_.size() < MOST_FILES) {
    written_.insert(path);
  }
  if ((event.mask & (IN_CREATE | IN_MODIFY)) != 0) {
    if (openFiles_.size() < MOST_FILES) {
      OpenFile& file = openFiles_[path];
      file.written = Clock::now();
      file.hasContent = file.hasContent || (event.mask & IN_MODIFY) != 0;
    }
  } else if ((event.mask & (IN_CLOSE_WRITE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE)) != 0) {
    openFiles_.erase(path);
  }
}

void Volume::MarkDirty(const std::string& folder) {
  const auto now = Clock::now();
  const auto [entry, isNew] = pending_.try_emplace(folder, Pending{now + QUIET, now + LATEST});
  entry->second.latest = std::min(entry->second.latest, now + LATEST);
  entry->second.due = std::min(now + QUIET, entry->second.latest);
}

void Volume::CheckLater(const std::string& folder, Clock::time_point when) {
  const auto [entry, isNew] = pending_.try_emplace(folder, Pending{when, when});
  if (!isNew && when < entry->second.due) {
    entry->second.due = when;
  }
}

void Volume::HandleMounts(const std::set<std::string>& mountPoints) {
  if (trouble_ != Trouble::None) {
    notBefore_ = {};
    retryAt_ = {};
  }
  std::set<std::string> mounts;
  for (auto mount = mountPoints.upper_bound(path_ + '/');
       mount != mountPoints.end() && mount->starts_with(path_ + '/'); ++mount) {
    mounts.insert(mount->substr(path_.size() + 1) + '/');
  }
  std::vector<std::string> changed;
  std::ranges::set_symmetric_difference(mounts, mounts_, std::back_inserter(changed));
  mounts_ = std::move(mounts);
  for (const std::string& folder : changed) {
    if (watches_) {
      // A folder that is not watched is walked when the one above is listed.
      watches_->Forget(folder);
      MarkDirty(FolderOf(folder));
    }
  }
}

// --- What is to be done ------------------------------------------------------------------------

/// Forgets what is known about folders, and walks all of them.
void Volume::StartAgain() {
  watches_ = hasNoEvents_ ? nullptr : std::make_unique<FolderWatches>();
  if (watches_ && watches_->Descriptor() == -1) {
    GiveUpWatches(errno);
  }
  openFiles_.clear();
  looks_.clear();
  isUncommitted_ = false;
  WalkAll();
}

void Volume::WalkAll() {
  isWalkWanted_ = false;
  pending_.clear();
  ready_.clear();
  ready_.push_back({.path = "", .recursive = true});
  isWalkingAll_ = true;
  walkTime_ = {};
  walkedFolders_ = 0;
  walkedFiles_ = 0;
  unreadable_ = 0;
  asked_ = 0;
}

Clock::time_point Volume::NextWork() const {
  auto next = Clock::time_point::max();
  if (!ready_.empty() || isUnmounted_ || isStampWanted_ || isStampDue_) {
    next = Clock::time_point::min();
  }
  if (IsWalkNeeded() && ready_.empty()) {
    next = std::min(next, nextWalk_);
  }
  for (const auto& [folder, pending] : pending_) {
    next = std::min(next, pending.due);
  }
  return std::max(next, notBefore_);
}

void Volume::TakeDue() {
  const auto now = Clock::now();
  if (!watches_ && ready_.empty() && now >= nextWalk_ && isWalked_) {
    // The watch limit may have been raised.
    StartAgain();
    return;
  }
  if (isWalkWanted_ && ready_.empty() && now >= nextWalk_ && isWalked_) {
    WalkAll();
    return;
  }
  for (auto entry = pending_.begin(); entry != pending_.end();) {
    if (entry->second.due <= now) {
      ready_.push_back({.path = entry->first});
      entry = pending_.erase(entry);
    } else {
      ++entry;
    }
  }
}

// --- Work --------------------------------------------------------------------------------------

Volume::Result Volume::Work(const std::function<void()>& pulse, const Found& found,
                            std::time_t latest) {
  std::optional<VolumeRoot> root;
  try {
    root.emplace(path_, kind_);
  } catch (const util::Exception&) {
    return {.isGone = true};
  }
  if (isUnmounted_) {
    return {.isGone = true};
  }
  if (IsStillFull(*root)) {
    return {};
  }
  try {
    const Result result = WorkOn(*root, pulse, found, latest);
    if (!ready_.empty()) {
      notBefore_ = std::max(notBefore_, Clock::now() + REST);
    }
    return result;
  } catch (const Interrupted&) {
    StartAgain();
    return {};
  } catch (const catalog::CatalogError& error) {
    switch (error.Problem()) {
    case CatalogProblem::Busy:
      if (isUncommitted_) {
        StartAgain();
      }
      WaitForLock();
      return {};
    case CatalogProblem::ReadOnly:
      Fail(Trouble::ReadOnly, "read-only; its catalog is not updated until this changes");
      break;
    case CatalogProblem::Full:
      spaceWhenFull_ = root->FreeSpace(); // before others can read that it is full
      Fail(Trouble::ReadOnly, "full; its catalog is not updated until this changes");
      notBefore_ = Clock::now() + SPACE_CHECK;
      break;
    default:
      if (!root->IsInPlace()) {
        return {.isGone = true};
      }
      Fail(Trouble::Unusable, std::string("not indexed: ") + error.what(),
           error.Problem() == CatalogProblem::Other);
    }
  } catch (const util::Exception& error) { // the root cannot be read
    if (!root->IsInPlace()) {
      return {.isGone = true};
    }
    Fail(Trouble::Unusable, std::string("not indexed: ") + error.what(), true);
  }
  return {};
}

Volume::Result Volume::WorkOn(const VolumeRoot& root, const std::function<void()>& pulse,
                              const Found& found, std::time_t latest) {
  Result result;
  struct stat status = {};
  if (fstat(root.Descriptor(), &status) == 0 &&
      (status.st_dev != device_ || status.st_ino != inode_)) {
    device_ = status.st_dev;
    inode_ = status.st_ino;
    hasNoEvents_ = HasNoEvents(root);
    StartAgain();
  }
  if (std::exchange(isRetry_, false)) {
    wasJustSetAside_ = false;
    StartAgain();
  }
  try {
    const auto begin = Clock::now();
    const auto database = OpenCatalog(root, latest);
    CheckIdentity(*database, found);
    TakeDue();
    db::Transaction transaction(*database, BUSY_TIMEOUT);
    isStampWanted_ = false;
    FolderIndexer indexer(
        *database, root, catalog::NewPhotos::Waiting, std::time(nullptr),
        {.opened = [this](const Folder& folder, int descriptor) { Opened(folder, descriptor); },
         .isComplete =
             [this, &root](const Folder& folder, const std::string& name,
                           const FolderIndexer::FileState& state) {
               const bool isComplete = IsComplete(root, folder, name, state);
               if (isComplete && written_.erase(folder.path + name) > 0) {
                 uncommitted_.push_back(folder.path + name);
               }
               return isComplete;
             },
         .wasWritten =
             [this](const Folder& folder, const std::string& name) {
               return written_.contains(folder.path + name);
             },
         .pulse = pulse});
    isUncommitted_ = true;
    written_.insert(uncommitted_.begin(), uncommitted_.end()); // of a piece that failed
    uncommitted_.clear();
    while (!ready_.empty() && Clock::now() - begin < MOST_WORK) {
      WalkNext(indexer);
    }
    walkTime_ += Clock::now() - begin;
    const bool isEnd = isWalkingAll_ && ready_.empty();
    const long long files = isEnd ? indexer.DeleteUnreachableRows(walkedFolders_, walkedFiles_) : 0;
    if (isStampDue_) {
      catalog::NextStamp(*database, std::time(nullptr));
    }
    catalog::CatalogState state = catalog::StateOf(*database);
    transaction.Commit();
    isStampDue_ = false;
    isUncommitted_ = false;
    uncommitted_.clear();
    if (ready_.empty() && pending_.empty()) {
      // The rest has no row, or one that waits.
      written_.clear();
      openFiles_.clear();
    }
    lockedSince_.reset();
    isLockLogged_ = false;
    state_ = std::move(state);
    result.hasChanged = indexer.HasVisibleChanges();
    if (indexer.HasChanged()) {
      const auto pause = catalog::PauseAfterStamp(state_.newestStamp, std::time(nullptr));
      notBefore_ = std::max(begin + MOST_WORK, Clock::now() + pause);
    }
    files_ += indexer.Summary().added + indexer.Summary().revived - indexer.Summary().deleted;
    if (const auto& unreadable = indexer.Summary().unreadable; !unreadable.empty()) {
      unreadable_ += static_cast<long long>(unreadable.size());
      unreadableExample_ = unreadable.front();
    }
    if (!isWalkingAll_) {
      LogUnreadable();
    }
    // An event may have begun another walk.
    if (isEnd && ready_.empty()) {
      FinishWalk(result, files);
    }
  } catch (const std::string& failure) {
    const CatalogProblem problem = catalog::ProblemOf(failure, root);
    if (problem == CatalogProblem::Foreign && root.IsInPlace()) {
      SetAside(root, failure);
      return {};
    }
    throw catalog::CatalogError(problem, failure);
  } catch (const catalog::CatalogError& error) {
    if (error.Problem() == CatalogProblem::Foreign && root.IsInPlace()) {
      SetAside(root, error.what());
      return {};
    }
    throw;
  }
  return result;
}

std::unique_ptr<db::VolumeDB> Volume::OpenCatalog(const VolumeRoot& root, std::time_t latest) {
  auto database = catalog::OpenUntrustedCatalog(root, latest, BUSY_TIMEOUT);
  if (!root.IsInPlace()) {
    throw catalog::CatalogError(CatalogProblem::Other, "the volume was replaced");
  }
  return database;
}

void Volume::SetAside(const VolumeRoot& root, const std::string& reason) {
  if (wasJustSetAside_) {
    throw catalog::CatalogError(CatalogProblem::Other, reason);
  }
  const std::string name = catalog::SetCatalogAside(root);
  LogError(name_ + ": its catalog is not one of ours, or damaged; it was renamed to " + name +
           " and is made again: " + Printable(reason));
  wasJustSetAside_ = true;
  notBefore_ = Clock::now() + SHORT_RETRY; // in case somebody damages it again and again
  isWalked_ = false;
  StartAgain();
}

/// A catalog with another identity describes another content, and so does a copy of an earlier
/// time, also after the transcoder has written to it.
void Volume::CheckIdentity(const db::DB& catalog, const Found& found) {
  if (!catalog::HasBeenIn(catalog, state_)) {
    found(catalog);
    if (isWalked_) {
      StartAgain();
    }
    state_ = catalog::StateOf(catalog);
    isWalked_ = false;
  }
}

void Volume::WalkNext(FolderIndexer& indexer) {
  const Task task = std::move(ready_.back());
  ready_.pop_back();
  std::optional<Folder> folder = indexer.Find(task.path);
  if (!folder) {
    // The folder above has not been listed since this one has appeared.
    if (watches_) {
      watches_->Forget(task.path);
    }
    ready_.push_back({.path = FolderOf(task.path)});
    return;
  }
  folder->revived = task.revived;
  const long long rows = indexer.Summary().rows;
  const long long linked = indexer.Summary().linked;
  hasOtherAccess_ = false;
  std::vector<Folder> inside = indexer.Update(*folder);
  if (!indexer.IsFinished()) {
    ready_.push_back(task);
    return;
  }
  if (!task.recursive && indexer.Summary().linked > linked) {
    isWalkWanted_ = true; // the event was about one of the file's names
  }
  if (isWalkingAll_) {
    walkedFolders_ += static_cast<long long>(inside.size());
    walkedFiles_ += indexer.Summary().rows - rows;
  }
  std::ranges::reverse(inside); // the first one is next
  for (Folder& next : inside) {
    const bool isUnknown = watches_ && !watches_->Has(next.path);
    if (task.recursive || isUnknown || hasOtherAccess_) {
      ready_.push_back({.path = std::move(next.path), .recursive = true, .revived = next.revived});
    }
  }
}

void Volume::FinishWalk(Result& result, long long files) {
  isWalkingAll_ = false;
  files_ = files;
  nextWalk_ = Clock::now() + std::max<Clock::duration>(SHORTEST_PAUSE, walkTime_ * PAUSE_FACTOR);
  result.isFirstWalk = !std::exchange(isWalked_, true);
  if (result.isFirstWalk) {
    LogInfo(name_ + FormatString(": walked %lld folders, %lld files in %.1f s%s", walkedFolders_,
                                 files_, std::chrono::duration<double>(walkTime_).count(),
                                 watches_ ? "" : "; its changes are looked for on a timer"));
  }
  isUnreadableLogged_ = isUnreadableLogged_ && unreadable_ > 0 && !result.isFirstWalk;
  LogUnreadable();
  Recover();
}

/// Logs that files or folders cannot be read, unless that was logged since all could be.
void Volume::LogUnreadable() {
  if (unreadable_ > 0 && !std::exchange(isUnreadableLogged_, true)) {
    LogError(name_ +
             FormatString(": %lld files or folders cannot be read, for example ", unreadable_) +
             Printable(unreadableExample_));
  }
}

void Volume::Opened(const Folder& folder, int descriptor) {
  if (watches_ && !watches_->Add(folder.path, descriptor)) {
    GiveUpWatches(errno);
  }
  // Who may read the photos below depends on it.
  hasOtherAccess_ = watches_ && watches_->HasOtherAccess(folder.path, descriptor);
}

void Volume::GiveUpWatches(int error) {
  watches_.reset();
  openFiles_.clear();
  if (!std::exchange(isLimitLogged_, true)) {
    LogError(name_ + ": its folders cannot be watched (" + std::generic_category().message(error) +
             "), so it is walked on a timer; see the sysctl fs.inotify." +
             (error == ENOSPC ? "max_user_watches" : "max_user_instances"));
  }
}

/// Whether nobody writes the file any more. Otherwise its folder is looked at again.
bool Volume::IsComplete(const VolumeRoot& root, const Folder& folder, const std::string& name,
                        const FolderIndexer::FileState& state) {
  const auto now = Clock::now();
  const std::string path = folder.path + name;
  timespec clock = {};
  clock_gettime(CLOCK_REALTIME, &clock);
  const auto age = std::chrono::seconds(clock.tv_sec - state.statusChanged.tv_sec) +
                   std::chrono::nanoseconds(clock.tv_nsec - state.statusChanged.tv_nsec);
  if (IsBeingWritten(root, folder.path, name, age)) {
    return false;
  }
  if (age >= QUIET) {
    looks_.erase(path);
    return true;
  }
  if (age >= 0s) {
    CheckLater(folder.path, now + (QUIET - age));
    return false;
  }
  // The clock was set back since. The file is complete when it was the same a second ago.
  if (!looks_.contains(path) && looks_.size() >= MOST_FILES) {
    return true;
  }
  const auto [look, isNew] = looks_.try_emplace(path, Look{state, now});
  if (!isNew && look->second.state == state && now - look->second.when >= QUIET) {
    looks_.erase(look);
    return true;
  }
  if (!isNew && look->second.state != state) {
    look->second = {state, now};
  }
  CheckLater(folder.path, look->second.when + QUIET);
  return false;
}

/// Whether a program has the file open and has written it in the last LONGEST_OPEN. `age`: since
/// its last change.
bool Volume::IsBeingWritten(const VolumeRoot& root, const std::string& folder,
                            const std::string& name, Clock::duration age) {
  const auto now = Clock::now();
  const std::string path = folder + name;
  // A whole walk may find any number of new files.
  if (IsPhoto(name) && age >= 0s && age < LONGEST_OPEN &&
      (!isWalkingAll_ || ++asked_ <= MOST_FILES)) {
    if (const auto isOpen = IsOpenForWriting(root, path)) {
      if (*isOpen) {
        CheckLater(folder, NextCheck(age));
      }
      return *isOpen;
    }
  }
  // It is not known, except from events.
  const auto open = openFiles_.find(path);
  if (open == openFiles_.end()) {
    return false;
  }
  const auto end = open->second.written +
                   (open->second.hasContent ? Clock::duration(LONGEST_OPEN) : LONGEST_EMPTY);
  if (now < end) {
    CheckLater(folder, std::min(end, NextCheck(now - open->second.written)));
    return true;
  }
  openFiles_.erase(open);
  return false;
}

// --- Trouble -----------------------------------------------------------------------------------

/// `isMedium`: perhaps the medium was pulled, and is unmounted next.
void Volume::Fail(Trouble trouble, const std::string& reason, bool isMedium) {
  if (std::exchange(trouble_, trouble) == Trouble::None) {
    (isMedium ? LogInfo : LogError)(name_ + ": " + Printable(reason));
  }
  StartAgain();
  watches_.reset();
  isRetry_ = true;
  retryAt_ = Clock::now() + RETRY;
  notBefore_ = retryAt_;
}

/// Whether no space has become free since the volume was found full.
bool Volume::IsStillFull(const VolumeRoot& root) {
  const auto now = Clock::now();
  if (spaceWhenFull_ && now < retryAt_ && root.FreeSpace() <= *spaceWhenFull_) {
    notBefore_ = std::min(now + SPACE_CHECK, retryAt_);
    return true;
  }
  spaceWhenFull_.reset();
  return false;
}

/// Another program has locked the catalog.
void Volume::WaitForLock() {
  const auto now = Clock::now();
  lockedSince_ = lockedSince_.value_or(now);
  const auto locked = now - *lockedSince_;
  notBefore_ = now + std::min(SHORTEST_BUSY_PAUSE + locked, LONGEST_BUSY_PAUSE);
  if (locked >= LONGEST_LOCK && !std::exchange(isLockLogged_, true)) {
    LogError(name_ + ": another program has locked its catalog; it is not updated until this ends");
  }
}

/// A walk of all folders has ended.
void Volume::Recover() {
  if (std::exchange(trouble_, Trouble::None) != Trouble::None) {
    LogInfo(name_ + ": indexed again");
  }
  wasJustSetAside_ = false;
  isLimitLogged_ = isLimitLogged_ && !watches_;
}

VolumeStatus Volume::Status() const {
  const char* const state = trouble_ == Trouble::ReadOnly   ? "read-only"
                            : trouble_ == Trouble::Unusable ? "unusable"
                            : !IsIdle()                     ? "walking"
                            : watches_                      ? "watching"
                                                            : "timed";
  return {.mountPoint = mountPoint_,
          .state = state,
          .foldersWaiting = ready_.size() + pending_.size(),
          .files = isWalkingAll_ ? walkedFiles_ : files_};
}

} // namespace orva::indexer

#include "Volume.h"

#include "Renderer.h"
#include "RenditionFiles.h"

#include "CatalogSchema.h"
#include "CatalogWriter.h"
#include "Classification.h"
#include "RenditionAccess.h"
#include "Sql.h"
#include "UntrustedCatalog.h"

#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/FileDescriptor.h"
#include "orvautil/FormatString.h"
#include "service/Log.h"

#include <fcntl.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <iterator>
#include <limits>
#include <string_view>
#include <system_error>
#include <utility>

namespace orva::transcoder {
namespace {

using catalog::RENDITIONS_PER_FOLDER;
using catalog::VolumeRoot;
using catalog::WaitingPhoto;
using service::LogError;
using service::LogInfo;
using service::Printable;

constexpr std::size_t MOST_LISTED = 50;       // waiting photos in one query
constexpr std::size_t MOST_EXAMINED = 1000;   // photos in one piece of work
constexpr std::size_t MOST_SLOW = 10'000;     // photos; more are rendered like the others
constexpr std::size_t MOST_REMOVALS = 10'000; // in one piece of work
constexpr std::chrono::seconds RETRY(60);
constexpr std::chrono::seconds SPACE_CHECK(2); // of a full volume

// How long a locked catalog is waited for, in milliseconds: all volumes wait then. The pauses
// before the next attempts grow with the time since it was found locked.
constexpr unsigned LOCK_TIMEOUT = 250;
constexpr Volume::Clock::duration SHORTEST_LOCK_PAUSE = std::chrono::milliseconds(250);
constexpr Volume::Clock::duration LONGEST_LOCK_PAUSE = std::chrono::seconds(8);

constexpr std::chrono::milliseconds PIECE(200);
// A photo is postponed for 15, 30, ... 480 s: 16 minutes. If the reason was a shortage of memory,
// it has usually passed by then.
constexpr int MOST_POSTPONEMENTS = 6;
constexpr std::chrono::seconds FIRST_POSTPONEMENT(15);
constexpr std::chrono::hours REMEMBERED(1); // after the end of a postponement

constexpr char NO_SPACE[] = "no space in memory to copy the file";

constexpr std::array<std::string_view, 7> RAW_EXTENSIONS = {"arw", "cr2", "dng", "nef",
                                                            "orf", "raf", "rw2"};

std::string ErrorText(int error) {
  return std::generic_category().message(error);
}

/// The volume's path on which it was mounted, without the separator at its end.
std::string PathOf(const std::string& mountPoint) {
  return mountPoint.substr(0, std::max<std::size_t>(mountPoint.size() - 1, 1));
}

/// The path of the folder that contains the file at `path`; empty for the root.
std::string FolderOf(const std::string& path) {
  const auto end = path.rfind('/');
  return end == std::string::npos ? std::string() : path.substr(0, end);
}

/// False while the indexer makes the catalog: the identity is committed with the tables.
bool HasIdentity(const db::DB& catalog) {
  return catalog::SelectNumber(catalog,
                               "SELECT count(*) FROM sqlite_schema WHERE name = 'Identity'") > 0;
}

bool IsSameTime(const timespec& a, const timespec& b) {
  return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

/// Whether both are the same file with the same content.
bool IsSameContent(const struct stat& a, const struct stat& b) {
  return a.st_dev == b.st_dev && a.st_ino == b.st_ino && a.st_size == b.st_size &&
         IsSameTime(a.st_mtim, b.st_mtim);
}

/// Whether the file is the photo that the catalog describes.
bool IsPhoto(const struct stat& status, const WaitingPhoto& photo) {
  return S_ISREG(status.st_mode) && status.st_size == photo.size &&
         status.st_mtim.tv_sec == photo.lastModifiedDate;
}

/// Whether a photo has the extension and the first bytes of a camera's raw format. Files with a
/// wrong extension are rendered by their content.
bool IsRaw(const std::string& path, const util::FileDescriptor& file) {
  const std::string extension = catalog::ExtensionOf(path.substr(path.rfind('/') + 1));
  std::array<char, 8> bytes{};
  if (std::ranges::find(RAW_EXTENSIONS, extension) == RAW_EXTENSIONS.end() ||
      pread(file.Get(), bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
    return false;
  }
  const std::string_view begin(bytes.data(), bytes.size());
  return begin.starts_with("II") || begin.starts_with("MM") || begin.starts_with("FUJI");
}

/// Copies `size` bytes. Returns 0 or an errno; EAGAIN if there are not exactly so many.
int CopyExactly(const util::FileDescriptor& from, const util::FileDescriptor& to, long long size) {
  off_t offset = 0;
  while (offset < size) {
    const ssize_t count =
        sendfile(to.Get(), from.Get(), &offset, static_cast<std::size_t>(size - offset));
    if (count == 0) {
      return EAGAIN;
    }
    if (count == -1 && errno != EINTR) {
      return errno;
    }
  }
  char more = 0;
  return pread(from.Get(), &more, 1, size) == 0 ? 0 : EAGAIN;
}

} // namespace

Volume::Volume(std::string mountPoint, VolumeRoot::Kind kind)
    : mountPoint_(std::move(mountPoint)), kind_(kind) {}

std::size_t Volume::TakeChanges() {
  return std::exchange(changes_, 0);
}

bool Volume::HasWork() const {
  return !isExhausted_ && !lookAgainAt_;
}

bool Volume::HasSlow() const {
  return !slow_.empty() && !lookAgainAt_;
}

bool Volume::HasVanished() const {
  return hasVanished_ && !lookAgainAt_;
}

bool Volume::HasUncheckedRenditions() const {
  return !isChecked_ && !lookAgainAt_;
}

std::optional<Volume::Opened> Volume::Open() {
  VolumeRoot root(PathOf(mountPoint_), kind_);
  wasThere_ = true;
  struct statvfs fileSystem {};
  if (fstatvfs(root.Descriptor(), &fileSystem) == 0 && (fileSystem.f_flag & ST_RDONLY) != 0) {
    throw util::Exception(root.Path() + " is read-only: photos there are not rendered");
  }
  // The catalog is made, and made again if it is damaged, by the indexer.
  const std::string path = core::GetCatalogPath(root.Path()).substr(root.Path().size() + 1);
  const util::FileDescriptor file = root.Open(path, O_PATH);
  struct stat status {};
  if (!file || fstat(file.Get(), &status) != 0 || !S_ISREG(status.st_mode) || status.st_size == 0) {
    return std::nullopt;
  }
  auto database = catalog::ConnectToCatalog(root);
  if (!root.IsInPlace() || !catalog::HasOwnSchema(*database) || !HasIdentity(*database)) {
    return std::nullopt;
  }
  std::string identity = catalog::Identity(*database);
  return Opened{std::move(root), std::move(database), std::move(identity)};
}

void Volume::Attempt(const std::function<void()>& work) {
  try {
    work();
    lookAgainAt_.reset();
    spaceWhenFull_.reset();
    return;
  } catch (const std::string& failure) { // the database layer's
    using catalog::CatalogProblem;
    const CatalogProblem problem = catalog::ProblemOf(failure);
    if (problem == CatalogProblem::Full) {
      ReportFull(ErrorText(ENOSPC));
    } else {
      Report(failure, problem == CatalogProblem::Busy);
    }
  } catch (const VolumeFull& failure) {
    ReportFull(failure.what());
  } catch (const std::exception& failure) {
    Report(failure.what(), false);
  }
}

void Volume::ReportFull(const std::string& problem) {
  spaceWhenFull_ = FreeSpace(); // before others can read that it is full
  Report(problem, false);
  retryAt_ = *lookAgainAt_;
  lookAgainAt_ = Clock::now() + SPACE_CHECK;
}

void Volume::Report(const std::string& failure, bool isBusy) {
  const std::string path = PathOf(mountPoint_);
  const std::string problem = failure.starts_with(path) ? failure : path + ": " + failure;
  isBusy_ = isBusy;
  const auto now = Clock::now();
  if (isBusy_) {
    lockedSince_ = lockedSince_.value_or(now);
    lookAgainAt_ =
        now + std::min(SHORTEST_LOCK_PAUSE + (now - *lockedSince_) / 8, LONGEST_LOCK_PAUSE);
  } else {
    lookAgainAt_ = now + RETRY;
  }
  if (isBusy_ || problem == problem_) {
    return;
  }
  problem_ = problem;
  const std::string line = Printable(problem);
  if (IsThere()) {
    LogError(line);
  } else if (!wasThere_) {
    LogInfo(line);
  } // else it was unmounted, and its Unplugged follows
}

bool Volume::IsThere() const {
  return FreeSpace().has_value();
}

/// Bytes; nothing if the volume is not there.
std::optional<long long> Volume::FreeSpace() const {
  try {
    return VolumeRoot(PathOf(mountPoint_), kind_).FreeSpace();
  } catch (const util::Exception&) {
    return std::nullopt;
  }
}

void Volume::LookAgain() {
  const auto now = Clock::now();
  if (spaceWhenFull_ && now < retryAt_ && FreeSpace() <= spaceWhenFull_) {
    lookAgainAt_ = std::min(now + SPACE_CHECK, retryAt_);
  } else {
    Look();
  }
}

void Volume::Look() {
  isExhausted_ = true;
  lookAgainAt_.reset();
  EndPostponements();
  Attempt([this] {
    const auto volume = Open();
    if (!volume) {
      waiting_ = failed_ = 0;
      return;
    }
    Count(*volume->catalog);
    if (const bool wereRemoved = WereRenditionsRemoved(*volume);
        wereRemoved || identity_ != volume->identity) {
      identity_ = volume->identity;
      isChecked_ = false;
      nextToCheck_ = 0;
      otherFolders_.reset();
      slow_.clear();
    }
    last_.reset();
    isExhausted_ = waiting_ == 0;
    RemoveSomeVanished(*volume);
  });
}

void Volume::Count(const db::VolumeDB& catalog) {
  waiting_ = static_cast<std::size_t>(catalog::CountWaiting(catalog));
  failed_ = static_cast<std::size_t>(catalog::CountFailed(catalog));
}

/// Whether the folder of the renditions is not the one that was there.
bool Volume::WereRenditionsRemoved(const Opened& volume) {
  const util::FileDescriptor folder = volume.root.Open(catalog::RENDITIONS, O_PATH);
  struct stat status {};
  const auto former = renditions_;
  renditions_.reset();
  if (folder && fstat(folder.Get(), &status) == 0) {
    renditions_ = {status.st_dev, status.st_ino};
  }
  return former && renditions_ != former;
}

void Volume::RemoveVanished() {
  Attempt([this] {
    hasVanished_ = false; // until the next message
    const auto volume = Open();
    if (volume && volume->identity == identity_) {
      RemoveSomeVanished(*volume);
    }
  });
}

void Volume::RemoveSomeVanished(const Opened& volume) {
  const auto end = Clock::now() + PIECE;
  const std::vector<long long> removed = catalog::RemovedFiles(*volume.catalog, MOST_REMOVALS);
  std::vector<long long> done;
  bool isComplete = removed.size() < MOST_REMOVALS;
  for (const long long id : removed) {
    if (Clock::now() > end) {
      isComplete = false;
      break;
    }
    if (catalog::IsOnVolume(*volume.catalog, id) || RemoveRendition(volume.root, id)) {
      done.push_back(id);
    }
  }
  if (!done.empty()) {
    db::Transaction transaction(*volume.catalog, LOCK_TIMEOUT);
    for (const long long id : done) {
      catalog::ForgetRemovedFile(*volume.catalog, id);
    }
    transaction.Commit();
    lockedSince_.reset();
  }
  hasVanished_ = !isComplete && !done.empty();
  pieceAt_ = hasVanished_ ? Clock::now() + PIECE : pieceAt_;
}

std::unique_ptr<Batch> Volume::Stage(const std::string& path, const BatchLimits& limits,
                                     const IsInBatch& isInBatch) {
  std::unique_ptr<Batch> batch;
  Attempt([&] {
    const auto volume = Open();
    if (!volume || volume->identity != identity_) {
      isExhausted_ = true; // until the next message
      return;
    }
    // Does not render what cannot be written.
    struct statvfs fileSystem {};
    if (fstatvfs(volume->root.Descriptor(), &fileSystem) == 0 &&
        fileSystem.f_bavail < LARGEST_RENDITION / fileSystem.f_frsize) {
      throw VolumeFull(volume->root);
    }
    Batch next{.mountPoint = mountPoint_,
               .identity = volume->identity,
               .folder = StagingFolder(path),
               .isSlow = limits.isSlow};
    Room room{.limits = limits};
    needsSpace_ = limits.isSlow ? !StageSlow(*volume, isInBatch, next, room)
                                : !StageWaiting(*volume, isInBatch, next, room);
    if (!next.photos.empty()) {
      batch = std::make_unique<Batch>(std::move(next));
    }
  });
  return batch;
}

bool Volume::StageWaiting(const Opened& volume, const IsInBatch& isInBatch, Batch& batch,
                          Room& room) {
  std::size_t examined = 0;
  while (examined < MOST_EXAMINED) {
    const auto photos = last_ ? catalog::NewestWaiting(*volume.catalog, MOST_LISTED, *last_)
                              : catalog::NewestWaiting(*volume.catalog, MOST_LISTED);
    for (const WaitingPhoto& photo : photos) {
      if (!isInBatch(photo.id) && !IsSlow(photo) && !IsPostponed(photo) &&
          !StagePhoto(volume, photo, batch, room)) {
        return false;
      }
      ++examined;
      last_ = photo;
    }
    if (photos.size() < MOST_LISTED) {
      isExhausted_ = true;
      break;
    }
  }
  return true;
}

/// Takes the photos whose ids were given out last.
bool Volume::StageSlow(const Opened& volume, const IsInBatch& isInBatch, Batch& batch, Room& room) {
  while (!slow_.empty() && batch.photos.empty()) {
    const auto last = std::prev(slow_.end());
    if (!isInBatch(last->first) && !StagePhoto(volume, last->second, batch, room)) {
      return false;
    }
    slow_.erase(last);
  }
  return true;
}

bool Volume::IsSlow(const WaitingPhoto& photo) const {
  const auto slow = slow_.find(photo.id);
  return slow != slow_.end() && slow->second.lastModifiedDate == photo.lastModifiedDate &&
         slow->second.size == photo.size;
}

void Volume::AddSlow(const Batch& batch) {
  for (const BatchPhoto& photo : batch.photos) {
    if (photo.isSlow && !photo.isOutdated && slow_.size() < MOST_SLOW) {
      slow_.insert_or_assign(photo.photo.id, photo.photo);
    }
  }
}

/// Postpones the photo, or adds it to the batch as failed if that was done often enough.
void Volume::LeaveOut(BatchPhoto photo, Batch& batch) {
  if (!Postpone(photo.photo, photo.failure)) {
    batch.photos.push_back(std::move(photo));
  }
}

std::optional<Volume::Clock::time_point> Volume::LookAgainAt() const {
  return lookAgainAt_ ? lookAgainAt_ : endPostponementsAt_;
}

bool Volume::Postpone(const WaitingPhoto& photo, const std::string& reason) {
  if (postponed_.empty()) {
    LogInfo(Printable(mountPoint_ + photo.path) + " is tried again later: " + reason);
  }
  Postponed& entry = postponed_[photo.id];
  if (entry.lastModifiedDate != photo.lastModifiedDate || entry.size != photo.size) {
    entry = {.lastModifiedDate = photo.lastModifiedDate, .size = photo.size};
  }
  if (entry.times == MOST_POSTPONEMENTS) {
    postponed_.erase(photo.id);
    return false;
  }
  entry.until = Clock::now() + FIRST_POSTPONEMENT * (1 << entry.times);
  ++entry.times;
  endPostponementsAt_ = std::min(endPostponementsAt_.value_or(entry.until), entry.until);
  return true;
}

bool Volume::IsPostponed(const WaitingPhoto& photo) const {
  const auto entry = postponed_.find(photo.id);
  return entry != postponed_.end() && Clock::now() < entry->second.until &&
         entry->second.lastModifiedDate == photo.lastModifiedDate &&
         entry->second.size == photo.size;
}

/// Those that end later have to be ended then.
void Volume::EndPostponements() {
  const auto now = Clock::now();
  endPostponementsAt_.reset();
  std::erase_if(postponed_, [&](const auto& item) { return item.second.until + REMEMBERED < now; });
  for (const auto& [id, entry] : postponed_) {
    if (entry.until > now) {
      endPostponementsAt_ = std::min(endPostponementsAt_.value_or(entry.until), entry.until);
    }
  }
}

void Volume::PostponeOrFail(Batch& batch) {
  for (std::size_t number = 0; number < batch.photos.size(); ++number) {
    BatchPhoto& photo = batch.photos[number];
    const std::string obstacle = std::exchange(photo.obstacle, {});
    if (obstacle.empty() || photo.isOutdated) {
      continue;
    }
    batch.folder.Remove(number);
    if (!Postpone(photo.photo, obstacle)) {
      photo.failure = obstacle;
    }
  }
}

/// Adds a photo that cannot be opened to the batch, unless it is gone or the reason may pass.
void Volume::AddUnopened(BatchPhoto photo, int error, Batch& batch) {
  photo.failure = catalog::NOT_OPENED + ErrorText(error);
  switch (error) {
  case ENOENT:
  case ENOTDIR:
  case ELOOP:
  case EXDEV:  // a crafted row: the path leads out of the volume
    return;    // the indexer will notice that
  case EAGAIN: // another program has a lease on it
  case EINTR:
  case EMFILE:
  case ENFILE:
  case ENOMEM:
  case ESTALE:
    LeaveOut(std::move(photo), batch);
    return;
  default:
    batch.photos.push_back(std::move(photo));
  }
}

bool Volume::StagePhoto(const Opened& volume, const WaitingPhoto& photo, Batch& batch, Room& room) {
  const std::size_t number = batch.photos.size();
  if (number >= room.limits.photos) {
    return false;
  }
  // To open a device may have an effect: look before.
  struct stat status {};
  const util::FileDescriptor entry = volume.root.Open(photo.path, O_PATH);
  if (!entry) {
    AddUnopened({.photo = photo}, errno, batch);
    return true;
  }
  if (fstat(entry.Get(), &status) != 0 || !IsPhoto(status, photo)) {
    return true; // the indexer will notice what has changed
  }
  const util::FileDescriptor file = volume.root.Open(photo.path, O_RDONLY);
  if (!file) {
    AddUnopened({.photo = photo, .status = status}, errno, batch);
    return true;
  }
  if (fstat(file.Get(), &status) != 0 || !IsPhoto(status, photo)) {
    return true;
  }
  if (status.st_size > LARGEST_PHOTO) {
    batch.photos.push_back(
        {.photo = photo, .status = status, .failure = "the file is larger than 512 MiB"});
    return true;
  }
  if (status.st_size > room.limits.most) {
    batch.photos.push_back({.photo = photo,
                            .status = status,
                            .failure = util::FormatString("the file is larger than the %lld MiB "
                                                          "that copies of photos may take",
                                                          room.limits.most >> 20)});
    return true;
  }
  const long long limit = room.used == 0 ? room.limits.space : room.limits.bytes;
  if (room.used + status.st_size > limit) {
    if (!room.limits.isOnly || !batch.photos.empty()) {
      return false; // until the other batches have ended
    }
    LeaveOut({.photo = photo, .status = status, .failure = NO_SPACE}, batch);
    return true;
  }
  int error = CopyExactly(file, batch.folder.Add(number), status.st_size);
  struct stat after {};
  if (error == 0 && (fstat(file.Get(), &after) != 0 || !IsSameContent(status, after))) {
    error = EAGAIN;
  }
  if (error != 0) {
    batch.folder.Remove(number);
  }
  switch (error) {
  case 0:
    room.used += status.st_size;
    batch.photos.push_back({.photo = photo, .status = status, .isRaw = IsRaw(photo.path, file)});
    return true;
  case ENOSPC:
    if (!room.limits.isOnly || !batch.photos.empty()) {
      return false;
    }
    LeaveOut({.photo = photo, .status = status, .failure = NO_SPACE}, batch);
    return true;
  case EIO:
    batch.photos.push_back(
        {.photo = photo, .status = status, .failure = "cannot be read: " + ErrorText(error)});
    return true;
  default:
    return true; // it is being written
  }
}

Volume::Stored Volume::Store(const std::vector<Batch*>& batches) {
  isBusy_ = false;
  Attempt([&] {
    const auto volume = Open();
    std::vector<Batch*> useful = batches;
    std::erase_if(useful, [&volume](const Batch* batch) {
      return !volume || volume->identity != batch->identity;
    });
    if (useful.empty()) {
      return;
    }
    {
      const db::Transaction attempt(*volume->catalog, LOCK_TIMEOUT);
    } // The renditions are written only if it was not locked.
    std::set<long long> written;
    for (Batch* const batch : useful) {
      written.merge(WriteRenditions(*volume, *batch));
      PostponeOrFail(*batch);
    }
    MarkResults(*volume, useful, written);
    std::ranges::for_each(useful, [this](const Batch* batch) { AddSlow(*batch); });
    lockedSince_.reset();
    problem_.clear();
  });
  if (isBusy_) {
    storeAt_ = lookAgainAt_.value_or(storeAt_);
  }
  return isBusy_ ? Stored::Later : Stored::Done;
}

std::set<long long> Volume::WriteRenditions(const Opened& volume, Batch& batch) {
  RenditionWriter writer(volume.root);
  std::set<long long> written;
  for (std::size_t number = 0; number < batch.photos.size(); ++number) {
    BatchPhoto& photo = batch.photos[number];
    const util::FileDescriptor file = volume.root.Open(photo.photo.path, O_PATH);
    struct stat status {};
    if (file) {
      photo.isOutdated = fstat(file.Get(), &status) != 0 || !IsSameContent(status, photo.status);
    } else {
      photo.isOutdated = photo.status.st_nlink != 0; // it could be opened before
    }
    if (photo.isOutdated || !photo.obstacle.empty() || !photo.failure.empty()) {
      continue;
    }
    const util::FileDescriptor rendition = batch.folder.OpenOutput(number);
    if (IsRendition(rendition)) {
      writer.Add(photo.photo.id, rendition, status,
                 catalog::RenditionAccess(volume.root, FolderOf(photo.photo.path))
                     .ModeFor(status.st_mode, status.st_gid));
      written.insert(photo.photo.id);
    }
  }
  for (const long long id : writer.Publish()) {
    written.erase(id);
    ReportObstacle(catalog::RenditionPath(id) + " is a folder: it stays, and its photo waits");
  }
  return written;
}

void Volume::MarkResults(const Opened& volume, const std::vector<Batch*>& batches,
                         const std::set<long long>& written) {
  std::vector<long long> withoutRendition;
  std::size_t changes = 0;
  {
    db::Transaction transaction(*volume.catalog, catalog::BUSY_TIMEOUT);
    const std::time_t stamp = catalog::NextStamp(*volume.catalog, std::time(nullptr));
    for (const Batch* const batch : batches) {
      for (const BatchPhoto& photo : batch->photos) {
        const long long id = photo.photo.id;
        if (photo.isOutdated) {
          continue;
        }
        if (!photo.failure.empty()) {
          if (catalog::MarkFailed(*volume.catalog, photo.photo, photo.failure, stamp)) {
            withoutRendition.push_back(id);
            ++changes;
          }
        } else if (written.contains(id)) {
          if (catalog::MarkFinished(*volume.catalog, photo.photo, stamp)) {
            ++changes;
          } else if (!catalog::IsOnVolume(*volume.catalog, id)) {
            withoutRendition.push_back(id); // its removal was perhaps handled before
          }
        }
      }
    }
    if (changes > 0) {
      transaction.Commit();
      storeAt_ = Clock::now() + catalog::PauseAfterStamp(stamp, std::time(nullptr));
    }
  }
  changes_ += changes;
  for (const long long id : withoutRendition) {
    RemoveRendition(volume.root, id);
  }
  Count(*volume.catalog);
}

void Volume::CheckRenditions(const IsInBatch& isInBatch) {
  Attempt([&] {
    const auto volume = Open();
    if (!volume || volume->identity != identity_) {
      isChecked_ = true; // until the next message
      identity_.clear();
      return;
    }
    const auto end = Clock::now() + PIECE;
    while (!isChecked_ && Clock::now() < end) {
      CheckNextFolder(*volume, isInBatch);
    }
    pieceAt_ = isChecked_ ? pieceAt_ : Clock::now() + PIECE;
  });
}

void Volume::CheckNextFolder(const Opened& volume, const IsInBatch& isInBatch) {
  constexpr long long LAST = std::numeric_limits<long long>::max() - RENDITIONS_PER_FOLDER;
  const db::VolumeDB& catalog = *volume.catalog;
  const std::vector<long long> next = catalog::ListedPhotos(catalog, nextToCheck_, 1);
  if (next.empty() || next.front() > LAST) {
    CheckNextOtherFolder(volume, isInBatch);
    return;
  }
  const long long first = next.front() - next.front() % RENDITIONS_PER_FOLDER;
  nextToCheck_ = first + RENDITIONS_PER_FOLDER;
  auto expected = catalog::ListedPhotos(catalog, first, RENDITIONS_PER_FOLDER);
  std::erase_if(expected, [this](long long id) { return id >= nextToCheck_; });
  const auto missing = CheckFolder(volume.root, first, expected, isInBatch);
  if (!missing.empty()) {
    db::Transaction transaction(catalog, LOCK_TIMEOUT);
    for (const long long id : missing) {
      catalog::MarkMissing(catalog, id);
    }
    transaction.Commit();
    lockedSince_.reset();
    Count(catalog);
    last_.reset();
    isExhausted_ = false;
  }
}

void Volume::CheckNextOtherFolder(const Opened& volume, const IsInBatch& isInBatch) {
  if (!otherFolders_) {
    otherFolders_ = ListFolders(volume.root);
  } else if (otherFolders_->empty()) {
    otherFolders_.reset();
    isChecked_ = true;
  } else {
    const long long first = otherFolders_->back();
    otherFolders_->pop_back();
    const auto listed = catalog::ListedPhotos(*volume.catalog, first, 1);
    if (listed.empty() || listed.front() >= first + RENDITIONS_PER_FOLDER) {
      CheckFolder(volume.root, first, {}, isInBatch);
      RemoveEmptyFolder(volume.root, first);
    }
  }
}

void Volume::ReportObstacle(const std::string& text) {
  if (!hasReportedObstacle_) {
    hasReportedObstacle_ = true;
    LogError(Printable(mountPoint_ + text));
  }
}

} // namespace orva::transcoder

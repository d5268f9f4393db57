#pragma once

#include "Batch.h"

#include "Renditions.h"
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
#include <utility>
#include <vector>

namespace orva::db {
class VolumeDB;
} // namespace orva::db

namespace orva::transcoder {

/// How much one batch may take.
struct BatchLimits {
  std::size_t photos = 0;
  long long bytes = 0; ///< for the copies of several photos
  long long space = 0; ///< bytes for the copy of a single photo
  long long most = 0;  ///< the same when nothing else is there
  bool isOnly = true;  ///< there is no other batch
  bool isSlow = false; ///< a single slow photo
};

/// A volume whose photos are rendered. Each operation is one piece of work: it opens the volume and
/// its catalog and closes both before it returns. Nothing is thrown; what fails is logged once and
/// tried again later. Used by one thread.
class Volume {
public:
  using Clock = std::chrono::steady_clock;
  /// Whether the photo with this id is in a batch.
  using IsInBatch = std::function<bool(long long)>;

  Volume(std::string mountPoint, catalog::VolumeRoot::Kind kind);

  const std::string& MountPoint() const noexcept { return mountPoint_; }
  /// The identity of its catalog; empty while that is not known.
  const std::string& Identity() const noexcept { return identity_; }
  std::size_t Waiting() const noexcept { return waiting_; }
  std::size_t Failed() const noexcept { return failed_; }

  /// Something has happened on the volume: looks for photos that wait, and removes renditions like
  /// RemoveVanished.
  void Look();

  /// Whether renditions of photos that have vanished may be left.
  bool HasVanished() const;

  /// Removes some of them: one piece of work of limited time.
  void RemoveVanished();

  /// Whether Stage may find photos that are not slow.
  bool HasWork() const;

  /// Whether Stage may find slow photos: those that a batch did not render in the usual time.
  bool HasSlow() const;

  /// Whether Stage found no space for the copies when it was last called.
  bool NeedsSpace() const noexcept { return needsSpace_; }

  /// Copies the next photos that wait to a new folder at `path`. Returns nothing if there are none
  /// now, or if there is no space for the copies.
  std::unique_ptr<Batch> Stage(const std::string& path, const BatchLimits& limits,
                               const IsInBatch& isInBatch);

  /// Result of Store.
  enum class Stored {
    Done,  ///< including the case that the batches have become useless
    Later, ///< another program uses the catalog: the same call may work at StoreAt
  };

  /// Writes the renditions of the batches to the volume and their results to the catalog, with one
  /// stamp. Not before StoreAt.
  Stored Store(const std::vector<Batch*>& batches);
  Clock::time_point StoreAt() const noexcept { return storeAt_; }

  /// Whether the renditions on the volume still have to be compared with the catalog.
  bool HasUncheckedRenditions() const;

  /// Compares some of them: a photo without its rendition waits again, and a file without its photo
  /// is removed.
  void CheckRenditions(const IsInBatch& isInBatch);

  /// When RemoveVanished or CheckRenditions is due. In the pause before, the volume can be
  /// unmounted.
  Clock::time_point PieceAt() const noexcept { return pieceAt_; }

  /// When LookAgain is due although nothing was announced.
  std::optional<Clock::time_point> LookAgainAt() const;

  /// Looks for photos that wait, unless the volume is still full.
  void LookAgain();

  /// Photos that were finished or have failed since the last call.
  std::size_t TakeChanges();

private:
  /// The open volume.
  struct Opened {
    catalog::VolumeRoot root;
    std::unique_ptr<db::VolumeDB> catalog;
    std::string identity{};
  };
  /// A photo that could not be rendered, for a reason that may pass.
  struct Postponed {
    std::time_t lastModifiedDate = 0;
    long long size = 0;
    int times = 0;
    Clock::time_point until{};
  };
  /// What is left for a batch.
  struct Room {
    BatchLimits limits;
    long long used = 0; ///< bytes of the copies
  };

  /// Returns nothing if the catalog is missing, not one of ours, or just being made.
  std::optional<Opened> Open();
  bool IsThere() const;
  std::optional<long long> FreeSpace() const;
  void Attempt(const std::function<void()>& work);
  void Report(const std::string& failure, bool isBusy);
  void ReportFull(const std::string& problem);
  void Count(const db::VolumeDB& catalog);
  bool WereRenditionsRemoved(const Opened& volume);
  void RemoveSomeVanished(const Opened& volume);
  /// Leaves the photo out for some time. Returns false if that was done often enough.
  bool Postpone(const catalog::WaitingPhoto& photo, const std::string& reason);
  bool IsPostponed(const catalog::WaitingPhoto& photo) const;
  void EndPostponements();
  void PostponeOrFail(Batch& batch);
  bool IsSlow(const catalog::WaitingPhoto& photo) const;
  void AddSlow(const Batch& batch);
  void LeaveOut(BatchPhoto photo, Batch& batch);
  /// Both return false if the batch has no room for the next photo.
  bool StageWaiting(const Opened& volume, const IsInBatch& isInBatch, Batch& batch, Room& room);
  bool StageSlow(const Opened& volume, const IsInBatch& isInBatch, Batch& batch, Room& room);
  void AddUnopened(BatchPhoto photo, int error, Batch& batch);
  /// Adds the photo to the batch, or leaves it out until the next message. Returns false if the
  /// batch has no room for it.
  bool StagePhoto(const Opened& volume, const catalog::WaitingPhoto& photo, Batch& batch,
                  Room& room);
  /// Returns the ids of the photos whose renditions are in their places.
  std::set<long long> WriteRenditions(const Opened& volume, Batch& batch);
  void MarkResults(const Opened& volume, const std::vector<Batch*>& batches,
                   const std::set<long long>& written);
  void ReportObstacle(const std::string& text);
  void CheckNextFolder(const Opened& volume, const IsInBatch& isInBatch);
  void CheckNextOtherFolder(const Opened& volume, const IsInBatch& isInBatch);

  const std::string mountPoint_; ///< ends in "/"
  const catalog::VolumeRoot::Kind kind_;
  bool wasThere_ = false;    ///< it was opened before
  bool isExhausted_ = true;  ///< all that wait were staged or left out
  bool needsSpace_ = false;  ///< the last batch had no room for a photo
  bool isChecked_ = true;    ///< all renditions are
  bool hasVanished_ = false; ///< photos, whose renditions may be left
  bool hasReportedObstacle_ = false;
  bool isBusy_ = false;  ///< another program used the catalog when work last failed
  std::string identity_; ///< of the catalog when it was last looked at
  std::size_t waiting_ = 0;
  std::size_t failed_ = 0;
  std::size_t changes_ = 0;
  std::optional<catalog::WaitingPhoto> last_;       ///< that was staged or left out
  std::map<long long, catalog::WaitingPhoto> slow_; ///< by id, until they are staged
  std::map<long long, Postponed> postponed_;        ///< by id
  std::optional<Clock::time_point> endPostponementsAt_;
  std::optional<std::pair<dev_t, ino_t>> renditions_; ///< the folder, when last looked at
  long long nextToCheck_ = 0;                         ///< id
  /// First ids of the folders that are examined after those that the catalog needs.
  std::optional<std::vector<long long>> otherFolders_;
  Clock::time_point pieceAt_{};
  std::string problem_; ///< as it was last logged, until renditions are written again
  Clock::time_point storeAt_{};
  std::optional<Clock::time_point> lockedSince_; ///< the catalog, by another program
  std::optional<Clock::time_point> lookAgainAt_;
  std::optional<long long> spaceWhenFull_; ///< bytes that were free; nothing if it is not full
  Clock::time_point retryAt_{};            ///< of a full volume
};

} // namespace orva::transcoder

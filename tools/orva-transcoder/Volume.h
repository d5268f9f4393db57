#pragma once

#include "Batch.h"

#include "Renditions.h"
#include "VolumeRoot.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>

namespace orva::db {
class VolumeDB;
} // namespace orva::db

namespace orva::transcoder {

/// How much one batch may take.
struct BatchLimits {
  std::size_t photos = 0;
  long long bytes = 0; ///< for the copies of several photos
  long long space = 0; ///< bytes for the copy of a single photo
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
  std::size_t Waiting() const noexcept { return waiting_; }
  std::size_t Failed() const noexcept { return failed_; }

  /// Something has happened on the volume: looks for photos that wait, and removes the renditions
  /// of photos that have vanished.
  void Look();

  /// Whether Stage may find photos.
  bool HasWork() const;

  /// Copies the next photos that wait to a new folder at `path`. Returns nothing if there are none
  /// now, or if there is no space for the copies.
  std::unique_ptr<Batch> Stage(const std::string& path, const BatchLimits& limits,
                               const IsInBatch& isInBatch);

  /// Result of Store.
  enum class Stored {
    Done,  ///< including the case that the batch has become useless
    Later, ///< another program uses the catalog: the same call may work in some seconds
  };

  /// Writes the renditions of a batch to the volume and its results to the catalog.
  Stored Store(Batch& batch);

  /// Whether the renditions on the volume still have to be compared with the catalog.
  bool HasUncheckedRenditions() const;

  /// Compares some of them: a photo without its rendition waits again, and a file without its photo
  /// is removed.
  void CheckRenditions(const IsInBatch& isInBatch);

  /// When the volume has to be looked at again although nothing was announced.
  std::optional<Clock::time_point> LookAgainAt() const noexcept { return lookAgainAt_; }

  /// Photos that were finished or have failed since the last call.
  std::size_t TakeChanges();

private:
  /// The open volume.
  struct Opened {
    catalog::VolumeRoot root;
    std::unique_ptr<db::VolumeDB> catalog;
    std::string identity{};
  };
  /// What is left for a batch.
  struct Room {
    BatchLimits limits;
    long long used = 0; ///< bytes of the copies
  };

  /// Returns nothing if the catalog is missing, not one of ours, or just being made.
  std::optional<Opened> Open();
  bool IsThere() const;
  void Attempt(const std::function<void()>& work);
  void Report(const std::string& problem, bool isBusy);
  void Count(const db::VolumeDB& catalog);
  void RemoveVanished(const Opened& volume);
  /// Adds the photo to the batch, or leaves it out until the next message. Returns false if the
  /// batch has no room for it.
  bool StagePhoto(const Opened& volume, const catalog::WaitingPhoto& photo, Batch& batch,
                  Room& room);
  /// Returns the ids of the photos whose renditions are in their places.
  std::set<long long> WriteRenditions(const Opened& volume, Batch& batch);
  void MarkResults(const Opened& volume, const Batch& batch, const std::set<long long>& written);
  void ReportObstacle(const std::string& text);
  void CheckNextFolder(const Opened& volume, const IsInBatch& isInBatch);
  void RemoveOtherFolders(const Opened& volume, const IsInBatch& isInBatch);

  const std::string mountPoint_; ///< ends in "/"
  const catalog::VolumeRoot::Kind kind_;
  bool wasThere_ = false; ///< it was opened before
  std::string identity_;  ///< of the catalog when it was last looked at
  std::size_t waiting_ = 0;
  std::size_t failed_ = 0;
  std::size_t changes_ = 0;
  bool isExhausted_ = true;                   ///< all that wait were staged or left out
  std::optional<catalog::WaitingPhoto> last_; ///< that was staged or left out
  long long nextToCheck_ = 0;                 ///< id
  bool isChecked_ = true;                     ///< all renditions are
  bool hasReportedObstacle_ = false;
  std::string problem_; ///< as it was last logged, until renditions are written again
  bool isBusy_ = false; ///< another program used the catalog when work last failed
  std::optional<Clock::time_point> lookAgainAt_;
};

} // namespace orva::transcoder

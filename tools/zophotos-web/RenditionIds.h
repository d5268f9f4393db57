#pragma once

#include "SnapshotReader.h"
#include "VolumePaths.h"
#include "WorkWatch.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

namespace orva::catalog {
class VolumeRoot;
}

namespace orva::web {

/// Knows which rendition belongs to which photo: its name is the id of the photo in the catalog of
/// its volume. A catalog is open only while photos are looked up in it: all that pages show, at
/// once. What was found is kept as long as the catalog is the same file. Any thread.
class RenditionIds {
public:
  using Log = std::function<void(const std::string&)>;

  /// `log` gets a line when a catalog cannot be read.
  explicit RenditionIds(Log log) : log_(std::move(log)) {}

  /// These photos will be looked up soon.
  void Expect(const std::vector<Photo>& photos);

  /// The id of the photo at `path` on `volume`. Nothing if the catalog does not have it, or cannot
  /// be read at the moment.
  std::optional<std::int64_t> Find(PhotoId photo, const VolumePath& path,
                                   const catalog::VolumeRoot& volume);

private:
  using Clock = std::chrono::steady_clock;

  struct Wanted {
    PhotoId photo = 0;
    VolumePath path;

    /// Identifies the photo among those of all catalogs. A path can have another photo later, and
    /// an id of a photo can be used again.
    std::string KeyIn(const std::string& catalog) const {
      return catalog + std::to_string(photo) + ' ' + path.relative;
    }
  };

  /// Ids that were found, by Wanted::KeyIn. Forgets the older ones when there are many.
  class Found {
  public:
    std::optional<std::int64_t> Find(const std::string& key) const;
    void Add(const std::string& key, std::int64_t id);

  private:
    static constexpr std::size_t MOST_BYTES = 2 << 20; ///< of each of the two
    std::unordered_map<std::string, std::int64_t> newer_;
    std::unordered_map<std::string, std::int64_t> older_;
    std::size_t bytes_ = 0; ///< of newer_
  };

  struct Volume {
    std::mutex lookUp;         ///< held while the catalog is read; taken before mutex_
    Clock::time_point nextTry; ///< after a failure
    bool hasFailed = false;
  };

  std::shared_ptr<Volume> VolumeAt(const std::string& root);
  std::optional<std::int64_t> FindKnown(const std::string& key);
  std::vector<Wanted> TakeExpected(const std::string& catalog, const std::string& root);
  void LookUp(Volume& known, const std::string& catalog, const Wanted& wanted,
              const catalog::VolumeRoot& volume);

  Log log_;
  WorkWatch watch_;
  std::mutex mutex_;                                       ///< of the following, and what it holds
  std::map<std::string, std::shared_ptr<Volume>> volumes_; ///< by their folders
  std::deque<Wanted> expected_;
  Found found_;
};

} // namespace orva::web

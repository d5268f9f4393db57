#pragma once

#include "SnapshotReader.h"
#include "VolumePaths.h"
#include "WorkWatch.h"

#include <sys/types.h>

#include <array>
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
#include <utility>
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

  /// Identifies a catalog file.
  struct Identity {
    std::uint64_t device = 0;
    std::uint64_t inode = 0;
    std::int64_t birth = 0; ///< nanoseconds since the epoch; 0 for unknown

    bool operator==(const Identity&) const = default;
  };

  /// Ids that were found. Forgets the older ones when there are many.
  class Found {
  public:
    const std::int64_t* Find(PhotoId photo) const;
    void Add(PhotoId photo, std::int64_t id);

  private:
    static constexpr std::size_t MOST = 20'000;
    std::unordered_map<PhotoId, std::int64_t> newer_;
    std::unordered_map<PhotoId, std::int64_t> older_;
  };

  struct Volume {
    std::mutex lookUp; ///< held while the catalog is read; taken before mutex_
    Identity catalog;  ///< that `found` is of
    Found found;
    std::deque<std::pair<PhotoId, std::string>> expected; ///< and paths on the volume
    Clock::time_point nextTry{};                          ///< after a failure
    bool hasFailed = false;
  };

  static std::optional<Identity> Identify(const catalog::VolumeRoot& volume);

  std::shared_ptr<Volume> VolumeAt(const std::string& root);
  std::optional<std::int64_t> FindKnown(Volume& volume, const Identity& catalog, PhotoId photo);
  void LookUp(Volume& known, const Identity& catalog, PhotoId photo, const VolumePath& path,
              const catalog::VolumeRoot& volume);

  Log log_;
  WorkWatch watch_;
  std::mutex mutex_;                                       ///< of the following, and what it holds
  std::map<std::string, std::shared_ptr<Volume>> volumes_; ///< by their folders
};

} // namespace orva::web

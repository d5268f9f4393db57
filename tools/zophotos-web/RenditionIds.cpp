#include "RenditionIds.h"

#include "Catalog.h"

#include "catalog/VolumeRoot.h"

#include "orvautil/Core.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>

namespace orva::web {
namespace {

constexpr std::size_t MOST_VOLUMES = 256;
constexpr std::size_t MOST_EXPECTED = 1'000;

/// How many are looked up at once: the first of them is waited for.
constexpr std::size_t MOST_AT_ONCE = 200;

/// After a catalog could not be read.
constexpr std::chrono::seconds PAUSE(5);

/// The reason in an error message of the database layer, without the place in the source and the
/// statement.
std::string ReasonOf(const std::string& message) {
  const std::size_t colon = message.find(": ");
  const std::size_t begin = colon == std::string::npos ? 0 : colon + 2;
  return message.substr(begin, message.find(" (extended code ", begin) - begin);
}

} // namespace

const std::int64_t* RenditionIds::Found::Find(PhotoId photo) const {
  for (const auto* const ids : {&newer_, &older_}) {
    const auto found = ids->find(photo);
    if (found != ids->end()) {
      return &found->second;
    }
  }
  return nullptr;
}

void RenditionIds::Found::Add(PhotoId photo, std::int64_t id) {
  if (newer_.size() >= MOST / 2) {
    older_ = std::exchange(newer_, {});
  }
  newer_[photo] = id;
}

void RenditionIds::Expect(const std::vector<Photo>& photos) {
  for (const Photo& photo : photos) {
    const auto path = Locate(photo);
    if (!path) {
      continue;
    }
    const auto volume = VolumeAt(path->root);
    const std::lock_guard lock(mutex_);
    if (volume->found.Find(photo.id) == nullptr) {
      volume->expected.emplace_back(photo.id, path->relative);
    }
    if (volume->expected.size() > MOST_EXPECTED) {
      volume->expected.pop_front();
    }
  }
}

std::optional<std::int64_t> RenditionIds::Find(PhotoId photo, const VolumePath& path,
                                               const catalog::VolumeRoot& volume) {
  const auto known = VolumeAt(path.root);
  auto catalog = Identify(volume);
  if (!catalog) {
    return std::nullopt;
  }
  if (const auto id = FindKnown(*known, *catalog, photo)) {
    return id;
  }
  const std::lock_guard lookUp(known->lookUp);
  catalog = Identify(volume);
  if (!catalog) {
    return std::nullopt;
  }
  if (const auto id = FindKnown(*known, *catalog, photo)) {
    return id; // by another thread meanwhile
  }
  LookUp(*known, *catalog, photo, path, volume);
  return FindKnown(*known, *catalog, photo);
}

std::optional<RenditionIds::Identity> RenditionIds::Identify(const catalog::VolumeRoot& volume) {
  const util::FileDescriptor file = volume.Open(core::GetCatalogPath(""), O_PATH);
  struct statx status {};
  if (!file || statx(file.Get(), "", AT_EMPTY_PATH, STATX_INO | STATX_BTIME, &status) != 0) {
    return std::nullopt;
  }
  return Identity{.device = std::uint64_t{status.stx_dev_major} << 32 | status.stx_dev_minor,
                  .inode = status.stx_ino,
                  .birth = status.stx_btime.tv_sec * 1'000'000'000 + status.stx_btime.tv_nsec};
}

std::shared_ptr<RenditionIds::Volume> RenditionIds::VolumeAt(const std::string& root) {
  const std::lock_guard lock(mutex_);
  if (volumes_.size() >= MOST_VOLUMES && !volumes_.contains(root)) {
    volumes_.clear();
  }
  auto& volume = volumes_[root];
  if (volume == nullptr) {
    volume = std::make_shared<Volume>();
  }
  return volume;
}

std::optional<std::int64_t> RenditionIds::FindKnown(Volume& volume, const Identity& catalog,
                                                    PhotoId photo) {
  const std::lock_guard lock(mutex_);
  if (volume.catalog != catalog) {
    volume.catalog = catalog;
    volume.found = {};
  }
  const std::int64_t* const id = volume.found.Find(photo);
  return id == nullptr ? std::nullopt : std::optional(*id);
}

/// Reads the ids of `photo` and of those that are expected.
void RenditionIds::LookUp(Volume& known, const Identity& catalog, PhotoId photo,
                          const VolumePath& path, const catalog::VolumeRoot& volume) {
  std::vector<PhotoId> photos{photo};
  std::vector<std::string> paths{path.relative};
  {
    const std::lock_guard lock(mutex_);
    if (Clock::now() < known.nextTry) {
      return;
    }
    while (!known.expected.empty() && photos.size() < MOST_AT_ONCE) {
      photos.push_back(known.expected.back().first);
      paths.push_back(std::move(known.expected.back().second));
      known.expected.pop_back();
    }
  }
  try {
    const auto ids = FindFileIds(volume, paths, watch_);
    const bool isSame = Identify(volume) == catalog;
    const std::lock_guard lock(mutex_);
    known.hasFailed = false;
    for (std::size_t i = 0; isSame && i < photos.size(); ++i) {
      if (ids[i]) {
        known.found.Add(photos[i], *ids[i]);
      }
    }
  } catch (const std::string& reason) {
    const std::lock_guard lock(mutex_);
    known.nextTry = Clock::now() + PAUSE;
    if (!std::exchange(known.hasFailed, true)) {
      log_("cannot read the catalog of " + path.root + ": " + ReasonOf(reason));
    }
  }
}

} // namespace orva::web

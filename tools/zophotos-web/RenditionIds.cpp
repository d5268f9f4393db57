#include "RenditionIds.h"

#include "Catalog.h"

#include "catalog/VolumeRoot.h"

#include "orvautil/Core.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <utility>

namespace orva::web {
namespace {

constexpr std::size_t MOST_VOLUMES = 256;
constexpr std::size_t MOST_EXPECTED = 1'000;

/// How many are looked up at once, while a request waits.
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

/// Identifies the catalog of a volume; nothing if it has none.
std::optional<std::string> Identify(const catalog::VolumeRoot& volume) {
  const util::FileDescriptor file = volume.Open(core::GetCatalogPath(""), O_PATH);
  struct statx status {};
  if (!file || statx(file.Get(), "", AT_EMPTY_PATH, STATX_INO | STATX_BTIME, &status) != 0) {
    return std::nullopt;
  }
  std::string identity;
  for (const std::uint64_t number :
       {std::uint64_t{status.stx_dev_major}, std::uint64_t{status.stx_dev_minor},
        std::uint64_t{status.stx_ino}, static_cast<std::uint64_t>(status.stx_btime.tv_sec),
        std::uint64_t{status.stx_btime.tv_nsec}}) {
    identity += std::to_string(number) + ' ';
  }
  return identity;
}

} // namespace

std::optional<std::int64_t> RenditionIds::Found::Find(const std::string& key) const {
  for (const auto* const ids : {&newer_, &older_}) {
    const auto found = ids->find(key);
    if (found != ids->end()) {
      return found->second;
    }
  }
  return std::nullopt;
}

void RenditionIds::Found::Add(const std::string& key, std::int64_t id) {
  constexpr std::size_t OVERHEAD = 100;
  if (bytes_ >= MOST_BYTES) {
    older_ = std::exchange(newer_, {});
    bytes_ = 0;
  }
  newer_[key] = id;
  bytes_ += key.size() + OVERHEAD;
}

void RenditionIds::Expect(const std::vector<Photo>& photos) {
  const std::lock_guard lock(mutex_);
  for (const Photo& photo : photos) {
    if (auto path = Locate(photo)) {
      expected_.push_back({.photo = photo.id, .path = std::move(*path)});
    }
    if (expected_.size() > MOST_EXPECTED) {
      expected_.pop_front();
    }
  }
}

std::optional<std::int64_t> RenditionIds::Find(PhotoId photo, const VolumePath& path,
                                               const catalog::VolumeRoot& volume) {
  const Wanted wanted{.photo = photo, .path = path};
  auto catalog = Identify(volume);
  if (!catalog) {
    return std::nullopt;
  }
  if (const auto id = FindKnown(wanted.KeyIn(*catalog))) {
    return id;
  }
  const auto known = VolumeAt(path.root);
  const std::lock_guard lookUp(known->lookUp);
  catalog = Identify(volume);
  if (!catalog) {
    return std::nullopt;
  }
  if (const auto id = FindKnown(wanted.KeyIn(*catalog))) {
    return id; // by another thread meanwhile
  }
  LookUp(*known, *catalog, wanted, volume);
  return FindKnown(wanted.KeyIn(*catalog));
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

std::optional<std::int64_t> RenditionIds::FindKnown(const std::string& key) {
  const std::lock_guard lock(mutex_);
  return found_.Find(key);
}

/// Photos that are expected on a volume and not known, the latest first.
std::vector<RenditionIds::Wanted> RenditionIds::TakeExpected(const std::string& catalog,
                                                             const std::string& root) {
  std::vector<Wanted> photos;
  const std::lock_guard lock(mutex_);
  for (auto expected = expected_.end();
       expected != expected_.begin() && photos.size() < MOST_AT_ONCE;) {
    --expected;
    if (expected->path.root != root) {
      continue;
    }
    if (!found_.Find(expected->KeyIn(catalog))) {
      photos.push_back(std::move(*expected));
    }
    expected = expected_.erase(expected);
  }
  return photos;
}

/// Reads the ids of `wanted` and of those that are expected.
void RenditionIds::LookUp(Volume& known, const std::string& catalog, const Wanted& wanted,
                          const catalog::VolumeRoot& volume) {
  {
    const std::lock_guard lock(mutex_);
    if (Clock::now() < known.nextTry) {
      return;
    }
  }
  std::vector<Wanted> photos = TakeExpected(catalog, wanted.path.root);
  photos.push_back(wanted);
  std::vector<std::string> paths;
  paths.reserve(photos.size());
  for (const Wanted& photo : photos) {
    paths.push_back(photo.path.relative);
  }
  try {
    const auto ids = FindFileIds(volume, paths, watch_);
    const bool isSame = Identify(volume) == catalog;
    const std::lock_guard lock(mutex_);
    known.hasFailed = false;
    for (std::size_t i = 0; isSame && i < photos.size(); ++i) {
      if (ids[i]) {
        found_.Add(photos[i].KeyIn(catalog), *ids[i]);
      }
    }
  } catch (const std::string& reason) {
    const std::lock_guard lock(mutex_);
    known.nextTry = Clock::now() + PAUSE;
    if (!std::exchange(known.hasFailed, true)) {
      log_("cannot read the catalog of " + wanted.path.root + ": " + ReasonOf(reason));
    }
  }
}

} // namespace orva::web

#include "SnapshotTest.h"

#include "zophotos/Failure.h"

#include <filesystem>

namespace orva::test {

Shown ReadAll(const web::Snapshot& snapshot) {
  constexpr std::size_t page = 7;
  web::SnapshotReader reader(snapshot);
  Shown shown;
  std::optional<web::PhotoId> before;
  for (auto photos = reader.Photos({}, before, page); !photos.empty();
       photos = reader.Photos({}, before, page)) {
    shown.photos.insert(shown.photos.end(), photos.begin(), photos.end());
    before = photos.back().id;
  }
  std::vector<std::int64_t> parents{-1};
  while (!parents.empty()) {
    const std::int64_t parent = parents.back();
    parents.pop_back();
    std::optional<web::Folder> after;
    for (auto folders = reader.Folders(parent, after, page); !folders.empty();
         folders = reader.Folders(parent, after, page)) {
      shown.folders.insert(shown.folders.end(), folders.begin(), folders.end());
      for (const web::Folder& folder : folders) {
        parents.push_back(folder.id);
      }
      after = folders.back();
    }
  }
  shown.volumes = reader.Volumes();
  return shown;
}

std::vector<std::string> NamesOf(const std::vector<web::Photo>& photos) {
  std::vector<std::string> names;
  for (const web::Photo& photo : photos) {
    names.push_back(photo.name);
  }
  return names;
}

web::Filter InVolume(const std::string& volume) {
  web::Filter filter;
  filter.volume = volume;
  return filter;
}

web::Filter WithWords(const std::string& words) {
  web::Filter filter;
  filter.words = words;
  return filter;
}

SnapshotTest::SnapshotTest() {
  for (const char* const path : {"/tmp/merged", "/tmp/other", "/tmp/cache"}) {
    std::filesystem::remove_all(path);
  }
}

void SnapshotTest::Start() {
  reader_.reset();
  snapshot_.reset();
  snapshot_ = std::make_unique<web::Snapshot>(CACHE, FindPath());
  reader_ = std::make_unique<web::SnapshotReader>(*snapshot_);
}

bool SnapshotTest::Update() {
  bool hasChanged = false;
  while (snapshot_->Update()) {
    hasChanged = true;
  }
  return hasChanged;
}

std::unique_ptr<web::Snapshot> SnapshotTest::BuildAnother() {
  auto another =
      std::make_unique<web::Snapshot>("/tmp/another-" + std::to_string(++others_), FindPath());
  another->Update();
  return another;
}

web::Snapshot::FindPath SnapshotTest::FindPath() {
  return [this] {
    if (path_.empty()) {
      throw zophotos::Failure(zophotos::ExitStatus::NoDatabase, "no merged database");
    }
    return path_;
  };
}

std::vector<std::string> SnapshotTest::Names(const web::Filter& filter) {
  return NamesOf(reader_->Photos(filter, std::nullopt, 1000));
}

} // namespace orva::test

#pragma once

#include "MergedFile.h"

#include "zophotos-web/SnapshotReader.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace orva::test {

/// A volume of the merged databases.
inline const std::string A = "/shares/A/";

/// Where the tests' merged databases are, and the directory of the snapshot.
inline const std::string MERGED = "/tmp/merged/zophotos.db";
inline const std::string CACHE = "/tmp/cache";

/// Everything that a reader shows.
struct Shown {
  std::vector<web::Photo> photos;
  std::vector<web::Folder> folders;
  std::vector<web::VolumeRow> volumes;

  bool operator==(const Shown&) const = default;
};

/// Reads everything, in small pages.
Shown ReadAll(const web::Snapshot& snapshot);

/// The names of photos.
std::vector<std::string> NamesOf(const std::vector<web::Photo>& photos);

/// Photos without anything but the volume, or the words.
web::Filter InVolume(const std::string& volume);
web::Filter WithWords(const std::string& words);

/// A merged database at a path that the locator names.
class SnapshotTest : public ::testing::Test {
protected:
  /// Removes what a test before this one left.
  SnapshotTest();

  /// Makes the snapshot in CACHE.
  void Start();

  /// Updates until nothing changes any more. Returns whether anything did.
  bool Update();

  /// A snapshot in a new directory, built from the merged database as it is now.
  std::unique_ptr<web::Snapshot> BuildAnother();

  web::Snapshot::FindPath FindPath();

  std::vector<std::string> Names(const web::Filter& filter = {});

  std::string path_ = MERGED; ///< in the locator; empty for none
  std::unique_ptr<web::Snapshot> snapshot_;
  std::unique_ptr<web::SnapshotReader> reader_;
  int others_ = 0;
};

} // namespace orva::test

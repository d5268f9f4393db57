#include "Expectations.h"
#include "Messages.h"
#include "support/Programs.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// Volumes with real files and catalogs of the indexer.
class Indexing : public SystemTest {
protected:
  void SetUp() override {
    appliance.Start();
    appliance.Handle(Plugged(a.Path()));
    appliance.Handle(Scanned(a.Path()));
  }

  static void MakeFile(const std::string& path) {
    fs::create_directories(fs::path(path).parent_path());
    std::ofstream(path) << "content";
  }

  static void Index(const Volume& volume) {
    const std::string command =
        ProgramPath("orva-catalog") + " index '" + volume.Path() + "' >/tmp/indexer.out 2>&1";
    ASSERT_EQ(0, std::system(command.c_str()));
  }

  /// Indexes the volume and lets the daemon merge it without an error.
  void IndexAndMerge(const Volume& volume) {
    ASSERT_NO_FATAL_FAILURE(Index(volume));
    for (const LogLine& line : appliance.Handle(TranscodedBatch(volume.Path()))) {
      EXPECT_NE(Error("").priority, line.priority) << line;
    }
  }

  Lines Folders() const {
    return MergedDatabase(a.Path()).Rows().Run("SELECT name FROM Folders ORDER BY name");
  }

  Lines Files() const {
    return MergedDatabase(a.Path()).Rows().Run(
        "SELECT o.name || f.name FROM Files f JOIN Folders o USING (folder_id) ORDER BY 1");
  }

  Lines Counts() const {
    return MergedDatabase(a.Path()).Rows().Run(
        "SELECT volume, photos_xcoded, photos_total FROM Statistics ORDER BY volume");
  }

  const Volume a{"A", "150g"};
};

TEST_F(Indexing, ThePhotosOfAVolumeAreMergedWithTheirTimes) {
  MakeFile("/shares/A/Pictures/a.jpg");
  MakeFile("/shares/A/Pictures/Summer/b.JPG");
  MakeFile("/shares/A/top.png");
  MakeFile("/shares/A/Documents/letter.txt");
  const fs::path photo = "/shares/A/Pictures/a.jpg";
  const auto past = std::chrono::sys_seconds(std::chrono::seconds(1'000'000'000));
  fs::last_write_time(photo, std::chrono::file_clock::from_sys(past));

  IndexAndMerge(a);
  EXPECT_THAT(Folders(), ElementsAre("/shares/", "/shares/A/", "/shares/A/Documents/",
                                     "/shares/A/Pictures/", "/shares/A/Pictures/Summer/"));
  EXPECT_THAT(Files(), ElementsAre("/shares/A/Pictures/Summer/b.JPG", "/shares/A/Pictures/a.jpg",
                                   "/shares/A/top.png"));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ::testing::Contains("/shares/A/Pictures/a.jpg|1000000000|1000000000|/shares/A/"));
  EXPECT_THAT(Counts(), ElementsAre("/shares/A/|3|3"));
}

TEST_F(Indexing, ChangesBetweenTwoBatchesAreMerged) {
  MakeFile("/shares/A/Pictures/a.jpg");
  MakeFile("/shares/A/Pictures/b.jpg");
  MakeFile("/shares/A/Old/c.jpg");
  IndexAndMerge(a);
  ASSERT_EQ(3U, Files().size());

  // All in the same second as the first batch, which must not hide anything.
  fs::remove("/shares/A/Pictures/b.jpg");
  fs::remove_all("/shares/A/Old");
  MakeFile("/shares/A/New/d.jpg");
  IndexAndMerge(a);
  EXPECT_THAT(Files(), ElementsAre("/shares/A/New/d.jpg", "/shares/A/Pictures/a.jpg"));
  EXPECT_THAT(Folders(),
              ElementsAre("/shares/", "/shares/A/", "/shares/A/New/", "/shares/A/Pictures/"));
  EXPECT_THAT(Counts(), ElementsAre("/shares/A/|2|2"));

  MakeFile("/shares/A/Pictures/b.jpg");
  MakeFile("/shares/A/Old/c.jpg");
  IndexAndMerge(a);
  EXPECT_THAT(Files(), ElementsAre("/shares/A/New/d.jpg", "/shares/A/Old/c.jpg",
                                   "/shares/A/Pictures/a.jpg", "/shares/A/Pictures/b.jpg"));
}

TEST_F(Indexing, HiddenSystemAndBackupFilesAreDistinguished) {
  MakeFile("/shares/A/Pictures/.hidden.jpg");
  MakeFile("/shares/A/Pictures/a.jpg");
  MakeFile("/shares/A/Pictures/backup.jpg~");
  MakeFile("/shares/A/Pictures/AlbumArtSmall.jpg");
  MakeFile("/shares/A/.Trashes/b.jpg");
  IndexAndMerge(a);
  EXPECT_THAT(Files(), ElementsAre("/shares/A/Pictures/.hidden.jpg", "/shares/A/Pictures/a.jpg",
                                   "/shares/A/Pictures/backup.jpg~"));
  EXPECT_THAT(Folders(), ElementsAre("/shares/", "/shares/A/", "/shares/A/Pictures/"));
  EXPECT_THAT(Counts(), ElementsAre("/shares/A/|1|1"));
}

TEST_F(Indexing, AReadOnlyVolumeWithItsCatalogIsMerged) {
  Volume b("B", "1g");
  MakeFile("/shares/B/b.jpg");
  ASSERT_NO_FATAL_FAILURE(Index(b));
  b.MakeReadOnly();
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(TranscodedBatch(b.Path()));
  EXPECT_THAT(Files(), ElementsAre("/shares/B/b.jpg"));
}

TEST_F(Indexing, APurgedVolumeIsMergedAgainCompletely) {
  MakeFile("/shares/A/Pictures/a.jpg");
  IndexAndMerge(a);
  MergedDatabase(a.Path()).Rows().Run("DELETE FROM Files");
  appliance.Handle(TranscodedBatch(a.Path()));
  ASSERT_THAT(Files(), IsEmpty());
  appliance.Handle(Purged(a.Path()));
  EXPECT_THAT(Files(), ElementsAre("/shares/A/Pictures/a.jpg"));
}

} // namespace
} // namespace orva::test

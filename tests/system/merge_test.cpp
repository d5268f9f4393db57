#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include <ctime>
#include <filesystem>

namespace orva::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// The lines on standard output for a file that is added.
Lines Added(const std::string& path, const std::string& mountPoint) {
  return {"Processing file " + path + " isdeleted=0 status = 3",
          "Adding file " + path + " for mount " + mountPoint};
}

/// A daemon in the scanned state, with volume A as the master, and with its catalog.
class Merge : public SystemTest {
protected:
  void SetUp() override {
    appliance.Start();
    appliance.Handle(Plugged(a.Path()));
    appliance.Handle(Scanned(a.Path()));
    appliance.TakeOutput();
    catalog.AddFolder("Pictures/", 500);
    catalog.AddFolder("Pictures/Summer/", 600);
    catalog.AddPhoto("Pictures/b.jpg", 1001, 2001);
    catalog.AddPhoto("Pictures/Summer/a.jpg", 1002, 2002);
    catalog.AddPhoto("top.jpg", 1000, 2000);
  }

  /// The lines of a merge of A after those that announce it.
  static Log Announced(const Log& announcement, const std::string& work, int folders, int files) {
    return announcement +
           Log{Info("MasterVolumeScannedState:: " + work +
                    ", doing merge for mountPoint /shares/A/ using master volume at /shares/A/")} +
           MergeLines("/shares/A/", folders, files);
  }

  static Log BatchMerged(int folders, int files) {
    return Announced(BatchLines(), "handlePictureTranscoded", folders, files);
  }

  /// Merges the content that SetUp has put into the catalog.
  void MergeFirst() {
    ASSERT_EQ(BatchMerged(3, 3), appliance.Handle(TranscodedBatch(a.Path())));
    appliance.TakeOutput();
  }

  const Volume a{"A", "150g"};
  Catalog catalog{a};
  const Lines allFolders{ROOT_FOLDER, "/shares/A/|/shares/|0|/shares/A/",
                         "/shares/A/Pictures/|/shares/A/|500|/shares/A/",
                         "/shares/A/Pictures/Summer/|/shares/A/Pictures/|600|/shares/A/"};
  const Lines allFiles{"/shares/A/Pictures/Summer/a.jpg|1002|1002|/shares/A/",
                       "/shares/A/Pictures/b.jpg|1001|1001|/shares/A/",
                       "/shares/A/top.jpg|1000|1000|/shares/A/"};
};

TEST_F(Merge, TheFirstAddsTheWholeVolumeInPathOrder) {
  EXPECT_EQ(BatchMerged(3, 3), appliance.Handle(TranscodedBatch(a.Path())));

  Lines output = Added("/shares/A/Pictures/Summer/a.jpg", "/shares/A/");
  for (const char* path : {"/shares/A/Pictures/b.jpg", "/shares/A/top.jpg"}) {
    const Lines next = Added(path, "/shares/A/");
    output.insert(output.end(), next.begin(), next.end());
  }
  EXPECT_EQ(output, appliance.TakeOutput());

  const MergedDatabase merged(a.Path());
  EXPECT_EQ(allFolders, merged.Folders());
  EXPECT_EQ(allFiles, merged.Files());
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|3|3|2002"));
}

TEST_F(Merge, TheStatusRowOfAFreshDatabaseKeepsItsPlaceholderTime) {
  MergeFirst();
  EXPECT_THAT(MergedDatabase(a.Path()).Rows().Run("SELECT mc_version, mdate FROM Status"),
              ElementsAre("2.0|1000"));
}

TEST_F(Merge, AnEndMergesLikeABatch) {
  EXPECT_EQ(Announced({Info(":: End ")}, "handlePictureTranscoded", 3, 3),
            appliance.Handle(End(a.Path())));
  EXPECT_EQ(allFiles, MergedDatabase(a.Path()).Files());
}

TEST_F(Merge, AnIncrementalMergeReadsOnlyNewerChanges) {
  MergeFirst();
  catalog.AddFolder("New/", 700);
  catalog.AddPhoto("New/c.jpg", 1003, 2003);
  catalog.AddPhoto("Pictures/same-second.jpg", 1004, 2002); // not newer than the last merge
  EXPECT_EQ(BatchMerged(4, 1), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_EQ(Added("/shares/A/New/c.jpg", "/shares/A/"), appliance.TakeOutput());

  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Files(), ElementsAre("/shares/A/New/c.jpg|1003|1003|/shares/A/", allFiles[0],
                                          allFiles[1], allFiles[2]));
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|5|5|2003"));
}

TEST_F(Merge, AnUnchangedVolumeOnlyRefreshesItsCounts) {
  MergeFirst();
  catalog.Rows().Run("UPDATE Files SET status = 2 WHERE name = 'b.jpg'");
  EXPECT_EQ(BatchMerged(3, 0), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());

  const MergedDatabase merged(a.Path());
  EXPECT_EQ(allFolders, merged.Folders());
  EXPECT_EQ(allFiles, merged.Files());
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|2|3|2002"));
}

TEST_F(Merge, APurgeReadsTheWholeVolumeAgain) {
  MergeFirst();
  // An incremental merge cannot see rows that the indexer has removed.
  catalog.Rows().Run("DELETE FROM Files WHERE name = 'b.jpg'");
  catalog.Rows().Run("DELETE FROM Folders WHERE path = 'Pictures/Summer/'");
  EXPECT_EQ(Announced({Info(":: Purged ")}, "handleVolumePurged", 2, 2),
            appliance.Handle(Purged(a.Path())));

  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Folders(), ElementsAre(allFolders[0], allFolders[1], allFolders[2]));
  EXPECT_THAT(merged.Files(), ElementsAre(allFiles[2])); // the folder of a.jpg is gone
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|2|2|2002"));
}

TEST_F(Merge, APurgeOfAVolumeThatWasNeverMergedMergesIt) {
  EXPECT_EQ(Announced({Info(":: Purged ")}, "handleVolumePurged", 3, 3),
            appliance.Handle(Purged(a.Path())));
  EXPECT_EQ(allFiles, MergedDatabase(a.Path()).Files());
}

TEST_F(Merge, AWithdrawnFileIsRemoved) {
  MergeFirst();
  catalog.DeletePhoto("Pictures/b.jpg", 2010);
  EXPECT_EQ(BatchMerged(3, 1), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(),
              ElementsAre("Processing file /shares/A/Pictures/b.jpg isdeleted=1 status = 3",
                          "Removing file /shares/A/Pictures/b.jpg for mount /shares/A/",
                          "Deleting /shares/A/Pictures/b.jpg",
                          "Found parent folder 3 for /shares/A/Pictures/b.jpg"));

  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Files(), ElementsAre(allFiles[0], allFiles[2]));
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|2|2|2010"));
}

TEST_F(Merge, ADeletedFileWithAFinishedTranscodingStays) {
  MergeFirst();
  catalog.Rows().Run("UPDATE Files SET isDeleted = 1 WHERE name = 'b.jpg'");
  catalog.Rows().Run("UPDATE Transcodings SET lastUpdatedDate = 2010");
  EXPECT_EQ(BatchMerged(3, 2), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_EQ(allFiles, MergedDatabase(a.Path()).Files());
}

TEST_F(Merge, ADeletedFolderIsRemovedWithItsOwnFiles) {
  MergeFirst();
  catalog.DeleteFolder("Pictures/Summer/");
  EXPECT_EQ(BatchMerged(3, 0), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre("Deleting /shares/A/Pictures/Summer/",
                                                  "Found folder 4 for /shares/A/Pictures/Summer/"));

  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Folders(), ElementsAre(allFolders[0], allFolders[1], allFolders[2]));
  EXPECT_THAT(merged.Files(), ElementsAre(allFiles[1], allFiles[2]));
}

TEST_F(Merge, AnUnknownDeletedFolderOnlyWritesItsLine) {
  catalog.DeleteFolder("Pictures/Summer/");
  catalog.DeletePhoto("Pictures/Summer/a.jpg", 1);
  EXPECT_EQ(BatchMerged(3, 3), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_EQ("Deleting /shares/A/Pictures/Summer/", appliance.TakeOutput().at(0));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), ElementsAre(allFiles[1], allFiles[2]));
}

TEST_F(Merge, HiddenAndBackupFilesAreMergedAndSystemFilesAreNot) {
  catalog.AddPhoto("Pictures/backup.jpg", 1, 3001, {.backup = true});
  catalog.AddPhoto("Pictures/hidden.jpg", 2, 3002, {.hidden = true});
  catalog.AddPhoto("Pictures/system.jpg", 3, 3003, {.system = true});
  EXPECT_EQ(BatchMerged(3, 6), appliance.Handle(TranscodedBatch(a.Path())));

  const Lines output = appliance.TakeOutput();
  EXPECT_THAT(output, ::testing::Contains(
                          "Processing file /shares/A/Pictures/system.jpg isdeleted=0 status = 3"));
  EXPECT_THAT(output, ::testing::Not(::testing::Contains(
                          "Adding file /shares/A/Pictures/system.jpg for mount /shares/A/")));

  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Files(),
              ElementsAre(allFiles[0], allFiles[1], "/shares/A/Pictures/backup.jpg|1|1|/shares/A/",
                          "/shares/A/Pictures/hidden.jpg|2|2|/shares/A/", allFiles[2]));
  // Neither counts as a photo, and the system file does not change the time.
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|3|3|3002"));
}

TEST_F(Merge, ASystemFileIsReadAgainByTheNextMerge) {
  MergeFirst();
  catalog.AddPhoto("Pictures/system.jpg", 3, 3003, {.system = true});
  EXPECT_EQ(BatchMerged(3, 1), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_EQ(BatchMerged(3, 1), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(MergedDatabase(a.Path()).Statistics(), ElementsAre("/shares/A/|3|3|2002"));
}

TEST_F(Merge, HiddenBackupAndSystemFoldersAreNotMergedNorTheirContent) {
  catalog.AddFolder("Hidden/", 1, {.hidden = true});
  catalog.AddFolder("Backup/", 1, {.backup = true});
  catalog.AddFolder("System/", 1, {.system = true});
  catalog.AddPhoto("Hidden/x.jpg", 1, 3000);
  catalog.AddFolder("Hidden/Below/", 1);
  EXPECT_EQ(BatchMerged(4, 4), appliance.Handle(TranscodedBatch(a.Path())));
  const MergedDatabase merged(a.Path());
  EXPECT_EQ(allFolders, merged.Folders());
  EXPECT_EQ(allFiles, merged.Files());
}

TEST_F(Merge, FilesWithoutAFinishedTranscodingOfTheProfileAreNotMerged) {
  catalog.AddPhoto("unfinished.jpg", 1, 3000);
  catalog.Rows().Run("UPDATE Transcodings SET status = 2 WHERE lastUpdatedDate = 3000");
  catalog.AddPhoto("other.jpg", 1, 3001);
  catalog.Rows().Run("UPDATE Transcodings SET profile = 'other' WHERE lastUpdatedDate = 3001");
  EXPECT_EQ(BatchMerged(3, 3), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_EQ(allFiles, MergedDatabase(a.Path()).Files());
}

TEST_F(Merge, TheCountsAreThoseOfRenderedPhotosAndOfAllPhotos) {
  catalog.AddPhoto("later.jpg", 1, 3000);
  catalog.Rows().Run("UPDATE Files SET status = 1 WHERE name = 'later.jpg'");
  catalog.AddPhoto("film.mov", 1, 3001);
  catalog.Rows().Run("UPDATE Files SET category = 2 WHERE name = 'film.mov'");
  appliance.Handle(TranscodedBatch(a.Path()));
  EXPECT_THAT(MergedDatabase(a.Path()).Statistics(), ElementsAre("/shares/A/|3|4|3001"));
}

TEST_F(Merge, NamesAreKeptByteForByte) {
  const std::string name = "it's \"50%\" \xc3\xa9\xff;--.jpg";
  catalog.AddPhoto("Pictures/" + name, 7, 3000);
  EXPECT_EQ(BatchMerged(3, 4), appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ::testing::Contains("/shares/A/Pictures/" + name + "|7|7|/shares/A/"));
}

TEST_F(Merge, SeveralVolumesShareTheMastersDatabase) {
  MergeFirst();
  const Volume b("B", "1g");
  Catalog other(b);
  other.AddFolder("Pictures/", 800);
  other.AddPhoto("Pictures/b.jpg", 1100, 50);
  appliance.Handle(Plugged(b.Path()));
  EXPECT_EQ(BatchLines() +
                Log{Info("MasterVolumeScannedState:: handlePictureTranscoded, doing merge for "
                         "mountPoint /shares/B/ using master volume at /shares/A/")} +
                MergeLines("/shares/B/", 2, 1),
            appliance.Handle(TranscodedBatch(b.Path())));

  const MergedDatabase merged(a.Path());
  Lines folders = allFolders;
  folders.emplace_back("/shares/B/|/shares/|0|/shares/B/");
  folders.emplace_back("/shares/B/Pictures/|/shares/B/|800|/shares/B/");
  Lines files = allFiles;
  files.emplace_back("/shares/B/Pictures/b.jpg|1100|1100|/shares/B/");
  EXPECT_EQ(folders, merged.Folders());
  EXPECT_EQ(files, merged.Files());
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|3|3|2002", "/shares/B/|1|1|50"));
  EXPECT_FALSE(HasMergedDatabase(b.Path()));
}

/// There is no parent folder /shares/Disks/ for the folder of the volume.
TEST_F(Merge, AVolumeThatIsNotDirectlyBelowTheSharesRootHasOnlyStatistics) {
  MergeFirst();
  std::filesystem::create_directory("/shares/Disks");
  const Volume b("Disks/B", "1g");
  Catalog other(b);
  other.AddPhoto("b.jpg", 1100, 50);
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(TranscodedBatch(b.Path()));
  const MergedDatabase merged(a.Path());
  EXPECT_EQ(allFolders, merged.Folders());
  EXPECT_EQ(allFiles, merged.Files());
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|3|3|2002", "/shares/Disks/B/|1|1|50"));
}

/// The parent folder is on the volume that contains the mount point.
TEST_F(Merge, AVolumeInsideAnotherIsMergedBelowIt) {
  MergeFirst();
  const Volume b("A/B", "1g");
  Catalog other(b);
  other.AddPhoto("b.jpg", 1100, 50);
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(TranscodedBatch(b.Path()));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ::testing::Contains("/shares/A/B/b.jpg|1100|1100|/shares/A/B/"));
}

TEST_F(Merge, AReadOnlyVolumeIsMerged) {
  Volume b("B", "1g");
  Catalog(b).AddPhoto("b.jpg", 1100, 50);
  b.MakeReadOnly();
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(TranscodedBatch(b.Path()));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ElementsAre("/shares/B/b.jpg|1100|1100|/shares/B/"));
}

TEST_F(Merge, AVolumeWithoutACatalogChangesNothing) {
  MergeFirst();
  const Volume b("B", "1g");
  const Log log = appliance.Handle(TranscodedBatch(b.Path()));
  ASSERT_EQ(4U, log.size());
  EXPECT_EQ(Error("").priority, log[3].priority);
  EXPECT_THAT(log[3].text, ::testing::StartsWith("Error that we will ignore "));
  EXPECT_THAT(log[3].text, ::testing::EndsWith("\n"));

  const MergedDatabase merged(a.Path());
  EXPECT_EQ(allFiles, merged.Files());
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|3|3|2002"));
}

TEST_F(Merge, AFailureInTheMiddleKeepsNothingOfTheMerge) {
  MergeFirst();
  catalog.AddFolder("New/", 700);
  catalog.AddPhoto("New/a.jpg", 1003, 2003);
  MergedDatabase(a.Path()).Rows().Run("CREATE UNIQUE INDEX refuse ON Files(name)");
  const Log log = appliance.Handle(TranscodedBatch(a.Path()));
  EXPECT_EQ(Error("").priority, log.back().priority);
  EXPECT_THAT(log.back().text, ::testing::StartsWith("Error that we will ignore "));

  const MergedDatabase merged(a.Path());
  EXPECT_EQ(allFolders, merged.Folders());
  EXPECT_EQ(allFiles, merged.Files());
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|3|3|2002"));

  merged.Rows().Run("DROP INDEX refuse");
  EXPECT_EQ(BatchMerged(4, 1), appliance.Handle(TranscodedBatch(a.Path())));
}

TEST_F(Merge, ACatalogThatIsBrokenInTheMiddleFailsTheWholeMerge) {
  MergeFirst();
  catalog.Rows().Run("DROP TABLE Transcodings");
  const Log log = appliance.Handle(TranscodedBatch(a.Path()));
  EXPECT_THAT(log.back().text, ::testing::StartsWith("Error that we will ignore "));
  EXPECT_EQ(allFiles, MergedDatabase(a.Path()).Files());
}

/// The shares root as the master, as in a daemon that has only small volumes.
TEST_F(SystemTest, TheSharesRootServesAsTheMaster) {
  appliance.Start();
  const Volume small("Small", "1g");
  Catalog catalog(small);
  catalog.AddFolder("Pictures/", 500);
  catalog.AddPhoto("Pictures/a.jpg", 1000, 2000);
  appliance.Handle(Plugged(small.Path()));
  appliance.Handle(Scanned(small.Path()));
  EXPECT_EQ("zophotos_db_path=/shares/.zophotos/zophotos.db\n", Appliance::Locator());

  EXPECT_EQ(BatchLines() +
                Log{Info("MasterVolumeScannedState:: handlePictureTranscoded, doing merge for "
                         "mountPoint /shares/Small/ using master volume at /shares")} +
                MergeLines("/shares/Small/", 2, 1),
            appliance.Handle(TranscodedBatch(small.Path())));

  const MergedDatabase merged("/shares");
  EXPECT_THAT(merged.Folders(),
              ElementsAre(ROOT_FOLDER, "/shares/Small/|/shares/|0|/shares/Small/",
                          "/shares/Small/Pictures/|/shares/Small/|500|/shares/Small/"));
  EXPECT_THAT(merged.Files(), ElementsAre("/shares/Small/Pictures/a.jpg|1000|1000|/shares/Small/"));
}

TEST_F(SystemTest, AMergeStampsTheStatusRowWithWhatItHolds) {
  appliance.Start();
  const Volume small("Small", "1g");
  Catalog(small).AddPhoto("a.jpg", 1000, 2000);
  appliance.Handle(Scanned(small.Path()));
  const std::string STATUS = "SELECT mc_version, mdate, desc, etype FROM Status";
  MergedDatabase("/shares").Rows().Run(
      "UPDATE Status SET mc_version = '1.7', mdate = 4711, desc = 'some', etype = 9");
  appliance.Handle(TranscodedBatch(small.Path()));
  const MergedDatabase merged("/shares");
  EXPECT_THAT(merged.Files(), ElementsAre("/shares/Small/a.jpg|1000|1000|/shares/Small/"));
  EXPECT_THAT(merged.Rows().Run(STATUS), ElementsAre("1.7|4711|some|9"));
}

} // namespace
} // namespace orva::test

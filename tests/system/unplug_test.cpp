#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

namespace orva::test {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// A daemon in the scanned state that has merged its master A and a volume B; both are large
/// enough to be the master.
class Unplug : public SystemTest {
protected:
  void SetUp() override {
    appliance.Start();
    onA.AddFolder("Pictures/", 500);
    onA.AddPhoto("Pictures/a.jpg", 1000, 2000);
    onB.AddFolder("Pictures/", 600);
    onB.AddPhoto("Pictures/b.jpg", 1001, 2001);
    for (const Volume* volume : {&a, &b}) {
      appliance.Handle(Plugged(volume->Path()));
    }
    appliance.Handle(Scanned(a.Path()));
    for (const Volume* volume : {&a, &b}) {
      appliance.Handle(TranscodedBatch(volume->Path()));
    }
    appliance.TakeOutput();
    ASSERT_EQ(Lines({rowA, rowB}), MergedDatabase(a.Path()).Files());
  }

  Volume a{"A", "150g"};
  Volume b{"B", "120g"};
  Catalog onA{a};
  Catalog onB{b};
  const std::string rowA = "/shares/A/Pictures/a.jpg|1000|1000|/shares/A/";
  const std::string rowB = "/shares/B/Pictures/b.jpg|1001|1001|/shares/B/";
};

TEST_F(Unplug, RemovesAVolumesRowsAndKeepsItsCounts) {
  b.Unmount();
  appliance.Handle(Unplugged(b.Path()));
  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Folders(), ElementsAre(ROOT_FOLDER, "/shares/A/|/shares/|0|/shares/A/",
                                            "/shares/A/Pictures/|/shares/A/|500|/shares/A/"));
  EXPECT_THAT(merged.Files(), ElementsAre(rowA));
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|1|1|2000", "/shares/B/|1|1|0"));
}

TEST_F(Unplug, AVolumeThatComesBackIsMergedFromTheBeginning) {
  appliance.Handle(Unplugged(b.Path()));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), ElementsAre(rowA));
  appliance.Handle(Plugged(b.Path()));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), ElementsAre(rowA));
  appliance.Handle(TranscodedBatch(b.Path()));
  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Files(), ElementsAre(rowA, rowB));
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|1|1|2000", "/shares/B/|1|1|2001"));
}

TEST_F(Unplug, OfAnUnknownVolumeRemovesNothing) {
  appliance.Handle(Unplugged("/shares/Unknown"));
  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Files(), ElementsAre(rowA, rowB));
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/A/|1|1|2000", "/shares/B/|1|1|2001"));
}

TEST_F(Unplug, OfTheMasterMovesTheDatabaseToItsSuccessor) {
  a.Unmount();
  appliance.Handle(Unplugged(a.Path()));
  EXPECT_EQ("zophotos_db_path=/shares/B//.zophotos/zophotos.db\n", Appliance::Locator());
  {
    // The move itself merges nothing.
    const MergedDatabase merged(b.Path());
    EXPECT_THAT(merged.Folders(), ElementsAre(ROOT_FOLDER));
    EXPECT_THAT(merged.Files(), IsEmpty());
  }
  // There was no master to remove the rows from: the removal went to a database in the working
  // directory.
  EXPECT_TRUE(HasMergedDatabase(appliance.Daemon().Directory()));

  appliance.Handle(TranscodedBatch(b.Path()));
  const MergedDatabase merged(b.Path());
  EXPECT_THAT(merged.Files(), ElementsAre(rowB));
  EXPECT_THAT(merged.Statistics(), ElementsAre("/shares/B/|1|1|2001"));
}

TEST_F(Unplug, OfTheMasterKeepsTheEarlierContentOfItsSuccessor) {
  a.Unmount();
  appliance.Handle(Unplugged(a.Path()));
  appliance.Handle(TranscodedBatch(b.Path()));
  const Volume again("A", "150g");
  Catalog(again).AddPhoto("new.jpg", 7, 8);
  appliance.Handle(Plugged(again.Path()));
  appliance.Handle(TranscodedBatch(again.Path()));
  EXPECT_THAT(MergedDatabase(b.Path()).Files(),
              ElementsAre("/shares/A/new.jpg|7|7|/shares/A/", rowB));
  EXPECT_EQ("zophotos_db_path=/shares/B//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(Unplug, OfAllVolumesLeavesTheSharesRootAsTheMaster) {
  a.Unmount();
  appliance.Handle(Unplugged(a.Path()));
  b.Unmount();
  EXPECT_EQ((Log{Info("MasterVolumeScannedState:: Volumeunplugged "),
                 Info("Moving to the scanned state since we can safely do so "),
                 Info("We now have a master volume " + SHARES_MASTER_TEXT + " ")}),
            appliance.Handle(Unplugged(b.Path())));
  EXPECT_EQ("zophotos_db_path=/shares/.zophotos/zophotos.db\n", Appliance::Locator());
  EXPECT_THAT(MergedDatabase("/shares").Files(), IsEmpty());
}

TEST_F(Unplug, RemovesTheRowsWhileAnotherProgramReads) {
  const MergedDatabase reader(a.Path());
  reader.Rows().Run("BEGIN");
  reader.Files(); // holds a read lock, which a writer must wait for
  appliance.Service().Send(Unplugged(b.Path()));
  ASSERT_TRUE(appliance.Log().Await(Info("MasterVolumeScannedState:: Volumeunplugged ")));
  reader.Rows().Run("COMMIT");
  appliance.Barrier();
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), ElementsAre(rowA));
}

/// A fallback with content: the shares root is no candidate, and A is the only volume.
TEST_F(SystemTest, AFallbackEmptiesTheDatabaseUnderTheSharesRoot) {
  ASSERT_EQ(0, rmdir("/shares"));
  appliance.Start();
  Volume a("A", "150g");
  Catalog(a).AddPhoto("a.jpg", 1000, 2000);
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Scanned(a.Path()));
  appliance.Handle(TranscodedBatch(a.Path()));
  ASSERT_EQ(1U, MergedDatabase(a.Path()).Files().size());
  // Content of an earlier run under the shares root.
  ASSERT_EQ(0, mkdir("/shares/.zophotos", 0777));
  std::filesystem::copy_file(a.Path() + "/.zophotos/zophotos.db", "/shares/.zophotos/zophotos.db");
  ASSERT_EQ(1U, MergedDatabase("/shares").Files().size());

  a.Unmount();
  appliance.Handle(Unplugged(a.Path()));
  const MergedDatabase merged("/shares");
  EXPECT_THAT(merged.Folders(), ElementsAre(ROOT_FOLDER));
  EXPECT_THAT(merged.Files(), IsEmpty());
  EXPECT_THAT(merged.Statistics(), IsEmpty());
  EXPECT_THAT(merged.Rows().Run("SELECT mdate > 1000 FROM Status"), ElementsAre("1"));
}

} // namespace
} // namespace orva::test

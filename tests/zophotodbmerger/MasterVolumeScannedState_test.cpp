#include "StatesTest.h"

#include "Catalog.h"
#include "MasterVolumeScannedState.h"
#include "PhotoDB.h"

#include <fstream>

namespace orva::test {
namespace {

using dbmerger::PhotoDB;
using dbmerger::State;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

const LogLine UNPLUGGED = Info("MasterVolumeScannedState:: Volumeunplugged ");

/// The scanned state, with the volume "/shares/Vol/" as the master.
class MasterVolumeScannedStateTest : public StatesTest {
protected:
  MasterVolumeScannedStateTest() {
    std::filesystem::current_path(MakeDirectory("/tmp/scratch"));
    Register("/shares/Vol/", LARGE);
    StatesTest::Scanned("/shares/Vol/");
    Logged();
  }

  static LogLine Merging(const std::string& event, const std::string& mountPoint) {
    return Info("MasterVolumeScannedState:: " + event + ", doing merge for mountPoint " +
                mountPoint + " using master volume at /shares/Vol/");
  }
};

/// A catalog with one photo.
Catalog MakeCatalog(const std::string& mountPoint) {
  Catalog catalog(mountPoint);
  catalog.AddPhoto("a.jpg", 10, 100);
  return catalog;
}

TEST_F(MasterVolumeScannedStateTest, HasTypeTwo) {
  EXPECT_EQ(2, CurrentType());
}

TEST_F(MasterVolumeScannedStateTest, CreatesTheDatabaseAndPublishesIt) {
  EXPECT_THAT(MergedRows("/shares/Vol", "SELECT mdate FROM Status"), ElementsAre("1000"));
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(StatesTest, ScannedStateWithoutAMasterNamesTheEmptyVolume) {
  std::filesystem::current_path(MakeDirectory("/tmp/scratch"));
  const dbmerger::MasterVolumeScannedState state;
  EXPECT_EQ("zophotos_db_path=DUMMY_MOUNT_POINT/.zophotos/zophotos.db\n", Appliance::Locator());
  EXPECT_TRUE(std::filesystem::exists("/tmp/scratch/.zophotos/zophotos.db"));
}

TEST_F(StatesTest, ScannedStateWhoseConstructionFailsJoinsItsMerger) {
  std::filesystem::remove_all("/shares/.zophotos");
  std::ofstream("/shares/.zophotos") << "in the way";
  ASSERT_TRUE(Registry().reelectMasterVolume());
  EXPECT_THROW(dbmerger::MasterVolumeScannedState(), PhotoDB::Error);
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_EQ(State::DEFAULT, CurrentType());
}

TEST_F(MasterVolumeScannedStateTest, OpensAnExistingDatabase) {
  MergedRows("/shares/Vol", "INSERT INTO Folders VALUES(2, 1, '/shares/x/', 0, '/shares/x/')");
  { const dbmerger::MasterVolumeScannedState state; }
  EXPECT_THAT(MergedFolders("/shares/Vol"), ElementsAre("/shares/x/|/shares/x/"));
}

TEST_F(MasterVolumeScannedStateTest, PluggedIsIgnored) {
  State* const before = &Current();
  EXPECT_EQ("", Plugged("/shares/Other/"));
  EXPECT_EQ(before, &Current());
  EXPECT_THAT(Logged(), ElementsAre(Info("MasterVolumeScannedState:: VolumePlugged, ignoring! ")));
}

TEST_F(MasterVolumeScannedStateTest, ScannedChangesAndLogsNothing) {
  MakeCatalog("/shares/Vol/");
  State* const before = &Current();
  EXPECT_EQ("", Scanned("/shares/Vol/"));
  EXPECT_EQ(before, &Current());
  EXPECT_THAT(Logged(), IsEmpty());
  EXPECT_THAT(MergedFiles("/shares/Vol"), IsEmpty());
}

TEST_F(MasterVolumeScannedStateTest, TranscodedMergesTheVolume) {
  MakeCatalog("/shares/Other/");
  Transcoded("/shares/Other/");
  EXPECT_THAT(MergedFiles("/shares/Vol"), ElementsAre("/shares/Other/a.jpg"));
  EXPECT_EQ(Log{Merging("handlePictureTranscoded", "/shares/Other/")} +
                MergeLines("/shares/Other/", 1, 1),
            Logged());
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
}

TEST_F(MasterVolumeScannedStateTest, PurgedReMergesTheVolume) {
  const Catalog catalog = MakeCatalog("/shares/Other/");
  Transcoded("/shares/Other/");
  Logged();
  // Only a re-merge notices this change.
  catalog.Rows().Run("UPDATE Files SET path = 'b.jpg', name = 'b.jpg'");
  Purged("/shares/Other/");
  EXPECT_THAT(MergedFiles("/shares/Vol"), ElementsAre("/shares/Other/b.jpg"));
  EXPECT_EQ(Log{Merging("handleVolumePurged", "/shares/Other/")} +
                MergeLines("/shares/Other/", 1, 1),
            Logged());
}

TEST_F(MasterVolumeScannedStateTest, UnpluggedOtherVolumeIsRemovedAndTheStateReplaced) {
  MakeCatalog("/shares/Other/");
  MakeCatalog("/shares/Vol/");
  Transcoded("/shares/Other/");
  Transcoded("/shares/Vol/");
  Logged();
  std::filesystem::remove("/tmp/zophotodbmerger.conf");
  State* const before = &Current();
  Forget("/shares/Other/");

  const std::string output = Unplugged("/shares/Other/");

  EXPECT_THAT(output, ::testing::HasSubstr("Setting the current to scanned state"));
  EXPECT_NE(before, &Current());
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_EQ("/shares/Vol/", Master());
  EXPECT_THAT(MergedFiles("/shares/Vol"), ElementsAre("/shares/Vol/a.jpg"));
  EXPECT_THAT(MergedStatistics("/shares/Vol"),
              ElementsAre("/shares/Other/|1|1|0", "/shares/Vol/|1|1|100"));
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
  EXPECT_THAT(Logged(), ElementsAre(UNPLUGGED, MOVING,
                                    Info("We now have a master volume " +
                                         MasterText("/shares/Vol/", LARGE) + " ")));
}

TEST_F(MasterVolumeScannedStateTest, MergesContinueAfterAnUnplug) {
  MakeCatalog("/shares/Vol/");
  Unplugged("/shares/Other/");
  Transcoded("/shares/Vol/");
  EXPECT_THAT(MergedFiles("/shares/Vol"), ElementsAre("/shares/Vol/a.jpg"));
}

TEST_F(MasterVolumeScannedStateTest, ReplacedStateMergesNothing) {
  MakeCatalog("/shares/Vol/");
  State& replaced = Current();
  Unplugged("/shares/Other/");
  OutputOf([&] { replaced.handlePictureTranscoded({.mountPoint = "/shares/Vol/"}); });
  EXPECT_THAT(MergedFiles("/shares/Vol"), IsEmpty());
}

TEST_F(MasterVolumeScannedStateTest, UnpluggedMasterIsReplacedByAnother) {
  MakeCatalog("/shares/Vol/");
  Transcoded("/shares/Vol/");
  Register("/shares/Next/", MIDDLE);
  Forget("/shares/Vol/");
  Logged();

  Unplugged("/shares/Vol/");

  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_EQ("/shares/Next/", Master());
  EXPECT_EQ("zophotos_db_path=/shares/Next//.zophotos/zophotos.db\n", Appliance::Locator());
  EXPECT_THAT(MergedFolders("/shares/Next"), IsEmpty());
  EXPECT_THAT(MergedFiles("/shares/Vol"), ElementsAre("/shares/Vol/a.jpg"))
      << "the rows are removed from the database of the empty volume";
  EXPECT_TRUE(std::filesystem::exists("/tmp/scratch/.zophotos/zophotos.db"));
  EXPECT_THAT(Logged(), ElementsAre(UNPLUGGED, MOVING,
                                    Info("We now have a master volume " +
                                         MasterText("/shares/Next/", MIDDLE) + " ")));
}

TEST_F(MasterVolumeScannedStateTest, UnpluggedMasterWithoutASuccessorFallsBack) {
  MergedRows("/shares", "INSERT INTO Folders VALUES(2, 1, '/shares/x/', 0, '/shares/x/')");
  ForgetSharesRoot();
  Forget("/shares/Vol/");
  const std::string output = Unplugged("/shares/Vol/");
  EXPECT_THAT(output, ::testing::HasSubstr("Setting the current to default state"));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_THAT(Logged(),
              ElementsAre(UNPLUGGED, Info("We do NOT have a master volume, so going back to the "
                                          "Default State ")));
  EXPECT_THAT(MergedFolders("/shares"), IsEmpty());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  ASSERT_EQ(1U, Registry().getVolumes().size());
  EXPECT_EQ(SHARES_MASTER_TEXT, Registry().getVolumes()[0].ToString());
}

TEST_F(MasterVolumeScannedStateTest, FailedRemovalKeepsTheStateAndItsMerger) {
  MakeCatalog("/shares/Vol/");
  State* const before = &Current();
  MergedRows("/shares/Vol", "ALTER TABLE Statistics RENAME TO Stored");
  EXPECT_THROW(Unplugged("/shares/Other/"), std::string);
  EXPECT_EQ(before, &Current());
  MergedRows("/shares/Vol", "ALTER TABLE Stored RENAME TO Statistics");
  Transcoded("/shares/Vol/");
  EXPECT_THAT(MergedFiles("/shares/Vol"), ElementsAre("/shares/Vol/a.jpg"));
}

TEST_F(MasterVolumeScannedStateTest, FailureAfterTheRemovalLeavesTheMergerStopped) {
  MakeCatalog("/shares/Vol/");
  Register("/shares/Next/", MIDDLE);
  std::ofstream("/shares/Next/.zophotos") << "in the way";
  State* const before = &Current();
  Forget("/shares/Vol/");
  EXPECT_THROW(Unplugged("/shares/Vol/"), PhotoDB::Error);
  EXPECT_EQ(before, &Current());
  EXPECT_EQ("/shares/Next/", Master());

  std::filesystem::remove("/shares/Next/.zophotos");
  Transcoded("/shares/Vol/");
  EXPECT_THAT(MergedFiles("/shares/Next"), IsEmpty());
  EXPECT_THAT(MergedStatistics("/shares/Next"), ElementsAre("/shares/Vol/|1|1|0"));
}

TEST_F(MasterVolumeScannedStateTest, UnusableMasterIsThrownFromAMerge) {
  MakeCatalog("/shares/Vol/");
  std::filesystem::remove_all("/shares/Vol/.zophotos");
  std::ofstream("/shares/Vol/.zophotos") << "in the way";
  EXPECT_THROW(Transcoded("/shares/Vol/"), PhotoDB::Error);
  EXPECT_THROW(Purged("/shares/Vol/"), PhotoDB::Error);
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
}

} // namespace
} // namespace orva::test

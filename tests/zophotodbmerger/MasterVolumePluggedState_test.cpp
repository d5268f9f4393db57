#include "StatesTest.h"

#include "MasterVolumePluggedState.h"
#include "PhotoDB.h"

#include <fstream>

namespace orva::test {
namespace {

using dbmerger::State;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// The state after a volume that is larger than the shares root was plugged.
class MasterVolumePluggedStateTest : public StatesTest {
protected:
  MasterVolumePluggedStateTest() {
    Register("/shares/Vol/", LARGE);
    StatesTest::Plugged("/shares/Vol/");
    Logged();
  }

  /// Removes the master and every volume that could replace it.
  void ForgetEverything() const {
    ForgetSharesRoot();
    Forget("/shares/Vol/");
  }
};

TEST_F(MasterVolumePluggedStateTest, HasTypeOne) {
  EXPECT_EQ(1, CurrentType());
  EXPECT_EQ(1, dbmerger::MasterVolumePluggedState().getStateType());
}

TEST_F(MasterVolumePluggedStateTest, PluggedIsIgnored) {
  EXPECT_EQ("", Plugged("/shares/Other/"));
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("MasterVolumePluggedState:: VolumePlugged, ignoring! ")));
}

TEST_F(MasterVolumePluggedStateTest, PurgedIsIgnored) {
  EXPECT_EQ("", Purged("/shares/Vol/"));
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("MasterVolumePluggedState:: We do not have a Master "
                                         "Volume, so volume purged - ignored ")));
}

TEST_F(MasterVolumePluggedStateTest, ScannedMovesToTheScannedState) {
  EXPECT_NE("", Scanned("/shares/Vol/"));
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("MasterVolumePluggedState:: VolumeScanned "), MOVING,
                                    Info("We now have a master volume " +
                                         MasterText("/shares/Vol/", LARGE))));
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
  EXPECT_THAT(MergedFolders("/shares/Vol"), IsEmpty());
}

TEST_F(MasterVolumePluggedStateTest, ScannedWithoutAMasterKeepsTheState) {
  ForgetEverything();
  EXPECT_EQ("", Scanned("/shares/Vol/"));
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_THAT(Logged(),
              ElementsAre(Info("MasterVolumePluggedState:: VolumeScanned "),
                          Info("MasterVolumePluggedState:: We do not have a Master Volume, so "
                               "Volume Scanned - ignored ")));
}

TEST_F(MasterVolumePluggedStateTest, TranscodedMovesToTheScannedState) {
  EXPECT_NE("", Transcoded("/shares/Vol/"));
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("MasterVolumePluggedState:: Transcoded batch "), MOVING,
                                    Info("We now have a master volume " +
                                         MasterText("/shares/Vol/", LARGE))));
}

TEST_F(MasterVolumePluggedStateTest, TranscodedWithoutAMasterKeepsTheState) {
  ForgetEverything();
  EXPECT_EQ("", Transcoded("/shares/Vol/"));
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_THAT(Logged(),
              ElementsAre(Info("MasterVolumePluggedState:: Transcoded batch "),
                          Info("MasterVolumePluggedState:: We do not have a Master Volume, so "
                               "picture transcoded - ignored ")));
}

TEST_F(MasterVolumePluggedStateTest, UnpluggedOtherVolumeMovesToTheScannedState) {
  EXPECT_NE("", Unplugged("/shares/Other/"));
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("MasterVolumePluggedState:: Volumeunplugged "), MOVING,
                                    Info("We now have a master volume " +
                                         MasterText("/shares/Vol/", LARGE))));
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(MasterVolumePluggedStateTest, UnpluggedMasterIsReplacedByAnother) {
  Register("/shares/Next/", MIDDLE);
  Forget("/shares/Vol/");
  Unplugged("/shares/Vol/");
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_EQ("/shares/Next/", Master());
  EXPECT_EQ("zophotos_db_path=/shares/Next//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(MasterVolumePluggedStateTest, UnpluggedMasterWithoutASuccessorFallsBack) {
  ForgetEverything();
  std::filesystem::remove("/tmp/zophotodbmerger.conf");
  MergedRows("/shares", "INSERT INTO Folders VALUES(2, 1, '/shares/Vol/', 0, '/shares/Vol/')");
  EXPECT_EQ("Deleting the default state ", Unplugged("/shares/Vol/").substr(0, 27));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_THAT(Logged(),
              ElementsAre(Info("MasterVolumePluggedState:: Volumeunplugged "),
                          Info("We do NOT have a master volume so we can go back to the Default "
                               "State ")));
  EXPECT_THAT(MergedFolders("/shares"), IsEmpty());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  ASSERT_EQ(1U, Registry().getVolumes().size());
  EXPECT_EQ(SHARES_MASTER_TEXT, Registry().getVolumes()[0].ToString());
}

TEST_F(MasterVolumePluggedStateTest, SharesRootIsElectedAfterAFallback) {
  ForgetEverything();
  Unplugged("/shares/Vol/");
  Register("/shares/Small/", SMALL);
  Scanned("/shares/Small/");
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_EQ("/shares", Master());
  EXPECT_EQ("zophotos_db_path=/shares/.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(MasterVolumePluggedStateTest, UnusableMasterKeepsTheState) {
  std::ofstream("/shares/Vol/.zophotos") << "in the way";
  EXPECT_THROW(Scanned("/shares/Vol/"), dbmerger::PhotoDB::Error);
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
}

TEST_F(MasterVolumePluggedStateTest, FailedFallbackKeepsTheState) {
  ForgetEverything();
  MergedRows("/shares", "DROP TABLE Status");
  EXPECT_THROW(Unplugged("/shares/Vol/"), std::string);
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
}

} // namespace
} // namespace orva::test

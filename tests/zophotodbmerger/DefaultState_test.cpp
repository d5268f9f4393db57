#include "StatesTest.h"

#include "DefaultState.h"
#include "PhotoDB.h"

#include <fstream>

namespace orva::test {
namespace {

using dbmerger::State;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

using DefaultStateTest = StatesTest;

TEST_F(DefaultStateTest, HasTypeZero) {
  EXPECT_EQ(0, dbmerger::DefaultState().getStateType());
}

TEST_F(DefaultStateTest, PluggedElectsAndWaitsForTheScan) {
  Register("/shares/Vol/", LARGE);
  EXPECT_EQ("Setting the current to plugged state", Plugged("/shares/Vol/").substr(0, 36));
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_EQ("/shares/Vol/", Master());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: VolumePlugged "),
                                    Info("We now have a master volume " +
                                         MasterText("/shares/Vol/", LARGE))));
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_FALSE(std::filesystem::exists("/shares/Vol/.zophotos"));
}

TEST_F(DefaultStateTest, PluggedWithoutACandidateKeepsTheState) {
  ForgetSharesRoot();
  Register("/shares/Vol/", 1.0);
  EXPECT_EQ("", Plugged("/shares/Vol/"));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: VolumePlugged "),
                                    Error("/shares/Vol/  ---------  is not a candidate \n"),
                                    Info("DefaultState:: We DO NOT have a master volume ")));
}

TEST_F(DefaultStateTest, SharesRootIsElectedBeforeASmallerVolume) {
  Register("/shares/Vol/", SMALL);
  Plugged("/shares/Vol/");
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_EQ("/shares", Master());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: VolumePlugged "),
                                    Info("We now have a master volume " + SHARES_MASTER_TEXT)));
}

TEST_F(DefaultStateTest, ElectedMasterIsKept) {
  Register("/shares/Vol/", SMALL);
  ForgetSharesRoot();
  ASSERT_TRUE(Registry().reelectMasterVolume());
  Register("/shares/Larger/", LARGE);
  Plugged("/shares/Larger/");
  EXPECT_EQ(State::MASTER_VOLUME_PLUGGED, CurrentType());
  EXPECT_EQ("/shares/Vol/", Master());
}

TEST_F(DefaultStateTest, UnpluggedIsIgnoredEvenIfAVolumeCouldBeElected) {
  Register("/shares/Vol/", LARGE);
  EXPECT_EQ("", Unplugged("/shares/Other/"));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_EQ("DUMMY_MOUNT_POINT", Master());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: Volumeunplugged, ignoring! ")));
}

TEST_F(DefaultStateTest, PurgedIsIgnoredEvenIfAVolumeCouldBeElected) {
  Register("/shares/Vol/", LARGE);
  EXPECT_EQ("", Purged("/shares/Vol/"));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_EQ("DUMMY_MOUNT_POINT", Master());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: Volume purged - ignored! ")));
}

TEST_F(DefaultStateTest, ScannedElectsAndMovesToTheScannedState) {
  Register("/shares/Vol/", LARGE);
  EXPECT_EQ("Setting the current to scanned state", Scanned("/shares/Vol/").substr(0, 36));
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: Volume Scanned "),
                                    Info("Moving to the scanned state since we can safely do so "),
                                    Info("We now have a master volume " +
                                         MasterText("/shares/Vol/", LARGE))));
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
  EXPECT_THAT(MergedFolders("/shares/Vol"), IsEmpty()) << "a scan merges nothing";
}

TEST_F(DefaultStateTest, ScannedWithoutACandidateKeepsTheState) {
  ForgetSharesRoot();
  EXPECT_EQ("", Scanned("/shares/Vol/"));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: Volume Scanned "),
                                    Info("Staying in the Default state ")));
}

TEST_F(DefaultStateTest, TranscodedElectsAndMovesToTheScannedState) {
  EXPECT_EQ("Setting the current to scanned state", Transcoded("/shares/Vol/").substr(0, 36));
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("Moving to the scanned state since we can safely do so "),
                                    Info("We now have a master volume " + SHARES_MASTER_TEXT)));
  EXPECT_EQ("zophotos_db_path=/shares/.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(DefaultStateTest, TranscodedWithoutACandidateKeepsTheState) {
  ForgetSharesRoot();
  EXPECT_EQ("", Transcoded("/shares/Vol/"));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_THAT(Logged(), ElementsAre(Info("Staying in the Default state ")));
}

TEST_F(DefaultStateTest, UnusableMasterKeepsTheStateAndTheElection) {
  Register("/shares/Vol/", LARGE);
  std::ofstream("/shares/Vol/.zophotos") << "in the way";
  EXPECT_EQ("Invalid DB location : '/shares/Vol/.zophotos'",
            Thrown<dbmerger::PhotoDB::Error>([&] { Scanned("/shares/Vol/"); }).Message());
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_EQ("/shares/Vol/", Master());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
}

} // namespace
} // namespace orva::test

#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

const LogLine MOVING = Info("Moving to the scanned state since we can safely do so ");
const std::string TO_DEFAULT = "Setting the current to default stateADDRESS";
const std::string TO_PLUGGED = "Setting the current to plugged stateADDRESS";
const std::string TO_SCANNED = "Setting the current to scanned stateADDRESS";
const std::string DEFAULT_GONE = "Deleting the default state ADDRESS";
const std::string PLUGGED_GONE = "Deleting the plugged state ADDRESS";

LogLine Master(const std::string& text) {
  return Info("We now have a master volume " + text);
}
/// The same line as the scanned state writes it, with a blank at the end.
LogLine MasterAgain(const std::string& text) {
  return Info("We now have a master volume " + text + " ");
}

LogLine NoLocation(const std::string& mountPoint) {
  return Error("There is no filesystem location for the mountpoint " + mountPoint);
}

class Transitions : public SystemTest {
protected:
  void StartUp() {
    appliance.Start();
    appliance.TakeLog();
  }

  /// Starts without the shares root, which then is no candidate. The first volume creates it.
  void StartWithoutShares() {
    fs::remove("/shares");
    StartUp();
  }

  /// Handles a message, and drops its log and output.
  void After(const std::string& message) {
    appliance.Handle(message);
    appliance.TakeOutput();
  }
};

// The default state.

TEST_F(Transitions, DefaultPluggedWithAMasterGoesToPlugged) {
  StartUp();
  const Volume a("A", "150g");
  EXPECT_EQ((Log{PluggedLine(a), Info("Default:: VolumePlugged "), Master(MasterText(a))}),
            appliance.Handle(Plugged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(TO_PLUGGED));
  // The plugged state only waits: the scan creates the database.
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_FALSE(HasMergedDatabase(a.Path()));
}

TEST_F(Transitions, DefaultPluggedElectsTheSharesRootOverASmallerVolume) {
  StartUp();
  const Volume a("A", "50g");
  EXPECT_EQ((Log{PluggedLine(a), Info("Default:: VolumePlugged "), Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(Plugged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(TO_PLUGGED));
}

TEST_F(Transitions, DefaultPluggedWithoutACandidateStays) {
  StartWithoutShares();
  const Volume small("Small", "200m"); // not more than the 200 MiB that a master needs
  EXPECT_EQ((Log{PluggedLine(small), Info("Default:: VolumePlugged "),
                 Error("/shares/Small/  ---------  is not a candidate \n"),
                 Info("DefaultState:: We DO NOT have a master volume ")}),
            appliance.Handle(Plugged(small.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(Transitions, DefaultPluggedWithOnePageMoreThanNeededElects) {
  StartWithoutShares();
  const Volume enough("Enough", "209719296"); // 200 MiB and a page
  EXPECT_EQ(
      (Log{PluggedLine(enough), Info("Default:: VolumePlugged "), Master(MasterText(enough))}),
      appliance.Handle(Plugged(enough.Path())));
}

TEST_F(Transitions, DefaultPluggedOfAnAbsentVolumeStays) {
  StartWithoutShares();
  EXPECT_EQ((Log{NoLocation("/shares/Gone/"), Info("Default:: VolumePlugged "),
                 Info("DefaultState:: We DO NOT have a master volume ")}),
            appliance.Handle(Plugged("/shares/Gone")));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(Transitions, DefaultUnpluggedStays) {
  StartUp();
  EXPECT_EQ(Log{Info("Default:: Volumeunplugged, ignoring! ")},
            appliance.Handle(Unplugged("/shares/A")));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(Transitions, DefaultScannedWithAMasterGoesToScanned) {
  StartUp();
  const Volume a("A", "150g");
  // A volume is registered without its size before its plugging: the shares root is elected.
  EXPECT_EQ((Log{Info(":: Scanned"), Info("Default:: Volume Scanned "), MOVING,
                 Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(Scanned(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(TO_SCANNED));
  EXPECT_EQ(LocatorOn("/shares"), Appliance::Locator());
}

TEST_F(Transitions, DefaultScannedWithoutAMasterStays) {
  StartWithoutShares();
  const Volume a("A", "150g");
  EXPECT_EQ((Log{Info(":: Scanned"), Info("Default:: Volume Scanned "),
                 Error("/shares/A/  ---------  is not a candidate \n"),
                 Info("Staying in the Default state ")}),
            appliance.Handle(Scanned(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
}

TEST_F(Transitions, DefaultTranscodedWithAMasterGoesToScannedAndMergesNothing) {
  StartUp();
  const Volume a("A", "50g");
  Catalog(a).AddPhoto("a.jpg", 100, 200);
  EXPECT_EQ((BatchLines() + Log{MOVING, Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(TO_SCANNED));
  EXPECT_THAT(MergedDatabase("/shares").Files(), IsEmpty());
}

TEST_F(Transitions, DefaultTranscodedWithoutAMasterStays) {
  StartWithoutShares();
  const Volume a("A", "150g");
  EXPECT_EQ((BatchLines() + Log{Error("/shares/A/  ---------  is not a candidate \n"),
                                Info("Staying in the Default state ")}),
            appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(Transitions, DefaultEndCountsAsTranscoded) {
  StartUp();
  EXPECT_EQ((Log{Info(":: End "), NoLocation("/shares/Gone/"), MOVING, Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(End("/shares/Gone")));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(TO_SCANNED));
}

TEST_F(Transitions, DefaultPurgedStays) {
  StartUp();
  const Volume a("A", "150g");
  EXPECT_EQ((Log{Info(":: Purged "), Info("Default:: Volume purged - ignored! ")}),
            appliance.Handle(Purged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(Transitions, DefaultStaysWhenTheDatabaseOnTheMasterCannotBeOpened) {
  StartUp();
  // A file in the place of the directory makes the location unusable.
  fs::remove_all("/shares/.zophotos");
  std::ofstream("/shares/.zophotos") << "no directory";
  Log log = appliance.Handle(End("/shares"));
  ASSERT_EQ(4U, log.size());
  EXPECT_THAT(log.back().text, ::testing::StartsWith("MessageProcessor:: "));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());

  fs::remove("/shares/.zophotos");
  EXPECT_EQ((Log{Info(":: End "), MOVING, Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(End("/shares")));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(TO_SCANNED));
}

// The plugged state.

TEST_F(Transitions, PluggedPluggedStays) {
  StartUp();
  const Volume a("A", "150g");
  const Volume b("B", "200g");
  After(Plugged(a.Path()));
  EXPECT_EQ((Log{PluggedLine(b), Info("MasterVolumePluggedState:: VolumePlugged, ignoring! ")}),
            appliance.Handle(Plugged(b.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(Transitions, PluggedUnpluggedOfAnotherVolumeGoesToScanned) {
  StartUp();
  const Volume a("A", "150g");
  const std::string text = MasterText(a);
  After(Plugged(a.Path()));
  EXPECT_EQ((Log{Info("MasterVolumePluggedState:: Volumeunplugged "), MOVING, Master(text)}),
            appliance.Handle(Unplugged("/shares/B")));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_SCANNED));
  EXPECT_EQ(LocatorOn(a.MountPoint()), Appliance::Locator());
  EXPECT_THAT(MergedDatabase(a.Path()).Folders(), ElementsAre(ROOT_FOLDER));
}

TEST_F(Transitions, PluggedUnpluggedOfTheMasterGoesToScannedOnItsSuccessor) {
  StartUp();
  Volume a("A", "150g");
  const Volume b("B", "120g");
  const std::string text = MasterText(b);
  After(Plugged(a.Path()));
  After(Plugged(b.Path()));
  a.Unmount();
  EXPECT_EQ((Log{Info("MasterVolumePluggedState:: Volumeunplugged "), MOVING, Master(text)}),
            appliance.Handle(Unplugged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_SCANNED));
  EXPECT_EQ(LocatorOn(b.MountPoint()), Appliance::Locator());
}

TEST_F(Transitions, PluggedUnpluggedOfTheLastCandidateFallsBackToDefault) {
  StartWithoutShares();
  Volume a("A", "150g");
  After(Plugged(a.Path()));
  a.Unmount();
  EXPECT_EQ((Log{Info("MasterVolumePluggedState:: Volumeunplugged "),
                 Info("We do NOT have a master volume so we can go back to the Default State ")}),
            appliance.Handle(Unplugged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_DEFAULT));
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_THAT(MergedDatabase("/shares").Folders(), ElementsAre(ROOT_FOLDER));

  // The fallback has registered the shares root: the next scan elects it.
  EXPECT_EQ((Log{Info(":: Scanned"), NoLocation("/shares/A/"), Info("Default:: Volume Scanned "),
                 MOVING, Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(Scanned("/shares/A")));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(PLUGGED_GONE, TO_SCANNED));
  EXPECT_EQ(LocatorOn("/shares"), Appliance::Locator());
}

TEST_F(Transitions, PluggedFallbackWithoutTheSharesRootUsesADatabaseInTheWorkingDirectory) {
  StartWithoutShares();
  Volume a("A", "150g");
  After(Plugged(a.Path()));
  a.Unmount();
  fs::remove_all("/shares");
  EXPECT_EQ((Log{Info("MasterVolumePluggedState:: Volumeunplugged "),
                 Info("We do NOT have a master volume so we can go back to the Default State "),
                 NoLocation("/shares")}),
            appliance.Handle(Unplugged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_DEFAULT));
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_FALSE(fs::exists("/shares"));
}

TEST_F(Transitions, PluggedScannedGoesToScannedAndMergesNothing) {
  StartUp();
  const Volume a("A", "150g");
  Catalog(a).AddPhoto("a.jpg", 100, 200);
  const std::string text = MasterText(a);
  After(Plugged(a.Path()));
  EXPECT_EQ((Log{Info(":: Scanned"), Info("MasterVolumePluggedState:: VolumeScanned "), MOVING,
                 Master(text)}),
            appliance.Handle(Scanned(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_SCANNED));
  EXPECT_EQ(LocatorOn(a.MountPoint()), Appliance::Locator());
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), IsEmpty());
}

TEST_F(Transitions, PluggedTranscodedGoesToScannedAndMergesNothing) {
  StartUp();
  const Volume a("A", "150g");
  Catalog(a).AddPhoto("a.jpg", 100, 200);
  const std::string text = MasterText(a);
  After(Plugged(a.Path()));
  EXPECT_EQ((BatchLines() +
             Log{Info("MasterVolumePluggedState:: Transcoded batch "), MOVING, Master(text)}),
            appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_SCANNED));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), IsEmpty());
}

TEST_F(Transitions, PluggedEndGoesToScanned) {
  StartUp();
  const Volume a("A", "150g");
  const std::string text = MasterText(a);
  After(Plugged(a.Path()));
  EXPECT_EQ((Log{Info(":: End "), Info("MasterVolumePluggedState:: Transcoded batch "), MOVING,
                 Master(text)}),
            appliance.Handle(End(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_SCANNED));
}

TEST_F(Transitions, PluggedPurgedStays) {
  StartUp();
  const Volume a("A", "150g");
  After(Plugged(a.Path()));
  EXPECT_EQ((Log{Info(":: Purged "), Info("MasterVolumePluggedState:: We do not have a Master "
                                          "Volume, so volume purged - ignored ")}),
            appliance.Handle(Purged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

/// A plugged state without a master: the fallback has failed.
class PluggedWithoutMaster : public Transitions {
protected:
  void SetUp() override {
    StartWithoutShares();
    Volume a("A", "150g");
    After(Plugged(a.Path()));
    a.Unmount();
    std::ofstream("/shares/.zophotos") << "no directory";
    const Log log = appliance.Handle(Unplugged(a.Path()));
    ASSERT_EQ(3U, log.size());
    EXPECT_EQ(Info("MasterVolumePluggedState:: Volumeunplugged "), log[0]);
    EXPECT_EQ(Info("We do NOT have a master volume so we can go back to the Default State "),
              log[1]);
    EXPECT_THAT(log[2].text, ::testing::StartsWith("MessageProcessor:: "));
    EXPECT_EQ(Error("").priority, log[2].priority);
    EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
  }
};

TEST_F(PluggedWithoutMaster, ScannedStays) {
  EXPECT_EQ((Log{Info(":: Scanned"), NoLocation("/shares/Gone/"),
                 Info("MasterVolumePluggedState:: VolumeScanned "),
                 Info("MasterVolumePluggedState:: We do not have a Master Volume, so Volume "
                      "Scanned - ignored ")}),
            appliance.Handle(Scanned("/shares/Gone")));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(PluggedWithoutMaster, TranscodedStays) {
  EXPECT_EQ((BatchLines() +
             Log{NoLocation("/shares/Gone/"), Info("MasterVolumePluggedState:: Transcoded batch "),
                 Info("MasterVolumePluggedState:: We do not have a Master Volume, so "
                      "picture transcoded - ignored ")}),
            appliance.Handle(TranscodedBatch("/shares/Gone")));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
}

TEST_F(PluggedWithoutMaster, FallsBackAtTheNextUnplugging) {
  fs::remove("/shares/.zophotos");
  EXPECT_EQ((Log{Info("MasterVolumePluggedState:: Volumeunplugged "),
                 Info("We do NOT have a master volume so we can go back to the Default State ")}),
            appliance.Handle(Unplugged("/shares/Gone")));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(DEFAULT_GONE, TO_DEFAULT));
}

// The scanned state; merge_test.cpp tests its merges.

TEST_F(Transitions, ScannedPluggedStays) {
  StartUp();
  const Volume a("A", "150g");
  After(Scanned(a.Path()));
  const Volume b("B", "200g");
  EXPECT_EQ((Log{PluggedLine(b), Info("MasterVolumeScannedState:: VolumePlugged, ignoring! ")}),
            appliance.Handle(Plugged(b.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
  EXPECT_EQ(LocatorOn("/shares"), Appliance::Locator());
}

TEST_F(Transitions, ScannedScannedDoesNothing) {
  StartUp();
  const Volume a("A", "150g");
  Catalog(a).AddPhoto("a.jpg", 100, 200);
  After(Scanned(a.Path()));
  EXPECT_EQ(Log{Info(":: Scanned")}, appliance.Handle(Scanned(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
  EXPECT_THAT(MergedDatabase("/shares").Files(), IsEmpty());
}

TEST_F(Transitions, ScannedUnpluggedOfAnotherVolumeRenewsTheState) {
  StartUp();
  const Volume a("A", "150g");
  const std::string text = MasterText(a);
  After(Plugged(a.Path()));
  After(Scanned(a.Path()));
  fs::remove("/tmp/zophotodbmerger.conf");
  EXPECT_EQ((Log{Info("MasterVolumeScannedState:: Volumeunplugged "), MOVING, MasterAgain(text)}),
            appliance.Handle(Unplugged("/shares/B")));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(PLUGGED_GONE, TO_SCANNED));
  EXPECT_EQ(LocatorOn(a.MountPoint()), Appliance::Locator());
}

TEST_F(Transitions, ScannedUnpluggedOfTheMasterContinuesWithItsSuccessor) {
  StartUp();
  Volume a("A", "150g");
  const Volume b("B", "120g");
  const std::string text = MasterText(b);
  After(Plugged(a.Path()));
  After(Plugged(b.Path()));
  After(Scanned(a.Path()));
  a.Unmount();
  EXPECT_EQ((Log{Info("MasterVolumeScannedState:: Volumeunplugged "), MOVING, MasterAgain(text)}),
            appliance.Handle(Unplugged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(PLUGGED_GONE, TO_SCANNED));
  EXPECT_EQ(LocatorOn(b.MountPoint()), Appliance::Locator());
  EXPECT_THAT(MergedDatabase(b.Path()).Folders(), ElementsAre(ROOT_FOLDER));
}

TEST_F(Transitions, ScannedUnpluggedOfTheLastCandidateFallsBackToDefault) {
  StartWithoutShares();
  Volume a("A", "150g");
  After(Plugged(a.Path()));
  After(Scanned(a.Path()));
  a.Unmount();
  EXPECT_EQ((Log{Info("MasterVolumeScannedState:: Volumeunplugged "),
                 Info("We do NOT have a master volume, so going back to the Default State ")}),
            appliance.Handle(Unplugged(a.Path())));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(PLUGGED_GONE, TO_DEFAULT));
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_THAT(MergedDatabase("/shares").Folders(), ElementsAre(ROOT_FOLDER));

  // In the default state again, with the shares root to elect.
  const Volume b("B", "50g");
  EXPECT_EQ((Log{PluggedLine(b), Info("Default:: VolumePlugged "), Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(Plugged(b.Path())));
  EXPECT_THAT(appliance.TakeOutput(),
              ElementsAre("Deleting the scanned state ADDRESS", TO_PLUGGED));
}

TEST_F(Transitions, AMasterIsNotReplacedByALargerVolume) {
  StartUp();
  const Volume a("A", "150g");
  const Volume larger("Larger", "200g");
  const std::string text = MasterText(a);
  After(Plugged(a.Path()));
  After(Plugged(larger.Path()));
  EXPECT_EQ((Log{Info(":: Scanned"), Info("MasterVolumePluggedState:: VolumeScanned "), MOVING,
                 Master(text)}),
            appliance.Handle(Scanned(larger.Path())));
}

TEST_F(Transitions, AnElectionPrefersTheLargestVolume) {
  StartUp();
  Volume a("A", "150g");
  const Volume middle("Middle", "160g");
  const Volume largest("Largest", "200g");
  const Volume least("Least", "110g");
  const std::string text = MasterText(largest);
  After(Plugged(a.Path()));
  After(Plugged(middle.Path()));
  After(Plugged(largest.Path()));
  After(Plugged(least.Path()));
  a.Unmount();
  EXPECT_EQ((Log{Info("MasterVolumePluggedState:: Volumeunplugged "), MOVING, Master(text)}),
            appliance.Handle(Unplugged(a.Path())));
}

TEST_F(Transitions, AVolumeWithALineFeedInItsMountPointIsMergedButNotElected) {
  StartUp();
  const Volume broken("A\nzophotos_db_path=", "200g");
  Catalog(broken).AddPhoto("a.jpg", 100, 200);
  EXPECT_EQ((Log{PluggedLine(broken), Info("Default:: VolumePlugged "),
                 Error(broken.MountPoint() + "  ---------  is not a candidate \n"),
                 Master(SHARES_MASTER_TEXT)}),
            appliance.Handle(Plugged(broken.Path())));
  After(Scanned(broken.Path()));
  EXPECT_EQ(LocatorOn("/shares"), Appliance::Locator());
  After(TranscodedBatch(broken.Path()));
  EXPECT_THAT(MergedDatabase("/shares").Files(),
              ElementsAre(broken.MountPoint() + "a.jpg|100|100|" + broken.MountPoint()));
}

} // namespace
} // namespace orva::test

#include "StatesTest.h"

#include "Catalog.h"
#include "DefaultState.h"
#include "MasterVolumeScannedState.h"
#include "PhotoDB.h"

#include <fstream>

namespace orva::test {
namespace {

using dbmerger::PhotoDB;
using dbmerger::State;
using Unfinished = State::Unfinished;
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

LogLine MasterAgain(const std::string& text) {
  return Info("We now have a master volume " + text + " ");
}

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

// What events that failed have left undone.

/// The same with a volume "/shares/Next/", which can be the next master, and a catalog on
/// "/shares/C/".
class UnfinishedTest : public MasterVolumeScannedStateTest {
protected:
  UnfinishedTest() {
    Register("/shares/Next/", MIDDLE);
    MakeCatalog("/shares/C/");
  }

  /// Makes a location unusable.
  static void Obstruct(const std::string& location) {
    std::filesystem::remove_all(location + "/.zophotos");
    std::ofstream(location + "/.zophotos") << "in the way";
  }
  static void Clear(const std::string& location) {
    std::filesystem::remove(location + "/.zophotos");
  }

  /// Unplugs the master. The removal of its rows fails.
  void FailTheRemoval() {
    Obstruct("/tmp/scratch");
    Forget("/shares/Vol/");
    EXPECT_THROW(Unplugged("/shares/Vol/"), PhotoDB::Error);
    Logged();
  }

  /// Unplugs the master. The database on the next one cannot be opened.
  void FailTheTransition() {
    Obstruct("/shares/Next");
    Forget("/shares/Vol/");
    EXPECT_THROW(Unplugged("/shares/Vol/"), PhotoDB::Error);
    Logged();
  }

  std::string Recover() const {
    return OutputOf([&] { Current().recover(); });
  }

  /// The state is complete and merges into the database at `master`, which the locator names.
  void ExpectMergesInto(const std::string& master) {
    EXPECT_EQ(Unfinished::Nothing, Current().getUnfinished());
    EXPECT_EQ("zophotos_db_path=" + master + "/.zophotos/zophotos.db\n", Appliance::Locator());
    Transcoded("/shares/C/");
    EXPECT_THAT(MergedFiles(master), ElementsAre("/shares/C/a.jpg"));
    EXPECT_THAT(MergedStatistics(master), ElementsAre("/shares/C/|1|1|100"));
  }
};

TEST_F(UnfinishedTest, StatesWithoutAFailureHaveNothingUnfinished) {
  EXPECT_EQ(Unfinished::Nothing, Current().getUnfinished());
  Forget("/shares/Vol/");
  Unplugged("/shares/Vol/");
  EXPECT_EQ(Unfinished::Nothing, Current().getUnfinished());
  ForgetSharesRoot();
  Forget("/shares/Next/");
  Unplugged("/shares/Next/");
  ASSERT_EQ(State::DEFAULT, CurrentType());
  EXPECT_EQ(Unfinished::Nothing, Current().getUnfinished());
  OutputOf([&] { Current().recover(); });
  EXPECT_EQ(State::DEFAULT, CurrentType());
}

TEST_F(UnfinishedTest, FailedRemovalFromAMasterThatStaysLeavesNothing) {
  MergedRows("/shares/Vol", "ALTER TABLE Statistics RENAME TO Stored");
  EXPECT_THROW(Unplugged("/shares/C/"), std::string);
  EXPECT_EQ(Unfinished::Nothing, Current().getUnfinished());
}

TEST_F(UnfinishedTest, FailedRemovalOfTheMasterLeavesTheElection) {
  FailTheRemoval();
  EXPECT_EQ(Unfinished::Election, Current().getUnfinished());
  State* const before = &Current();

  EXPECT_THAT(Recover(), ::testing::HasSubstr("Setting the current to scanned state"));

  EXPECT_NE(before, &Current());
  EXPECT_THAT(Logged(), ElementsAre(MOVING, MasterAgain(MasterText("/shares/Next/", MIDDLE))));
  ExpectMergesInto("/shares/Next/");
}

TEST_F(UnfinishedTest, FailureAfterTheRemovalLeavesTheTransition) {
  FailTheTransition();
  EXPECT_EQ(Unfinished::Transition, Current().getUnfinished());
  Clear("/shares/Next");
  Recover();
  EXPECT_THAT(Logged(), ElementsAre(MOVING, MasterAgain(MasterText("/shares/Next/", MIDDLE))));
  ExpectMergesInto("/shares/Next/");
}

TEST_F(UnfinishedTest, FailedElectionLeavesTheTransition) {
  FailTheRemoval();
  Obstruct("/shares/Next");
  State* const before = &Current();
  EXPECT_THROW(Recover(), PhotoDB::Error);
  EXPECT_EQ(before, &Current());
  EXPECT_EQ(Unfinished::Transition, Current().getUnfinished());
  EXPECT_THROW(Recover(), PhotoDB::Error);
  EXPECT_EQ(Unfinished::Transition, Current().getUnfinished());
  Clear("/shares/Next");
  Recover();
  ExpectMergesInto("/shares/Next/");
}

TEST_F(UnfinishedTest, TransitionContinuesWithAnotherMasterWhenTheNextOneIsUnpluggedToo) {
  FailTheTransition();
  Forget("/shares/Next/");
  EXPECT_EQ(Unfinished::Transition, Current().getUnfinished());
  Recover();
  EXPECT_EQ("/shares", Master());
  ExpectMergesInto("/shares");
}

TEST_F(UnfinishedTest, TransitionFallsBackWhenNoVolumeIsLeft) {
  FailTheTransition();
  Forget("/shares/Next/");
  ForgetSharesRoot();
  ASSERT_THAT(Registry().getVolumes(), IsEmpty());
  Recover();
  EXPECT_THAT(Logged(),
              ElementsAre(Info("We do NOT have a master volume, so going back to the Default "
                               "State ")));
  EXPECT_EQ(State::DEFAULT, CurrentType());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
}

TEST_F(UnfinishedTest, FailedFallbackLeavesTheTransition) {
  Forget("/shares/Next/");
  ForgetSharesRoot();
  Obstruct("/shares");
  Forget("/shares/Vol/");
  EXPECT_THROW(Unplugged("/shares/Vol/"), PhotoDB::Error);
  EXPECT_EQ(Unfinished::Transition, Current().getUnfinished());
  EXPECT_THROW(Recover(), PhotoDB::Error);
  Register("/shares/Next/", SMALL);
  Recover();
  ExpectMergesInto("/shares/Next/");
}

TEST_F(UnfinishedTest, FailedDeletionOfAnEarlierStateLeavesTheTransition) {
  /// A state whose destructor throws.
  class Failing final : public dbmerger::DefaultState {
  public:
    ~Failing() noexcept(false) override { throw std::string("the end failed"); }
  };
  OutputOf([&] {
    machine.setCurrentState(std::make_unique<Failing>().release());
    machine.setCurrentState(std::make_unique<dbmerger::MasterVolumeScannedState>().release());
  });
  State* const before = &Current();
  EXPECT_THROW(Unplugged("/shares/D/"), std::string);
  EXPECT_EQ(before, &Current());
  EXPECT_EQ(Unfinished::Transition, Current().getUnfinished());
  Recover();
  EXPECT_NE(before, &Current());
  ExpectMergesInto("/shares/Vol/");
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

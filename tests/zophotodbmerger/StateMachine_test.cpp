#include "DaemonLayerTest.h"

#include "DefaultState.h"
#include "PhotoDB.h"
#include "State.h"
#include "StateMachine.h"
#include "VolumeInfoManager.h"

#include <fstream>
#include <sstream>

namespace orva::test {
namespace {

using dbmerger::DefaultState;
using dbmerger::PhotoDB;
using dbmerger::State;
using dbmerger::StateMachine;
using dbmerger::VolumeInfo;
using dbmerger::VolumeInfoManager;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

using StateMachineTest = DaemonLayerTest;

/// A state of any type that records its destruction.
class ProbeState final : public DefaultState {
public:
  ProbeState(int type, Lines& ended, bool throws = false)
      : type_(type), ended_(ended), throws_(throws) {}
  ~ProbeState() noexcept(false) override {
    ended_.push_back("end of " + std::to_string(type_));
    if (throws_) {
      throw std::string("the end failed");
    }
  }
  int getStateType() override { return type_; }

private:
  int type_;
  Lines& ended_;
  bool throws_;
};

std::string Address(const State* state) {
  std::ostringstream text;
  text << static_cast<const void*>(state);
  return text.str();
}

std::string Set(StateMachine& machine, State* state) {
  return OutputOf([&] { machine.setCurrentState(state); });
}

// The start.

TEST_F(StateMachineTest, StartsInDefaultStateSilently) {
  EXPECT_EQ("", OutputOf([] {
              const StateMachine machine;
              EXPECT_EQ(State::DEFAULT, machine.getCurrentState()->getStateType());
            }));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(StateMachineTest, StartPointsTheLocatorAtTheSharesRoot) {
  const StateMachine machine;
  EXPECT_EQ("zophotos_db_path=/shares//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(StateMachineTest, StartRegistersTheSharesRoot) {
  const StateMachine machine;
  const auto& volumes = VolumeInfoManager::Instance().getVolumes();
  ASSERT_EQ(1U, volumes.size());
  EXPECT_EQ("/shares", volumes[0].mountPoint);
  EXPECT_EQ(104857600000.0, volumes[0].capacity);
  EXPECT_EQ(100.0, volumes[0].used);
  EXPECT_EQ(1, volumes[0].photoDbSize);
  EXPECT_EQ(1, volumes[0].timestamp);
  EXPECT_FALSE(volumes[0].readOnly);
  EXPECT_EQ("DUMMY_MOUNT_POINT", VolumeInfoManager::Instance().getMasterVolume().mountPoint);
}

TEST_F(StateMachineTest, StartCreatesTheMergedDatabaseAndSetsItsTime) {
  const std::time_t before = std::time(nullptr);
  const StateMachine machine;
  const std::time_t after = std::time(nullptr);
  const Lines rows = MergedRows("/shares", "SELECT mdate FROM Status");
  ASSERT_EQ(1U, rows.size());
  EXPECT_GE(std::stol(rows[0]), before);
  EXPECT_LE(std::stol(rows[0]), after);
  EXPECT_THAT(MergedRows("/shares", "SELECT id, mc_version, desc, etype FROM Status"),
              ElementsAre("1|2.0||0"));
  EXPECT_THAT(MergedRows("/shares", "SELECT * FROM Folders"),
              ElementsAre("1|-1|/shares/|0|<DUMMY>"));
}

TEST_F(StateMachineTest, StartRemovesTheRowsOfAnEarlierRun) {
  PhotoDB("/shares").Init();
  for (const char* const sql :
       {"INSERT INTO Folders VALUES(2, 1, '/shares/Vol/', 0, '/shares/Vol/')",
        "INSERT INTO Files VALUES(1, 2, 'a.jpg', 0, '/shares/Vol/', 0)",
        "INSERT INTO Statistics VALUES(1, '/shares/Vol/', 1, 1, 100)",
        "UPDATE Status SET mc_version = '3.0', desc = 'kept'"}) {
    MergedRows("/shares", sql);
  }
  const StateMachine machine;
  EXPECT_THAT(MergedFolders("/shares"), IsEmpty());
  EXPECT_THAT(MergedFiles("/shares"), IsEmpty());
  EXPECT_THAT(MergedStatistics("/shares"), IsEmpty());
  EXPECT_THAT(MergedRows("/shares", "SELECT mc_version, desc FROM Status"),
              ElementsAre("3.0|kept"));
}

TEST_F(StateMachineTest, StartWithoutTheSharesRootHasAnEmptyRegistry) {
  std::filesystem::remove("/shares");
  std::filesystem::current_path(MakeDirectory("/tmp/scratch"));
  const StateMachine machine;
  EXPECT_THAT(Logged(),
              ElementsAre(Error("There is no filesystem location for the mountpoint /shares")));
  EXPECT_THAT(VolumeInfoManager::Instance().getVolumes(), IsEmpty());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_TRUE(std::filesystem::exists("/tmp/scratch/.zophotos/zophotos.db"));
  EXPECT_FALSE(std::filesystem::exists("/shares"));
}

TEST_F(StateMachineTest, UnusableSharesRootPreventsTheMachine) {
  std::ofstream("/shares/.zophotos") << "in the way";
  EXPECT_EQ("Invalid DB location : '/shares/.zophotos'",
            Thrown<PhotoDB::Error>([] { StateMachine::Instance(); }).Message());
  EXPECT_EQ(nullptr, StateMachine::instance);
  EXPECT_EQ("(absent)", Appliance::Locator());
  EXPECT_EQ(nullptr, VolumeInfoManager::instance);
}

TEST_F(StateMachineTest, InstanceIsCreatedOnceOnFirstUse) {
  EXPECT_EQ(nullptr, StateMachine::instance);
  StateMachine* const made = &StateMachine::Instance();
  EXPECT_EQ(made, StateMachine::instance);
  EXPECT_EQ(made, &StateMachine::Instance());
}

// Transitions.

TEST_F(StateMachineTest, FirstTransitionPrintsOnlyTheNewState) {
  Lines ended;
  StateMachine machine;
  State* const plugged = std::make_unique<ProbeState>(1, ended).release();
  EXPECT_EQ("Setting the current to plugged state" + Address(plugged) + "\n",
            Set(machine, plugged));
  EXPECT_EQ(plugged, machine.getCurrentState());
}

TEST_F(StateMachineTest, LaterTransitionsPrintTheDeletedStateToo) {
  Lines ended;
  StateMachine machine;
  const std::string start = Address(machine.getCurrentState());
  State* const scanned = std::make_unique<ProbeState>(2, ended).release();
  const std::string scannedAddress = Address(scanned);
  State* const plugged = std::make_unique<ProbeState>(1, ended).release();
  const std::string pluggedAddress = Address(plugged);
  State* const standard = std::make_unique<ProbeState>(0, ended).release();
  State* const last = std::make_unique<ProbeState>(0, ended).release();

  EXPECT_EQ("Setting the current to scanned state" + scannedAddress + "\n", Set(machine, scanned));
  EXPECT_EQ("Deleting the default state " + start + "\nSetting the current to plugged state" +
                pluggedAddress + "\n",
            Set(machine, plugged));
  EXPECT_EQ("Deleting the scanned state " + scannedAddress +
                "\nSetting the current to default state" + Address(standard) + "\n",
            Set(machine, standard));
  EXPECT_EQ("Deleting the plugged state " + pluggedAddress +
                "\nSetting the current to default state" + Address(last) + "\n",
            Set(machine, last));
  EXPECT_THAT(Logged(), IsEmpty()) << "the lines go to standard output only";
}

TEST_F(StateMachineTest, ReplacedStateLivesUntilTheNextTransition) {
  Lines ended;
  {
    StateMachine machine;
    Set(machine, std::make_unique<ProbeState>(1, ended).release());
    Set(machine, std::make_unique<ProbeState>(2, ended).release());
    EXPECT_THAT(ended, IsEmpty());
    Set(machine, std::make_unique<ProbeState>(0, ended).release());
    EXPECT_THAT(ended, ElementsAre("end of 1"));
    Set(machine, std::make_unique<ProbeState>(7, ended).release());
    EXPECT_THAT(ended, ElementsAre("end of 1", "end of 2"));
  }
}

TEST_F(StateMachineTest, StateOfAnUnknownTypeHasNoLines) {
  Lines ended;
  StateMachine machine;
  Set(machine, std::make_unique<ProbeState>(0, ended).release());
  EXPECT_NE("", Set(machine, std::make_unique<ProbeState>(3, ended).release()));
  EXPECT_EQ("Deleting the default state ",
            Set(machine, std::make_unique<ProbeState>(-1, ended).release()).substr(0, 27));
  EXPECT_EQ("", Set(machine, std::make_unique<ProbeState>(1000, ended).release()));
  EXPECT_THAT(ended, ElementsAre("end of 0", "end of 3"));
  EXPECT_EQ("", Set(machine, std::make_unique<ProbeState>(-7, ended).release()));
  EXPECT_THAT(ended, ElementsAre("end of 0", "end of 3", "end of -1"));
}

TEST_F(StateMachineTest, DestructorOfAStateThatThrowsReleasesBothStates) {
  Lines ended;
  StateMachine machine;
  Set(machine, std::make_unique<ProbeState>(1, ended, true).release());
  State* const current = std::make_unique<ProbeState>(2, ended).release();
  Set(machine, current);
  std::string thrown;
  OutputOf([&] {
    thrown =
        Thrown([&] { machine.setCurrentState(std::make_unique<ProbeState>(0, ended).release()); });
  });
  EXPECT_EQ("the end failed", thrown);
  EXPECT_THAT(ended, ElementsAre("end of 1", "end of 0"));
  EXPECT_EQ(current, machine.getCurrentState());

  State* const next = std::make_unique<ProbeState>(1, ended).release();
  EXPECT_EQ("Setting the current to plugged state" + Address(next) + "\n", Set(machine, next));
}

// Transitions that several states make.

TEST_F(StateMachineTest, FallbackPreparesTheSharesRootAgain) {
  StateMachine& machine = StateMachine::Instance();
  Lines ended;
  Set(machine, std::make_unique<ProbeState>(1, ended).release());
  MergedRows("/shares", "INSERT INTO Folders VALUES(2, 1, '/shares/Vol/', 0, '/shares/Vol/')");
  MergedRows("/shares", "UPDATE Status SET mdate = 5");
  VolumeInfo root{.mountPoint = "/shares"};
  VolumeInfoManager::Instance().removeVolumeInfo(root);
  std::filesystem::remove("/tmp/zophotodbmerger.conf");
  const std::time_t before = std::time(nullptr);

  OutputOf([&] { machine.fallBackToDefaultState(); });

  EXPECT_EQ(State::DEFAULT, machine.getCurrentState()->getStateType());
  EXPECT_THAT(MergedFolders("/shares"), IsEmpty());
  EXPECT_GE(std::stol(MergedRows("/shares", "SELECT mdate FROM Status").at(0)), before);
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  ASSERT_EQ(1U, VolumeInfoManager::Instance().getVolumes().size());
  EXPECT_EQ(SHARES_MASTER_TEXT, VolumeInfoManager::Instance().getVolumes()[0].ToString());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(StateMachineTest, FailedFallbackKeepsTheState) {
  StateMachine& machine = StateMachine::Instance();
  Lines ended;
  State* const plugged = std::make_unique<ProbeState>(1, ended).release();
  Set(machine, plugged);
  MergedRows("/shares", "DROP TABLE Statistics");
  EXPECT_THROW(machine.fallBackToDefaultState(), std::string);
  EXPECT_EQ(plugged, machine.getCurrentState());
}

TEST_F(StateMachineTest, MoveToScannedStateLogsTheMaster) {
  StateMachine& machine = StateMachine::Instance();
  ASSERT_TRUE(VolumeInfoManager::Instance().reelectMasterVolume());
  EXPECT_EQ("Setting the current to scanned state",
            OutputOf([&] { machine.moveToScannedState(); }).substr(0, 36));
  EXPECT_EQ(State::MASTER_VOLUME_SCANNED, machine.getCurrentState()->getStateType());
  EXPECT_THAT(Logged(), ElementsAre(Info("Moving to the scanned state since we can safely do so "),
                                    Info("We now have a master volume " + SHARES_MASTER_TEXT)));
}

} // namespace
} // namespace orva::test

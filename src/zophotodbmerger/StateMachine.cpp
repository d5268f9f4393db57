#include "stdafx.h"

#include "StateMachine.h"

#include "DefaultState.h"
#include "MasterVolumeScannedState.h"
#include "PhotoDB.h"
#include "StandardOutput.h"
#include "Util.h"
#include "VolumeInfoManager.h"

#include "orvautil/OwnerVector.h"

#include <sstream>

namespace orva::dbmerger {

namespace {

/// Prepares the merged database at the shares root, where it is while there is no master.
void PrepareSharesRoot() {
  PhotoDB photos(SHARES_ROOT);
  photos.Init();
  photos.DeleteVolumes();
  photos.status.mdate = std::time(nullptr);
  photos.UpdateStatus();

  updateLocatorFile(SHARES_ROOT + NATIVE_PATH_SEPARATOR);

  VolumeInfo root{.mountPoint = SHARES_ROOT,
                  .capacity = 104857600000.0,
                  .used = 100.0,
                  .photoDbSize = 1,
                  .timestamp = 1,
                  .readOnly = false};
  VolumeInfoManager::Instance().addVolumeInfo(root);
}

/// Writes the text for the state's type and the state's address, which distinguishes states of one
/// type. An unknown type has no line.
void WriteStateLine(const std::vector<const char*>& texts, State& state) {
  const auto type = static_cast<std::size_t>(state.getStateType());
  if (type < texts.size()) {
    std::ostringstream address;
    address << static_cast<const void*>(&state);
    StandardOutput& output = StandardOutput::Current();
    output.WriteLine({texts[type], address.str()});
    output.Flush();
  }
}

} // namespace

StateMachine* StateMachine::instance = nullptr;

StateMachine& StateMachine::Instance() {
  if (instance == nullptr) {
    instance = std::make_unique<StateMachine>().release();
  }
  return *instance;
}

StateMachine::StateMachine() : currentState(std::make_unique<DefaultState>()) {
  PrepareSharesRoot();
}

StateMachine::~StateMachine() = default;

void StateMachine::setCurrentState(State* newState) {
  std::unique_ptr<State> next(newState);
  if (previousState) {
    WriteStateLine({"Deleting the default state ", "Deleting the plugged state ",
                    "Deleting the scanned state "},
                   *previousState);
    // An exception of the destructor leaves the vector; std::unique_ptr would end the process.
    util::OwnerVector<State> finished;
    finished.push_back(std::move(previousState));
  }
  previousState = std::exchange(currentState, std::move(next));
  WriteStateLine({"Setting the current to default state", "Setting the current to plugged state",
                  "Setting the current to scanned state"},
                 *currentState);
}

void StateMachine::moveToScannedState() {
  syslog(LOG_LOCAL1 | LOG_INFO, "Moving to the scanned state since we can safely do so ");
  syslog(LOG_LOCAL1 | LOG_INFO, "We now have a master volume %s",
         VolumeInfoManager::Instance().getMasterVolume().ToString().c_str());
  setCurrentState(std::make_unique<MasterVolumeScannedState>().release());
}

void StateMachine::fallBackToDefaultState() {
  auto next = std::make_unique<DefaultState>();
  PrepareSharesRoot();
  setCurrentState(next.release());
}

} // namespace orva::dbmerger

#include "stdafx.h"

#include "DefaultState.h"

#include "MasterVolumePluggedState.h"
#include "StateMachine.h"
#include "VolumeInfoManager.h"

namespace orva::dbmerger {

void DefaultState::handleVolumePlugged(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "Default:: VolumePlugged ");
  VolumeInfoManager& registry = VolumeInfoManager::Instance();
  if (!registry.reelectMasterVolume()) {
    syslog(LOG_LOCAL1 | LOG_INFO, "DefaultState:: We DO NOT have a master volume ");
    return;
  }
  syslog(LOG_LOCAL1 | LOG_INFO, "We now have a master volume %s",
         registry.getMasterVolume().ToString().c_str());
  StateMachine::Instance().setCurrentState(std::make_unique<MasterVolumePluggedState>().release());
}

void DefaultState::handleVolumeUnplugged(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "Default:: Volumeunplugged, ignoring! ");
}

void DefaultState::handleVolumeScanned(VolumeInfo volume) {
  syslog(LOG_LOCAL1 | LOG_INFO, "Default:: Volume Scanned ");
  DefaultState::handlePictureTranscoded(std::move(volume));
}

// The volume of the event is merged only after its next batch or purge.
void DefaultState::handlePictureTranscoded(VolumeInfo /*volume*/) {
  if (!VolumeInfoManager::Instance().reelectMasterVolume()) {
    syslog(LOG_LOCAL1 | LOG_INFO, "Staying in the Default state ");
    return;
  }
  StateMachine::Instance().moveToScannedState();
}

void DefaultState::handleVolumePurged(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "Default:: Volume purged - ignored! ");
}

int DefaultState::getStateType() {
  return DEFAULT;
}

} // namespace orva::dbmerger

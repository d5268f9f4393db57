#include "stdafx.h"

#include "MasterVolumePluggedState.h"

#include "StateMachine.h"
#include "VolumeInfoManager.h"

namespace orva::dbmerger {

void MasterVolumePluggedState::handleVolumePlugged(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "MasterVolumePluggedState:: VolumePlugged, ignoring! ");
}

// Nothing was merged in this state, so there is nothing to remove. Also when another volume than
// the master went away, the state moves on without waiting for a scan.
void MasterVolumePluggedState::handleVolumeUnplugged(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "MasterVolumePluggedState:: Volumeunplugged ");
  if (VolumeInfoManager::Instance().reelectMasterVolume()) {
    StateMachine::Instance().moveToScannedState();
    return;
  }
  syslog(LOG_LOCAL1 | LOG_INFO,
         "We do NOT have a master volume so we can go back to the Default State ");
  StateMachine::Instance().fallBackToDefaultState();
}

void MasterVolumePluggedState::handleVolumeScanned(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "MasterVolumePluggedState:: VolumeScanned ");
  if (VolumeInfoManager::Instance().reelectMasterVolume()) {
    StateMachine::Instance().moveToScannedState();
    return;
  }
  syslog(LOG_LOCAL1 | LOG_INFO,
         "MasterVolumePluggedState:: We do not have a Master Volume, so Volume Scanned - ignored ");
}

void MasterVolumePluggedState::handlePictureTranscoded(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "MasterVolumePluggedState:: Transcoded batch ");
  if (VolumeInfoManager::Instance().reelectMasterVolume()) {
    StateMachine::Instance().moveToScannedState();
    return;
  }
  syslog(
      LOG_LOCAL1 | LOG_INFO,
      "MasterVolumePluggedState:: We do not have a Master Volume, so picture transcoded - ignored ");
}

void MasterVolumePluggedState::handleVolumePurged(VolumeInfo /*volume*/) {
  // The wording, known to log readers, denies the master that this state has.
  syslog(LOG_LOCAL1 | LOG_INFO,
         "MasterVolumePluggedState:: We do not have a Master Volume, so volume purged - ignored ");
}

int MasterVolumePluggedState::getStateType() {
  return MASTER_VOLUME_PLUGGED;
}

} // namespace orva::dbmerger

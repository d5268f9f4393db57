#include "stdafx.h"

#include "MasterVolumePluggedState.h"

#include "StateMachine.h"
#include "VolumeInfoManager.h"

namespace orva::dbmerger {

void MasterVolumePluggedState::handleVolumePlugged(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "MasterVolumePluggedState:: VolumePlugged, ignoring! ");
}

// Nothing has been merged in this state, so there is nothing to remove. The state moves on without
// waiting for a scan, also when the volume was not the master.
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
  // There is a master in this state. Log readers rely on the text, which says otherwise.
  syslog(LOG_LOCAL1 | LOG_INFO,
         "MasterVolumePluggedState:: We do not have a Master Volume, so volume purged - ignored ");
}

int MasterVolumePluggedState::getStateType() {
  return MASTER_VOLUME_PLUGGED;
}

} // namespace orva::dbmerger

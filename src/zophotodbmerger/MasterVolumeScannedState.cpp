#include "stdafx.h"

#include "MasterVolumeScannedState.h"

#include "PhotoDB.h"
#include "StateMachine.h"
#include "Util.h"
#include "VolumeInfoManager.h"

namespace orva::dbmerger {

MasterVolumeScannedState::JoinedMerger::~JoinedMerger() noexcept(false) {
  merger.stopRequested = true;
  merger.Wait();
}

MasterVolumeScannedState::MasterVolumeScannedState() {
  const std::string master = VolumeInfoManager::Instance().getMasterVolume().mountPoint;
  PhotoDB photos(master);
  photos.Init();
  updateLocatorFile(master);
}

void MasterVolumeScannedState::handleVolumePlugged(VolumeInfo /*volume*/) {
  syslog(LOG_LOCAL1 | LOG_INFO, "MasterVolumeScannedState:: VolumePlugged, ignoring! ");
}

void MasterVolumeScannedState::handleVolumeUnplugged(VolumeInfo volume) {
  syslog(LOG_LOCAL1 | LOG_INFO, "MasterVolumeScannedState:: Volumeunplugged ");
  // When the master itself was unplugged, the registry has the empty record: the rows are then
  // removed from a database that is on no volume.
  owned.merger.RemoveVolume(VolumeInfoManager::Instance().getMasterVolume().mountPoint,
                            volume.mountPoint);
  MasterVolumeScannedState::recover();
}

void MasterVolumeScannedState::recover() {
  owned.merger.stopRequested = true;
  VolumeInfoManager& registry = VolumeInfoManager::Instance();
  if (registry.reelectMasterVolume()) {
    syslog(LOG_LOCAL1 | LOG_INFO, "Moving to the scanned state since we can safely do so ");
    // The blank at the end distinguishes this line from those of the other states.
    syslog(LOG_LOCAL1 | LOG_INFO, "We now have a master volume %s ",
           registry.getMasterVolume().ToString().c_str());
    StateMachine::Instance().setCurrentState(
        std::make_unique<MasterVolumeScannedState>().release());
    return;
  }
  syslog(LOG_LOCAL1 | LOG_INFO,
         "We do NOT have a master volume, so going back to the Default State ");
  StateMachine::Instance().fallBackToDefaultState();
}

// A scan changes nothing: the volume is merged when its photos are transcoded.
void MasterVolumeScannedState::handleVolumeScanned(VolumeInfo /*volume*/) {}

void MasterVolumeScannedState::handlePictureTranscoded(VolumeInfo volume) {
  const std::string& master = VolumeInfoManager::Instance().getMasterVolume().mountPoint;
  syslog(LOG_LOCAL1 | LOG_INFO,
         "MasterVolumeScannedState:: handlePictureTranscoded, doing merge for mountPoint %s using "
         "master volume at %s",
         volume.mountPoint.c_str(), master.c_str());
  owned.merger.MergeDB(master, volume.mountPoint);
}

void MasterVolumeScannedState::handleVolumePurged(VolumeInfo volume) {
  const std::string& master = VolumeInfoManager::Instance().getMasterVolume().mountPoint;
  syslog(LOG_LOCAL1 | LOG_INFO,
         "MasterVolumeScannedState:: handleVolumePurged, doing merge for mountPoint %s using "
         "master volume at %s",
         volume.mountPoint.c_str(), master.c_str());
  owned.merger.ReMergeDB(master, volume.mountPoint);
}

int MasterVolumeScannedState::getStateType() {
  return MASTER_VOLUME_SCANNED;
}

State::Unfinished MasterVolumeScannedState::getUnfinished() {
  if (owned.merger.stopRequested) {
    return Unfinished::Transition;
  }
  const bool hasMaster = VolumeInfoManager::Instance().getMasterVolume() != EmptyVolumeInfo;
  return hasMaster ? Unfinished::Nothing : Unfinished::Election;
}

} // namespace orva::dbmerger

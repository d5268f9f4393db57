#include "stdafx.h"

#include "MasterVolumeScannedState.h"

#include "PhotoDB.h"
#include "StateMachine.h"
#include "Util.h"
#include "VolumeInfoManager.h"

#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"
#include "orvautil/Path.h"

namespace orva::dbmerger {

namespace {

/// The master's mount point. Throws util::Exception when a master was elected and its volume is
/// gone: PhotoDB would use the working directory instead.
const std::string& MasterMountPoint() {
  const VolumeInfo& master = VolumeInfoManager::Instance().getMasterVolume();
  const std::string& path = master.mountPoint;
  if (master != EmptyVolumeInfo && !path.empty() && util::Path(path).Canonicalize().empty()) {
    throw util::Exception(util::FormatString("there is no volume at '%s'", path.c_str()));
  }
  return path;
}

} // namespace

MasterVolumeScannedState::JoinedMerger::~JoinedMerger() noexcept(false) {
  merger.stopRequested = true;
  merger.Wait();
}

MasterVolumeScannedState::MasterVolumeScannedState() {
  const std::string& master = MasterMountPoint();
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
  owned.merger.MergeDB(MasterMountPoint(), volume.mountPoint);
}

void MasterVolumeScannedState::handleVolumePurged(VolumeInfo volume) {
  const std::string& master = VolumeInfoManager::Instance().getMasterVolume().mountPoint;
  syslog(LOG_LOCAL1 | LOG_INFO,
         "MasterVolumeScannedState:: handleVolumePurged, doing merge for mountPoint %s using "
         "master volume at %s",
         volume.mountPoint.c_str(), master.c_str());
  owned.merger.ReMergeDB(MasterMountPoint(), volume.mountPoint);
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

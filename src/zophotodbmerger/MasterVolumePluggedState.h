#pragma once

#include "State.h"

namespace orva::dbmerger {

/// A master volume has been elected, but no merged database has been opened on it yet: that waits
/// for a scan or a batch of photos.
class MasterVolumePluggedState : public State {
public:
  void handleVolumePlugged(VolumeInfo volume) override;
  void handleVolumeUnplugged(VolumeInfo volume) override;
  void handleVolumeScanned(VolumeInfo volume) override;
  void handlePictureTranscoded(VolumeInfo volume) override;
  void handleVolumePurged(VolumeInfo volume) override;
  int getStateType() override;
};

} // namespace orva::dbmerger

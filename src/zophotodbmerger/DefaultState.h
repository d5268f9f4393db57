#pragma once

#include "State.h"

namespace orva::dbmerger {

/// There is no master volume; plugged, scanned and transcoded events start an election.
class DefaultState : public State {
public:
  void handleVolumePlugged(VolumeInfo volume) override;
  void handleVolumeUnplugged(VolumeInfo volume) override;
  void handleVolumeScanned(VolumeInfo volume) override;
  void handlePictureTranscoded(VolumeInfo volume) override;
  void handleVolumePurged(VolumeInfo volume) override;
  int getStateType() override;
};

} // namespace orva::dbmerger

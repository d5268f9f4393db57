#pragma once

#include "DBMerger.h"
#include "State.h"

namespace orva::dbmerger {

/// The working state: there is a master volume with a merged database, which the locator file
/// names, and catalogs are merged into it.
class MasterVolumeScannedState : public State {
public:
  /// Creates or opens the merged database on the master and points the locator file at it.
  /// Throws what PhotoDB throws.
  MasterVolumeScannedState();

  void handleVolumePlugged(VolumeInfo volume) override;
  void handleVolumeUnplugged(VolumeInfo volume) override;
  void handleVolumeScanned(VolumeInfo volume) override;
  void handlePictureTranscoded(VolumeInfo volume) override;
  void handleVolumePurged(VolumeInfo volume) override;
  int getStateType() override;

  Unfinished getUnfinished() override;
  /// The second half of an unplugging: stops the merger, elects a master and makes the state that
  /// follows current.
  void recover() override;

private:
  /// Stops and joins its merger when it is destroyed, also after the state's constructor has
  /// thrown.
  struct JoinedMerger {
    DBMerger merger;
    JoinedMerger() = default;
    JoinedMerger(const JoinedMerger&) = delete;
    JoinedMerger& operator=(const JoinedMerger&) = delete;
    ~JoinedMerger() noexcept(false);
  };

  JoinedMerger owned;
};

} // namespace orva::dbmerger

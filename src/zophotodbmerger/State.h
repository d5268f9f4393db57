#pragma once

#include "VolumeInfo.h"

namespace orva::dbmerger {

/// What the daemon does about an event depends on its state. A handler may make another state
/// current; its own object then lives on until the next transition. On the listener's thread.
/// Handlers catch nothing: what they throw leaves the state as it was.
/// Log readers rely on the texts that the handlers log, also on blanks at their ends.
class State {
public:
  State() = default;
  State(const State&) = delete;
  State& operator=(const State&) = delete;

  virtual void handleVolumePlugged(VolumeInfo volume) = 0;
  virtual void handleVolumeUnplugged(VolumeInfo volume) = 0;
  virtual void handleVolumeScanned(VolumeInfo volume) = 0;
  /// A batch of the volume's photos was transcoded, or the transcoding has ended.
  virtual void handlePictureTranscoded(VolumeInfo volume) = 0;
  virtual void handleVolumePurged(VolumeInfo volume) = 0;

  enum Type : int { DEFAULT = 0, MASTER_VOLUME_PLUGGED = 1, MASTER_VOLUME_SCANNED = 2 };
  /// A Type.
  virtual int getStateType() = 0;

  /// May throw, since a state may have to wait for a thread.
  virtual ~State() noexcept(false) = default;

  /// What an event that failed has left undone. Until it is completed, merges do not apply.
  enum class Unfinished {
    Nothing,
    Election,  ///< the master is gone, and the event failed before the election
    Transition ///< the event failed in the election or after it
  };
  /// Correct between two events only: before the registry changes for the next one.
  virtual Unfinished getUnfinished() { return Unfinished::Nothing; }

  /// Completes what is unfinished: elects a master and makes another state current. Throws what the
  /// handlers throw; then the transition is unfinished.
  virtual void recover() {}
};

} // namespace orva::dbmerger

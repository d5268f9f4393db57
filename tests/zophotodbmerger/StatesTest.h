#pragma once

#include "DaemonLayerTest.h"
#include "State.h"
#include "StateMachine.h"
#include "VolumeInfoManager.h"

#include <string>

namespace orva::test {

/// Announces a move to the scanned state.
inline const LogLine MOVING = Info("Moving to the scanned state since we can safely do so ");

/// A test of the states: the machine has just started, with the shares root registered.
class StatesTest : public DaemonLayerTest {
protected:
  StatesTest() : machine(dbmerger::StateMachine::Instance()) {}

  dbmerger::State& Current() const { return *machine.getCurrentState(); }
  int CurrentType() const { return Current().getStateType(); }

  dbmerger::VolumeInfoManager& Registry() const { return dbmerger::VolumeInfoManager::Instance(); }

  std::string Master() const { return Registry().getMasterVolume().mountPoint; }

  /// Registers a directory as a volume of this capacity, all of it free.
  void Register(const std::string& mountPoint, double capacity) const {
    MakeDirectory(mountPoint);
    dbmerger::VolumeInfo volume = Record(mountPoint, capacity, capacity);
    Registry().addVolumeInfo(volume);
  }

  /// Removes a volume from the registry, as a notification does before the state gets the event.
  void Forget(const std::string& mountPoint) const {
    dbmerger::VolumeInfo volume{.mountPoint = mountPoint};
    Registry().removeVolumeInfo(volume);
  }

  /// Removes the shares root, which could be elected, from the registry.
  void ForgetSharesRoot() const { Forget("/shares"); }

  using Handler = void (dbmerger::State::*)(dbmerger::VolumeInfo);

  /// Passes an event to the current state. Returns its standard output.
  std::string Handle(Handler handler, const std::string& mountPoint) const {
    return OutputOf([&] { (Current().*handler)(dbmerger::VolumeInfo{.mountPoint = mountPoint}); });
  }

  std::string Plugged(const std::string& mountPoint) const {
    return Handle(&dbmerger::State::handleVolumePlugged, mountPoint);
  }
  std::string Unplugged(const std::string& mountPoint) const {
    return Handle(&dbmerger::State::handleVolumeUnplugged, mountPoint);
  }
  std::string Scanned(const std::string& mountPoint) const {
    return Handle(&dbmerger::State::handleVolumeScanned, mountPoint);
  }
  std::string Transcoded(const std::string& mountPoint) const {
    return Handle(&dbmerger::State::handlePictureTranscoded, mountPoint);
  }
  std::string Purged(const std::string& mountPoint) const {
    return Handle(&dbmerger::State::handleVolumePurged, mountPoint);
  }

  dbmerger::StateMachine& machine;
};

/// Bytes; larger and smaller than the shares root.
constexpr double LARGE = 150e9;
constexpr double MIDDLE = 120e9;
constexpr double SMALL = 1e9;

} // namespace orva::test

#pragma once

#include <memory>

namespace orva::dbmerger {

class State;

/// Holds the daemon's current state. Made on the main thread before the listener starts, then
/// used on the listener's thread only.
class StateMachine {
public:
  /// The process's machine; null until Instance() is first called, never deleted.
  static StateMachine* instance;

  /// The process's machine, made by the first call, which throws what the constructor throws.
  static StateMachine& Instance();

  /// Starts in DefaultState: empties the merged database at the shares root, points the locator
  /// file there and registers the root as a volume. Throws what PhotoDB throws.
  StateMachine();
  StateMachine(const StateMachine&) = delete;
  StateMachine& operator=(const StateMachine&) = delete;
  ~StateMachine();

  /// Takes over `newState` and makes it current. The state that it replaces lives until the next
  /// call, because it is usually the one that is calling.
  void setCurrentState(State* newState);

  /// Never null; owned by the machine.
  State* getCurrentState() const noexcept { return currentState.get(); }

  // Transitions that several states make.

  /// Logs the master that was elected and goes to a new MasterVolumeScannedState.
  void moveToScannedState();

  /// Prepares the shares root as the constructor does and goes to a new DefaultState, because there
  /// is no master left.
  void fallBackToDefaultState();

private:
  std::unique_ptr<State> currentState;
  std::unique_ptr<State> previousState; ///< replaced by the last transition; may be null
};

} // namespace orva::dbmerger

#pragma once

#include "EventStreams.h"
#include "SnapshotReader.h"

#include <functional>
#include <string>
#include <thread>

namespace orva::web {

/// The thread that keeps the snapshot up to date, and tells the clients.
class Updater {
public:
  /// Both must outlive the object. `log` gets the errors.
  Updater(Snapshot& snapshot, EventStreams& events, std::function<void(const std::string&)> log);

private:
  void Run(const std::stop_token& stop);
  void Update(const std::stop_token& stop);
  void PublishStatus();
  void Log(const std::string& problem);

  Snapshot& snapshot_;
  EventStreams& events_;
  std::function<void(const std::string&)> log_;
  SnapshotReader reader_;
  SnapshotStatus::State state_ = SnapshotStatus::State::Building;
  std::string reason_;
  std::string problem_; ///< that was logged last; empty for none
  std::jthread thread_;
};

} // namespace orva::web

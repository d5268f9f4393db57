#include "Updater.h"

#include "zophotos/Activity.h"
#include "zophotos/LiveDatabase.h"

#include <exception>
#include <utility>

namespace orva::web {

Updater::Updater(Snapshot& snapshot, EventStreams& events,
                 std::function<void(const std::string&)> log)
    : snapshot_(snapshot), events_(events), log_(std::move(log)), reader_(snapshot),
      thread_([this](const std::stop_token& stop) { Run(stop); }) {}

void Updater::Run(const std::stop_token& stop) {
  zophotos::ActivityWatch services;
  while (!stop.stop_requested()) {
    try {
      Update(stop);
    } catch (const std::exception& error) {
      Log(error.what());
    }
    if (services.Wait(zophotos::LOOK_INTERVAL)) {
      events_.PublishVolumes();
    }
  }
}

void Updater::Update(const std::stop_token& stop) {
  snapshot_.Update(stop, [this] { PublishStatus(); });
  events_.PublishVersion(reader_.Version());
  PublishStatus();
  const SnapshotStatus status = snapshot_.Status();
  Log(status.state == SnapshotStatus::State::Failed ? status.reason : "");
}

/// Tells the pages of another status.
void Updater::PublishStatus() {
  const SnapshotStatus status = snapshot_.Status();
  const bool hasOtherState = std::exchange(state_, status.state) != status.state;
  const bool hasOtherReason = std::exchange(reason_, status.reason) != status.reason;
  if (hasOtherState || hasOtherReason) {
    events_.PublishVolumes();
  }
}

/// Logs a problem once. An empty one ends the problem.
void Updater::Log(const std::string& problem) {
  if (std::exchange(problem_, problem) != problem && !problem.empty()) {
    log_(problem);
  }
}

} // namespace orva::web

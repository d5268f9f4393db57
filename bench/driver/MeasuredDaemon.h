#pragma once

#include "Appliance.h"

#include <chrono>
#include <optional>
#include <string>

namespace orva::bench {

/// A newly started daemon in the scanned state, with the volume whose catalog it merges. Failures
/// are thrown as std::exception.
class MeasuredDaemon {
public:
  /// `master` holds the merged database.
  MeasuredDaemon(const test::Volume& master, const test::Volume& library);
  ~MeasuredDaemon();
  MeasuredDaemon(const MeasuredDaemon&) = delete;
  MeasuredDaemon& operator=(const MeasuredDaemon&) = delete;

  /// Announces a batch, waits for the end of its merge and returns the seconds in between. Returns
  /// nothing when the merge takes longer than `limit`; this object cannot be used then.
  std::optional<double> Merge(std::chrono::seconds limit);

  /// The peak of the daemon's memory since it was idle, less its memory then, in bytes.
  double PeakOverIdle() const;

private:
  double PeakMemory() const;

  test::Appliance appliance_;
  std::string batch_;
  int merges_ = 0;
  bool answers_ = true;
  double idle_ = 0;
};

} // namespace orva::bench

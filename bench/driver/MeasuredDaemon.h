#pragma once

#include "Appliance.h"

#include <chrono>
#include <optional>
#include <string>

namespace orva::bench {

/// A daemon in the scanned state, fresh, with the volume whose catalog it merges. Failures are
/// thrown as std::exception.
class MeasuredDaemon {
public:
  /// `master` holds the merged database.
  MeasuredDaemon(const test::Volume& master, const test::Volume& library);
  ~MeasuredDaemon();
  MeasuredDaemon(const MeasuredDaemon&) = delete;
  MeasuredDaemon& operator=(const MeasuredDaemon&) = delete;

  /// Announces a batch and waits for its merge. Returns the seconds between the two; nothing when
  /// it takes longer than `limit`, after which this daemon is of no use.
  std::optional<double> Merge(std::chrono::seconds limit);

  /// Bytes that the daemon's memory has had at its peak since it was idle, over what it had then.
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

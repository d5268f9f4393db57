#pragma once

#include "PipeReader.h"

#include "Appliance.h"

#include <chrono>
#include <optional>
#include <string>

namespace orva::bench {

/// A newly started daemon in the scanned state, with the volume whose catalog it merges. Failures
/// are thrown as std::exception.
class MeasuredDaemon {
public:
  /// Where the daemon's lines go.
  enum class Output {
    Null, ///< /dev/null, as in the systemd unit
    File, ///< a regular file in memory
    Pipe, ///< a pipe that a thread of the driver reads
  };

  /// `master` holds the merged database.
  MeasuredDaemon(const test::Volume& master, const test::Volume& library,
                 Output output = Output::Null);
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

  std::optional<PipeReader> pipe_; ///< outlives the daemon
  test::Appliance appliance_;
  std::string batch_;
  int merges_ = 0;
  bool answers_ = true;
  double idle_ = 0;
};

} // namespace orva::bench

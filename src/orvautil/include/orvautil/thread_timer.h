#pragma once

#include <string>

namespace orva::util {

/// Durations in nanoseconds.
struct thread_times {
  long long wall = 0;
  long long user = 0;
  long long system = 0;
};

/// A stopwatch for the thread that uses it: wall time and that thread's own processor time.
/// Runs from its construction. Started and read on one thread.
class thread_timer {
public:
  thread_timer();

  /// Starts again.
  void Start();

  /// The times since the start.
  thread_times Elapsed() const;

  /// The text that ends the merge's timing lines, such as
  /// "2.500 W   1.200 U   0.300 S   60.0%": seconds, and the share of processor time.
  static std::string format(const thread_times& times);

private:
  thread_times start_;
};

} // namespace orva::util

#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <functional>
#include <list>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace orva::web {

/// Threads for work that may wait for the disk of a volume. Slow disks delay only work on their own
/// volumes, unless eight or more are slow: these can take all threads. Any thread.
class DiskThreads {
public:
  static constexpr std::size_t THREADS = 16;
  static constexpr std::size_t MOST_PER_VOLUME = 2; ///< of the threads
  static constexpr std::size_t MOST_WAITING = 300;  ///< for a volume
  static constexpr std::chrono::seconds LONGEST_WAIT{10};

  /// Called once: with true in one of the threads, or with false when the work waited too long.
  /// Must not throw.
  using Work = std::function<void(bool mayRun)>;

  DiskThreads();
  DiskThreads(const DiskThreads&) = delete;
  DiskThreads& operator=(const DiskThreads&) = delete;
  ~DiskThreads() { Stop(); }

  /// Returns false, and drops the work, if too much waits for this volume.
  bool Add(const std::string& volume, Work work);

  /// Ends the work that has waited too long.
  void EndLate();

  /// Ends the work that waits, and accepts no more. Waits for the threads.
  void Stop();

private:
  using Clock = std::chrono::steady_clock;

  struct Waiting {
    std::string volume;
    Work work;
    Clock::time_point since;
  };

  void Run();
  std::list<Waiting>::iterator Next();

  std::mutex mutex_;
  std::condition_variable changed_;
  std::list<Waiting> waiting_;                 ///< the oldest first
  std::map<std::string, std::size_t> running_; ///< threads by volume
  bool isStopping_ = false;
  std::vector<std::jthread> threads_;
};

} // namespace orva::web

#pragma once

#include <chrono>
#include <condition_variable>
#include <ctime>
#include <list>
#include <mutex>
#include <thread>

struct sqlite3;

namespace orva::web {

/// Interrupts connections whose statements work too long: a crafted catalog may make a small query
/// expensive. A disk that starts slowly is waited for. Any thread.
class WorkWatch {
public:
  static constexpr std::chrono::milliseconds MOST_PROCESSOR_TIME{500};
  static constexpr std::chrono::seconds MOST_TIME{20};

  /// Watches a connection that this thread uses, for as long as the scope lives.
  class Scope {
  public:
    Scope(WorkWatch& watch, sqlite3* connection);
    Scope(const Scope&) = delete;
    Scope& operator=(const Scope&) = delete;
    ~Scope();

  private:
    friend WorkWatch;

    bool TakesTooLong() const;

    WorkWatch& watch_;
    sqlite3* connection_;
    clockid_t processorClock_{}; ///< of this thread
    std::chrono::nanoseconds processorBegin_{};
    std::chrono::steady_clock::time_point begin_ = std::chrono::steady_clock::now();
  };

  WorkWatch() = default;

private:
  void Run(const std::stop_token& stop);

  std::mutex mutex_;
  std::condition_variable_any changed_;
  std::list<const Scope*> scopes_;
  std::jthread thread_{[this](const std::stop_token& stop) { Run(stop); }};
};

} // namespace orva::web

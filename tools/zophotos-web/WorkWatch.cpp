#include "WorkWatch.h"

#include <pthread.h>
#include <sqlite3.h>

namespace orva::web {
namespace {

std::chrono::nanoseconds Now(clockid_t clock) {
  timespec now{};
  clock_gettime(clock, &now);
  return std::chrono::seconds(now.tv_sec) + std::chrono::nanoseconds(now.tv_nsec);
}

} // namespace

WorkWatch::Scope::Scope(WorkWatch& watch, sqlite3* connection)
    : watch_(watch), connection_(connection) {
  pthread_getcpuclockid(pthread_self(), &processorClock_);
  processorBegin_ = Now(processorClock_);
  const std::lock_guard lock(watch_.mutex_);
  watch_.scopes_.push_back(this);
  watch_.changed_.notify_one();
}

WorkWatch::Scope::~Scope() {
  const std::lock_guard lock(watch_.mutex_);
  watch_.scopes_.remove(this);
}

bool WorkWatch::Scope::TakesTooLong() const {
  return Now(processorClock_) - processorBegin_ > MOST_PROCESSOR_TIME ||
         std::chrono::steady_clock::now() - begin_ > MOST_TIME;
}

void WorkWatch::Run(const std::stop_token& stop) {
  constexpr std::chrono::milliseconds PAUSE(100);
  std::unique_lock lock(mutex_);
  while (changed_.wait(lock, stop, [this] { return !scopes_.empty(); })) {
    changed_.wait_for(lock, stop, PAUSE, [&] { return stop.stop_requested(); });
    for (const Scope* const scope : scopes_) {
      if (scope->TakesTooLong()) {
        sqlite3_interrupt(scope->connection_);
      }
    }
  }
}

} // namespace orva::web

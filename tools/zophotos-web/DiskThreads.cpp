#include "DiskThreads.h"

#include <algorithm>
#include <utility>

namespace orva::web {

DiskThreads::DiskThreads() {
  for (std::size_t i = 0; i < THREADS; ++i) {
    threads_.emplace_back([this] { Run(); });
  }
}

bool DiskThreads::Add(const std::string& volume, Work work) {
  const std::lock_guard lock(mutex_);
  const auto waits = std::ranges::count(waiting_, volume, &Waiting::volume);
  if (isStopping_ || static_cast<std::size_t>(waits) >= MOST_WAITING) {
    return false;
  }
  waiting_.push_back({.volume = volume, .work = std::move(work), .since = Clock::now()});
  changed_.notify_one();
  return true;
}

void DiskThreads::EndLate() {
  std::list<Waiting> late;
  {
    const std::lock_guard lock(mutex_);
    const auto end = std::ranges::find_if(waiting_, [](const Waiting& waiting) {
      return Clock::now() - waiting.since < LONGEST_WAIT;
    });
    late.splice(late.end(), waiting_, waiting_.begin(), isStopping_ ? waiting_.end() : end);
  }
  for (const Waiting& waiting : late) {
    waiting.work(false);
  }
}

void DiskThreads::Stop() {
  {
    const std::lock_guard lock(mutex_);
    isStopping_ = true;
    changed_.notify_all();
  }
  EndLate();
  threads_.clear();
}

/// The oldest work on a volume that does not have its threads yet.
std::list<DiskThreads::Waiting>::iterator DiskThreads::Next() {
  return std::ranges::find_if(waiting_, [this](const Waiting& waiting) {
    const auto running = running_.find(waiting.volume);
    return running == running_.end() || running->second < MOST_PER_VOLUME;
  });
}

void DiskThreads::Run() {
  std::unique_lock lock(mutex_);
  for (;;) {
    auto next = Next();
    while (next == waiting_.end() && !isStopping_) {
      changed_.wait(lock);
      next = Next();
    }
    if (isStopping_) {
      return;
    }
    const Waiting taken = std::move(*next);
    waiting_.erase(next);
    ++running_[taken.volume];
    lock.unlock();
    taken.work(true);
    lock.lock();
    if (--running_[taken.volume] == 0) {
      running_.erase(taken.volume);
    }
  }
}

} // namespace orva::web

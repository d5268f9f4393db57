#pragma once

#include "SnapshotReader.h"

#include <functional>
#include <memory>
#include <mutex>
#include <vector>

namespace orva::web {

/// The readers of the snapshot that the threads of the server share. Any thread.
class Readers {
public:
  /// A reader for one thread, for as long as the scope lives.
  class Lease {
  public:
    explicit Lease(Readers& readers) : readers_(readers), reader_(readers.Take()) {}
    Lease(const Lease&) = delete;
    Lease& operator=(const Lease&) = delete;
    ~Lease() { readers_.Return(std::move(reader_)); }

    SnapshotReader* operator->() const noexcept { return reader_.get(); }

  private:
    Readers& readers_;
    std::unique_ptr<SnapshotReader> reader_;
  };

  /// The snapshot must outlive the object.
  explicit Readers(const Snapshot& snapshot) : snapshot_(snapshot) {}

private:
  std::unique_ptr<SnapshotReader> Take() {
    const std::lock_guard lock(mutex_);
    if (idle_.empty()) {
      return std::make_unique<SnapshotReader>(snapshot_);
    }
    auto reader = std::move(idle_.back());
    idle_.pop_back();
    return reader;
  }

  void Return(std::unique_ptr<SnapshotReader> reader) noexcept {
    const std::lock_guard lock(mutex_);
    idle_.push_back(std::move(reader));
  }

  const Snapshot& snapshot_;
  std::mutex mutex_;
  std::vector<std::unique_ptr<SnapshotReader>> idle_;
};

} // namespace orva::web

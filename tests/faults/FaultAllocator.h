#pragma once

namespace orva::test {

/// Lets an allocation of SQLite's fail while the object lives: the `nth` from now (counted from 1;
/// 0 for none) and, with `permanent`, all that follow. One object at a time, on the thread that
/// uses SQLite.
class FaultAllocator {
public:
  /// Replaces SQLite's allocator and turns off its lookaside memory. Called once in the process,
  /// before SQLite is used.
  static void Install();

  FaultAllocator(int nth, bool permanent);
  FaultAllocator(const FaultAllocator&) = delete;
  FaultAllocator& operator=(const FaultAllocator&) = delete;
  ~FaultAllocator();

  /// Allocations so far, and how many of them failed.
  int Seen() const noexcept { return seen_; }
  int Failed() const noexcept { return failed_; }

  /// Counts an allocation. Returns whether it has to fail.
  bool Fails() noexcept;

private:
  int nth_;
  bool permanent_;
  int seen_ = 0;
  int failed_ = 0;
};

} // namespace orva::test

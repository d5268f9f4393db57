#pragma once

namespace orva::test {

/// SQLite's memory with a fault in it, for as long as the object lives: its `nth` allocation from
/// now (counted from 1; 0 for none) fails, and with `forGood` all that follow it. One at a time,
/// on the thread that uses SQLite.
class FaultAllocator {
public:
  /// Puts itself between SQLite and its memory, and has SQLite ask for each piece singly. Before
  /// SQLite is first used in the process; once.
  static void Install();

  FaultAllocator(int nth, bool forGood);
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
  bool forGood_;
  int seen_ = 0;
  int failed_ = 0;
};

} // namespace orva::test

#pragma once

#include <cstddef>
#include <cstdint>
#include <random>
#include <vector>

namespace orva::test {

/// The random numbers of a run: the same seed gives the same run.
class Random {
public:
  explicit Random(std::uint64_t seed) : engine_(seed) {}

  /// A number from 0 to `count` - 1.
  std::size_t Below(std::size_t count) { return static_cast<std::size_t>(engine_()) % count; }

  bool Chance(std::size_t percent) { return Below(100) < percent; }

  /// One of the items, of which there is at least one.
  template <typename Item>
  const Item& Of(const std::vector<Item>& items) {
    return items[Below(items.size())];
  }

private:
  std::mt19937_64 engine_;
};

} // namespace orva::test

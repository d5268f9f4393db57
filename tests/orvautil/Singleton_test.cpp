#include "orvautil/Singleton.h"

#include <gtest/gtest.h>

#include <atomic>
#include <latch>
#include <stdexcept>
#include <thread>
#include <vector>

namespace orva::util {
namespace {

struct Counted {
  Counted() {
    for (int i = 0; i < 1000; ++i) {
      std::this_thread::yield(); // lets the other threads come, which must wait
    }
    ++made;
  }
  ~Counted() { ++deleted; }
  inline static std::atomic<int> made = 0;
  inline static std::atomic<int> deleted = 0;
};

TEST(Singleton, ManyThreadsMakeOneInstance) {
  constexpr int COUNT = 16;
  std::latch start(COUNT);
  std::vector<Counted*> seen(COUNT);
  {
    std::vector<std::jthread> threads;
    for (auto& place : seen) {
      threads.emplace_back([&start, &place] {
        start.arrive_and_wait();
        place = Singleton<Counted>::Instance();
      });
    }
  }
  EXPECT_NE(seen.front(), nullptr);
  EXPECT_EQ(seen, std::vector<Counted*>(COUNT, seen.front()));
  EXPECT_EQ(Counted::made, 1);
  EXPECT_EQ(Counted::deleted, 0);
}

struct FailsAtFirst {
  FailsAtFirst() {
    if (++attempts == 1) {
      throw std::runtime_error("not yet");
    }
  }
  inline static int attempts = 0;
};

TEST(Singleton, AFailedCreationThrowsAndIsRepeated) {
  EXPECT_THROW(Singleton<FailsAtFirst>::Instance(), std::runtime_error);
  FailsAtFirst* const instance = Singleton<FailsAtFirst>::Instance();
  EXPECT_NE(instance, nullptr);
  EXPECT_EQ(Singleton<FailsAtFirst>::Instance(), instance);
  EXPECT_EQ(FailsAtFirst::attempts, 2);
}

} // namespace
} // namespace orva::util

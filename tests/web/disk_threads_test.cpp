// The threads that wait for disks: what slow disks delay.

#include "system/Deadline.h"

#include "zophotos-web/DiskThreads.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstddef>
#include <future>
#include <latch>
#include <memory>
#include <semaphore>
#include <string>

namespace orva::web {
namespace {

class SlowDisks : public testing::Test {
protected:
  ~SlowDisks() override { BecomeFast(); }

  /// Adds work on this many volumes that lasts until BecomeFast, more than there are threads for.
  void AddSlowWork(std::size_t volumes) {
    for (std::size_t i = 0; i < volumes * (DiskThreads::MOST_PER_VOLUME + 3); ++i) {
      const std::string volume = "/shares/Slow" + std::to_string(i % volumes) + '/';
      EXPECT_TRUE(threads_.Add(volume, [this](bool mayRun) {
        if (mayRun) {
          running_.release();
          areFast_.wait();
        }
      }));
    }
  }

  /// Adds as much work on one of these volumes as is accepted.
  void FillUp() {
    while (threads_.Add("/shares/Slow0/", [](bool /*mayRun*/) {})) {
    }
  }

  /// Waits until this many threads run the slow work.
  bool AwaitSlowWork(std::size_t count) {
    std::size_t running = 0;
    while (running < count && running_.try_acquire_for(test::DEADLINE)) {
      ++running;
    }
    return running == count;
  }

  /// Adds work on another volume. The future gets what it is called with.
  std::future<bool> AddQuickWork() {
    const auto called = std::make_shared<std::promise<bool>>();
    EXPECT_TRUE(
        threads_.Add("/shares/Quick/", [called](bool mayRun) { called->set_value(mayRun); }));
    return called->get_future();
  }

  void BecomeFast() {
    if (!areFast_.try_wait()) {
      areFast_.count_down();
    }
  }

private:
  std::latch areFast_{1};
  std::counting_semaphore<> running_{0};
  DiskThreads threads_;
};

TEST_F(SlowDisks, DelayNoWorkOnAnotherDiskWhenTheyAreSeven) {
  AddSlowWork(7);
  std::future<bool> quick = AddQuickWork();
  ASSERT_EQ(std::future_status::ready, quick.wait_for(test::DEADLINE));
  EXPECT_TRUE(quick.get());
}

TEST_F(SlowDisks, DelayWorkOnAnotherDiskWhenTheyTakeAllThreads) {
  AddSlowWork(8);
  ASSERT_TRUE(AwaitSlowWork(16));
  std::future<bool> quick = AddQuickWork();
  EXPECT_EQ(std::future_status::timeout, quick.wait_for(std::chrono::seconds(0)));
  BecomeFast();
  EXPECT_TRUE(quick.get());
}

TEST_F(SlowDisks, DelayNoWorkOnAnotherDiskWhenTooMuchWaitsForThem) {
  AddSlowWork(1);
  FillUp();
  std::future<bool> quick = AddQuickWork();
  ASSERT_EQ(std::future_status::ready, quick.wait_for(test::DEADLINE));
  EXPECT_TRUE(quick.get());
}

} // namespace
} // namespace orva::web

#include "orvautil/Exception.h"
#include "orvautil/Thread.h"

#include <gtest/gtest.h>

#include <pthread.h>

#include <atomic>
#include <cstddef>
#include <latch>
#include <thread>

namespace orva::util {
namespace {

/// Counts its runs, records the thread that runs it, and can be held up.
class Worker : public Thread {
public:
  ~Worker() override { Wait(); }

  void Run() override {
    started.count_down();
    gate.wait();
    id = std::this_thread::get_id();
    pthread_attr_t attributes;
    pthread_getattr_np(pthread_self(), &attributes);
    pthread_attr_getstacksize(&attributes, &stackSize);
    pthread_attr_destroy(&attributes);
    ++runs;
  }

  std::latch started{1};
  std::latch gate{1}; ///< Run goes on when this is counted down
  std::thread::id id;
  std::size_t stackSize = 0;
  std::atomic<int> runs = 0;
};

TEST(Thread, CreateRunsTheBodyOnceOnANewThread) {
  Worker worker;
  worker.gate.count_down();
  worker.Create(8, 0, false);
  worker.Wait();
  EXPECT_EQ(worker.runs, 1);
  EXPECT_NE(worker.id, std::this_thread::get_id());
}

TEST(Thread, CreateDoesNotWaitForTheBodyAndWaitDoes) {
  Worker worker;
  worker.Create(8, 0, false);
  worker.started.wait();
  EXPECT_EQ(worker.runs, 0);
  worker.gate.count_down();
  worker.Wait();
  EXPECT_EQ(worker.runs, 1);
}

TEST(Thread, TheStackHasTheRequestedSize) {
  Worker worker;
  worker.gate.count_down();
  worker.Create(64, 0, false);
  worker.Wait();
  EXPECT_GE(worker.stackSize, std::size_t{64} << 20U);
}

TEST(Thread, WaitReturnsAtOnceWhenThereIsNothingToWaitFor) {
  Worker worker;
  worker.Wait();
  worker.gate.count_down();
  worker.Create(8, 0, false);
  worker.Wait();
  worker.Wait();
  EXPECT_EQ(worker.runs, 1);
}

TEST(Thread, AThreadThatWasNotWaitedForIsNotStartedAgain) {
  Worker worker;
  worker.Create(8, 0, false);
  EXPECT_THROW(worker.Create(8, 0, false), boost::thread_resource_error);
  worker.gate.count_down();
  worker.Wait();
  EXPECT_EQ(worker.runs, 1);
}

TEST(Thread, InvalidArgumentsAreRefusedAndStartNothing) {
  Worker worker;
  worker.gate.count_down();
  EXPECT_THROW(worker.Create(0, 0, false), Exception);
  EXPECT_THROW(worker.Create(-8, 0, false), Exception);
  EXPECT_THROW(worker.Create(8, 1, false), Exception);
  EXPECT_THROW(worker.Create(8, 0, true), Exception);
  worker.Wait();
  EXPECT_EQ(worker.runs, 0);
}

} // namespace
} // namespace orva::util

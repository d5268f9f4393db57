#include "orvautil/thread_timer.h"

#include <gtest/gtest.h>

#include <thread>

namespace orva::util {
namespace {

constexpr long long SECOND = 1'000'000'000;
constexpr long long MILLISECOND = 1'000'000;

long long ProcessorTime(const thread_times& times) {
  return times.user + times.system;
}

/// Uses the processor until `timer`, started on this thread, shows this much processor time.
void Work(const thread_timer& timer, long long nanoseconds) {
  while (ProcessorTime(timer.Elapsed()) < nanoseconds) {
  }
}

TEST(thread_timer, FormatShowsSecondsAndTheShareOfProcessorTime) {
  EXPECT_EQ(
      thread_timer::format(
          {.wall = 2500 * MILLISECOND, .user = 1200 * MILLISECOND, .system = 300 * MILLISECOND}),
      "2.500 W   1.200 U   0.300 S   60.0%");
}

TEST(thread_timer, FormatOfNothingIsZeroPercent) {
  EXPECT_EQ(thread_timer::format({}), "0.000 W   0.000 U   0.000 S   0.0%");
}

TEST(thread_timer, FormatNeverShowsMoreProcessorTimeThanWallTime) {
  EXPECT_EQ(thread_timer::format(
                {.wall = 1 * SECOND, .user = 1200 * MILLISECOND, .system = 300 * MILLISECOND}),
            "1.500 W   1.200 U   0.300 S   100.0%");
  EXPECT_EQ(thread_timer::format({.wall = 0, .user = 10 * MILLISECOND, .system = 0}),
            "0.010 W   0.010 U   0.000 S   100.0%");
}

TEST(thread_timer, FormatRoundsToMillisecondsAndTenthsOfAPercent) {
  EXPECT_EQ(thread_timer::format({.wall = 3 * SECOND, .user = 1 * SECOND, .system = 0}),
            "3.000 W   1.000 U   0.000 S   33.3%");
  EXPECT_EQ(thread_timer::format({.wall = 1'999'600'000, .user = 400'000, .system = 0}),
            "2.000 W   0.000 U   0.000 S   0.0%");
}

TEST(thread_timer, FormatOfLongTimesHasNoExponent) {
  EXPECT_EQ(thread_timer::format({.wall = 123'456'789 * SECOND, .user = 0, .system = 0}),
            "123456789.000 W   0.000 U   0.000 S   0.0%");
}

TEST(thread_timer, CountsTheWorkOfItsThread) {
  const thread_timer timer;
  Work(timer, 1);
  const thread_times times = timer.Elapsed();
  EXPECT_GT(ProcessorTime(times), 0);
  EXPECT_GT(times.wall, 0);
}

TEST(thread_timer, DoesNotCountTheWorkOfOtherThreads) {
  constexpr long long WORK = 300 * MILLISECOND;
  const thread_timer timer;
  std::jthread([] { Work(thread_timer(), WORK); }).join();
  EXPECT_LT(ProcessorTime(timer.Elapsed()), WORK);
}

TEST(thread_timer, StartBeginsAgain) {
  thread_timer timer;
  const thread_timer reference;
  Work(reference, 100 * MILLISECOND);
  timer.Start();
  const thread_times restarted = timer.Elapsed();
  const thread_times all = reference.Elapsed();
  EXPECT_LT(restarted.wall, all.wall);
  EXPECT_LT(ProcessorTime(restarted), ProcessorTime(all));
}

} // namespace
} // namespace orva::util

#include "orvautil/thread_timer.h"

#include <sys/resource.h>
#include <sys/time.h>

#include <boost/chrono/system_clocks.hpp>

#include <algorithm>
#include <iomanip>
#include <sstream>

namespace orva::util {

namespace {

long long Nanoseconds(const timeval& time) {
  return time.tv_sec * 1'000'000'000LL + time.tv_usec * 1'000LL;
}

thread_times Now() {
  rusage usage{};
  getrusage(RUSAGE_THREAD, &usage);
  return {
      .wall =
          boost::chrono::nanoseconds(boost::chrono::steady_clock::now().time_since_epoch()).count(),
      .user = Nanoseconds(usage.ru_utime),
      .system = Nanoseconds(usage.ru_stime),
  };
}

} // namespace

thread_timer::thread_timer() : start_(Now()) {}

void thread_timer::Start() {
  start_ = Now();
}

thread_times thread_timer::Elapsed() const {
  const thread_times now = Now();
  return {.wall = now.wall - start_.wall,
          .user = now.user - start_.user,
          .system = now.system - start_.system};
}

std::string thread_timer::format(const thread_times& times) {
  constexpr long double second = 1'000'000'000.0L;
  const long long cpu = times.user + times.system;
  // The two clocks tick differently; the processor's share is never more than 100 %.
  const long long wall = std::max(times.wall, cpu);
  const long double share =
      wall > 0 ? static_cast<long double>(cpu) / static_cast<long double>(wall) * 100 : 0;

  std::ostringstream text;
  text << std::fixed << std::setprecision(3) << static_cast<long double>(wall) / second << " W   "
       << static_cast<long double>(times.user) / second << " U   "
       << static_cast<long double>(times.system) / second << " S   " << std::setprecision(1)
       << share << '%';
  return text.str();
}

} // namespace orva::util

// Preloaded into the indexer, which then finds itself in other surroundings:
//   PROBE_CLOCK_OFFSET  seconds that are added to the time of day
//   PROBE_CLOCK_SPEED   how many times as fast its timers run
//   PROBE_FILE_SYSTEM   type of every file system, a number as in statfs(2)

#include <dlfcn.h>
#include <poll.h>
#include <sys/statfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>

namespace {

constexpr long long NANOSECONDS = 1'000'000'000;

long long Setting(const char* name, long long standard) {
  const char* const text = std::getenv(name);
  return text != nullptr ? std::strtoll(text, nullptr, 0) : standard;
}

long long Speed() {
  static const long long speed = Setting("PROBE_CLOCK_SPEED", 1);
  return speed;
}

} // namespace

extern "C" {

int clock_gettime(clockid_t clock, timespec* time) noexcept {
  const auto result = static_cast<int>(syscall(SYS_clock_gettime, clock, time));
  if (result == 0 && clock == CLOCK_REALTIME) {
    time->tv_sec += Setting("PROBE_CLOCK_OFFSET", 0);
  } else if (result == 0 && clock == CLOCK_MONOTONIC) {
    const long long fast = (time->tv_sec * NANOSECONDS + time->tv_nsec) * Speed();
    *time = {.tv_sec = fast / NANOSECONDS, .tv_nsec = fast % NANOSECONDS};
  }
  return result;
}

time_t time(time_t* result) noexcept {
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  if (result != nullptr) {
    *result = now.tv_sec;
  }
  return now.tv_sec;
}

int poll(pollfd* descriptors, nfds_t count, int timeout) {
  if (timeout > 0) {
    timeout = static_cast<int>((timeout + Speed() - 1) / Speed());
  }
  static const auto next = reinterpret_cast<decltype(&poll)>(dlsym(RTLD_NEXT, "poll"));
  return next(descriptors, count, timeout);
}

int fstatfs(int descriptor, struct statfs* status) noexcept {
  const auto result = static_cast<int>(syscall(SYS_fstatfs, descriptor, status));
  status->f_type = static_cast<decltype(status->f_type)>(
      Setting("PROBE_FILE_SYSTEM", static_cast<long long>(status->f_type)));
  return result;
}
}

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

// The names of the C library.
int GetClock(clockid_t clock, timespec* now) __asm__("clock_gettime");
time_t GetTime(time_t* result) __asm__("time");
int Poll(pollfd* descriptors, nfds_t count, int timeout) __asm__("poll");
int GetFileSystem(int descriptor, struct statfs* status) __asm__("fstatfs");

int GetClock(clockid_t clock, timespec* now) {
  const auto result = static_cast<int>(syscall(SYS_clock_gettime, clock, now));
  if (result == 0 && clock == CLOCK_REALTIME) {
    now->tv_sec += Setting("PROBE_CLOCK_OFFSET", 0);
  } else if (result == 0 && clock == CLOCK_MONOTONIC) {
    const long long fast = (now->tv_sec * NANOSECONDS + now->tv_nsec) * Speed();
    *now = {.tv_sec = fast / NANOSECONDS, .tv_nsec = fast % NANOSECONDS};
  }
  return result;
}

time_t GetTime(time_t* result) {
  timespec now{};
  GetClock(CLOCK_REALTIME, &now);
  if (result != nullptr) {
    *result = now.tv_sec;
  }
  return now.tv_sec;
}

int Poll(pollfd* descriptors, nfds_t count, int timeout) {
  if (timeout > 0) {
    timeout = static_cast<int>((timeout + Speed() - 1) / Speed());
  }
  static const auto next = reinterpret_cast<decltype(&Poll)>(dlsym(RTLD_NEXT, "poll"));
  return next(descriptors, count, timeout);
}

int GetFileSystem(int descriptor, struct statfs* status) {
  const auto result = static_cast<int>(syscall(SYS_fstatfs, descriptor, status));
  status->f_type = static_cast<decltype(status->f_type)>(
      Setting("PROBE_FILE_SYSTEM", static_cast<long long>(status->f_type)));
  return result;
}

#include "Tracer.h"

#include <fcntl.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <system_error>

namespace orva::test {

namespace {

constexpr int SYSTEM_CALL_STOP = SIGTRAP | 0x80;

long Trace(__ptrace_request request, pid_t thread, long data = 0) {
  return ptrace(request, thread, nullptr, data);
}

/// Waits until `thread`, or any thread for 0, stops. Returns the reason.
siginfo_t AwaitStop(pid_t thread) {
  siginfo_t stop{};
  while (waitid(thread == 0 ? P_ALL : P_PID, static_cast<id_t>(thread), &stop, WSTOPPED | __WALL) !=
         0) {
    if (errno != EINTR) {
      throw std::system_error(errno, std::generic_category(), "waitid");
    }
  }
  return stop;
}

/// The signal to deliver when a stopped thread continues; 0 when tracing stopped it.
int SignalOf(const siginfo_t& stop) {
  return stop.si_status == SYSTEM_CALL_STOP || (stop.si_status >> 8) != 0 ? 0 : stop.si_status;
}

/// Whether the stopped thread is about to make a system call, which is then stored in `call`.
bool IsEntry(pid_t thread, SystemCall& call) {
  struct __ptrace_syscall_info info {};
  if (ptrace(PTRACE_GET_SYSCALL_INFO, thread, sizeof info, &info) <= 0 ||
      info.op != PTRACE_SYSCALL_INFO_ENTRY) {
    return false;
  }
  call.thread = thread;
  call.number = info.entry.nr;
  std::copy(std::begin(info.entry.args), std::end(info.entry.args), call.arguments.begin());
  return true;
}

} // namespace

bool IsEffect(const SystemCall& call) {
  switch (call.number) {
  case SYS_write:
  case SYS_pwrite64:
  case SYS_sendto:
  case SYS_ftruncate:
  case SYS_fsync:
  case SYS_fdatasync:
  case SYS_unlink:
  case SYS_unlinkat:
  case SYS_rename:
  case SYS_renameat:
  case SYS_renameat2:
  case SYS_mkdir:
  case SYS_mkdirat:
  case SYS_fchmod:
  case SYS_fchmodat:
    return true;
  case SYS_openat:
    return (call.arguments[2] & O_CREAT) != 0;
  default:
    return false;
  }
}

Tracer::Tracer(pid_t process) : process_(process) {
  std::size_t before = 0;
  do {
    before = held_.size();
    SeizeNewThreads();
  } while (held_.size() != before);
}

void Tracer::SeizeNewThreads() {
  constexpr long options = PTRACE_O_TRACESYSGOOD | PTRACE_O_TRACECLONE | PTRACE_O_TRACEEXIT;
  const std::filesystem::path tasks = "/proc/" + std::to_string(process_) + "/task";
  for (const auto& entry : std::filesystem::directory_iterator(tasks)) {
    const pid_t thread = std::stoi(entry.path().filename());
    if (held_.contains(thread) || Trace(PTRACE_SEIZE, thread, options) != 0) {
      if (!held_.contains(thread) && errno != ESRCH) {
        throw std::system_error(errno, std::generic_category(), "PTRACE_SEIZE");
      }
      continue;
    }
    Trace(PTRACE_INTERRUPT, thread);
    AwaitStop(thread);
    held_[thread] = true;
  }
}

Tracer::~Tracer() {
  // The first thread last: the kernel reports its end only after those of the others.
  for (const auto& [thread, held] : held_) {
    if (thread != process_) {
      Release(thread);
    }
  }
  Release(process_);
}

void Tracer::Release(pid_t thread) {
  if (held_[thread] && Trace(PTRACE_DETACH, thread) == 0) {
    return;
  }
  // A thread that is killed in the meantime is not where it was stopped.
  for (;;) {
    Trace(PTRACE_INTERRUPT, thread);
    siginfo_t state{};
    constexpr int events = WSTOPPED | WEXITED | WNOWAIT | __WALL;
    if (waitid(P_PID, static_cast<id_t>(thread), &state, events) != 0) {
      return;
    }
    if (state.si_code != CLD_TRAPPED) {
      if (thread != process_) {
        waitpid(thread, nullptr, __WALL);
      }
      return;
    }
    if (Trace(PTRACE_DETACH, thread, SignalOf(state)) == 0) {
      return;
    }
  }
}

void Tracer::RunUntil(const Condition& holds) {
  for (auto& [thread, held] : held_) {
    if (held) {
      Trace(PTRACE_SYSCALL, thread);
      held = false;
    }
  }
  for (;;) {
    const siginfo_t stop = AwaitStop(0);
    const pid_t thread = stop.si_pid;
    held_[thread] = false; // also for a new thread
    if (stop.si_status >> 8 == PTRACE_EVENT_EXIT && thread == process_) {
      held_[thread] = true;
      throw std::runtime_error("the traced process has ended");
    }
    SystemCall call{};
    if (stop.si_status == SYSTEM_CALL_STOP && IsEntry(thread, call) && holds(call)) {
      held_[thread] = true;
      return;
    }
    Trace(PTRACE_SYSCALL, thread, SignalOf(stop));
  }
}

std::string Tracer::Data(const SystemCall& call) const {
  if (call.number != SYS_write && call.number != SYS_pwrite64 && call.number != SYS_sendto) {
    return {};
  }
  return Memory(call.arguments[1], std::min<std::uint64_t>(call.arguments[2], 65536));
}

std::chrono::nanoseconds Tracer::Sleep(const SystemCall& call) const {
  timespec time{};
  if (call.number == SYS_clock_nanosleep) {
    Memory(call.arguments[2], sizeof time).copy(reinterpret_cast<char*>(&time), sizeof time);
  }
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

std::string Tracer::Memory(std::uint64_t address, std::size_t size) const {
  std::ifstream memory("/proc/" + std::to_string(process_) + "/mem", std::ios::binary);
  std::string bytes(size, '\0');
  memory.seekg(static_cast<std::streamoff>(address));
  memory.read(bytes.data(), static_cast<std::streamsize>(size));
  bytes.resize(static_cast<std::size_t>(memory.gcount()));
  return bytes;
}

} // namespace orva::test

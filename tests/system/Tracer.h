#pragma once

#include <sys/types.h>

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <string>

namespace orva::test {

/// A system call that a thread is about to make.
struct SystemCall {
  pid_t thread;
  std::uint64_t number; ///< as in sys/syscall.h
  std::array<std::uint64_t, 6> arguments;
};

/// Whether a call may change a file or tell somebody something. Between two of these it makes no
/// difference to the world where a process is.
bool IsEffect(const SystemCall& call);

/// Holds a process of the test's own at chosen system calls. Belongs to the thread that makes it.
/// When the object ends the process goes on by itself, unless it has been killed.
class Tracer {
public:
  /// Takes hold of all threads of the process. Throws std::system_error.
  explicit Tracer(pid_t process);
  Tracer(const Tracer&) = delete;
  Tracer& operator=(const Tracer&) = delete;
  ~Tracer();

  using Condition = std::function<bool(const SystemCall&)>;

  /// Lets the process go on until a thread is about to make a call that `holds` accepts, and holds
  /// that thread before it. Throws std::runtime_error when the process ends instead.
  void RunUntil(const Condition& holds);

  /// What a write or a send is about to pass on; empty for other calls.
  std::string Data(const SystemCall& call) const;

  /// How long a sleep is about to take; nothing for other calls.
  std::chrono::nanoseconds Sleep(const SystemCall& call) const;

private:
  void SeizeNewThreads();
  void Release(pid_t thread);
  /// What the process has at an address.
  std::string Memory(std::uint64_t address, std::size_t size) const;

  pid_t process_;
  std::map<pid_t, bool> held_; ///< by thread
};

} // namespace orva::test

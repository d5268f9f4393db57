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

/// Whether a call may change a file or send something. Between two such calls nothing outside the
/// process depends on how far the process has come.
bool IsEffect(const SystemCall& call);

/// Holds a child process at chosen system calls. Only for the thread that makes it. When the object
/// ends, the process continues, unless it has been killed.
class Tracer {
public:
  /// Stops all threads of the process. Throws std::system_error.
  explicit Tracer(pid_t process);
  Tracer(const Tracer&) = delete;
  Tracer& operator=(const Tracer&) = delete;
  ~Tracer();

  using Condition = std::function<bool(const SystemCall&)>;

  /// Lets the process run until a thread is about to make a call that `holds` accepts, and stops
  /// that thread before the call. Throws std::runtime_error when the process ends instead.
  void RunUntil(const Condition& holds);

  /// The bytes that a write or a send is about to pass; empty for other calls.
  std::string Data(const SystemCall& call) const;

  /// The duration of a sleep that is about to begin; 0 for other calls.
  std::chrono::nanoseconds Sleep(const SystemCall& call) const;

private:
  void SeizeNewThreads();
  void Release(pid_t thread);
  /// The memory of the process at an address.
  std::string Memory(std::uint64_t address, std::size_t size) const;

  pid_t process_;
  std::map<pid_t, bool> held_; ///< by thread
};

} // namespace orva::test

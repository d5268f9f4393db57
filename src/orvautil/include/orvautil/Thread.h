#pragma once

#include <boost/thread/thread.hpp>

namespace orva::util {

/// A thread of its own for an object: derive, implement Run, call Create. The owner calls Create
/// and Wait; only Run is executed on the new thread.
class Thread {
public:
  Thread() = default;
  Thread(const Thread&) = delete;
  Thread& operator=(const Thread&) = delete;
  /// Neither stops the thread nor waits for it. The owner waits first, unless Run does not use the
  /// object any more.
  virtual ~Thread();

  /// Body of the thread. An exception that leaves it ends the process.
  virtual void Run() = 0;

  /// Starts the thread, joinable, with a stack of `stackMebibytes`. No `flags` are defined and
  /// no thread is `detached`: pass 0 and false. Throws Exception for other values, and
  /// boost::thread_resource_error when the system cannot start a thread, or an earlier one was not
  /// waited for.
  void Create(int stackMebibytes, unsigned flags, bool detached);

  /// Blocks until Run has returned; returns at once when it was never started or already
  /// waited for.
  void Wait();

private:
  boost::thread thread_;
};

} // namespace orva::util

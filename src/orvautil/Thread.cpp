#include "orvautil/Thread.h"

#include "orvautil/Exception.h"

#include <cerrno>
#include <cstddef>

namespace orva::util {

Thread::~Thread() {
  thread_.detach();
}

void Thread::Create(int stackMebibytes, unsigned flags, bool detached) {
  if (stackMebibytes <= 0 || flags != 0 || detached) {
    throw Exception("a thread needs a stack size, no flags, and must be joinable");
  }
  if (thread_.joinable()) {
    throw boost::thread_resource_error(EBUSY);
  }
  boost::thread::attributes attributes;
  attributes.set_stack_size(static_cast<std::size_t>(stackMebibytes) << 20U);
  thread_ = boost::thread(attributes, [this] { Run(); });
}

void Thread::Wait() {
  if (thread_.joinable()) {
    thread_.join();
  }
}

} // namespace orva::util

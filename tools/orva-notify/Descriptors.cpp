#include "orva-notify/Descriptors.h"

#include "orvautil/Exception.h"

#include <sys/signalfd.h>

#include <cerrno>
#include <csignal>
#include <string>
#include <system_error>

namespace orva::notify {

util::FileDescriptor CheckedDescriptor(int descriptor, const char* what) {
  if (descriptor == -1) {
    throw util::Exception(std::string("cannot open ") + what + ": " +
                          std::generic_category().message(errno));
  }
  return util::FileDescriptor(descriptor);
}

util::FileDescriptor CatchStopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  sigprocmask(SIG_BLOCK, &signals, nullptr);
  return CheckedDescriptor(signalfd(-1, &signals, SFD_NONBLOCK | SFD_CLOEXEC), "signals");
}

} // namespace orva::notify

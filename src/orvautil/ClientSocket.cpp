#include "orvautil/ClientSocket.h"

#include <sys/socket.h>

#include <cerrno>

namespace orva::util {

namespace {

/// Returns the connected descriptor, or none with errno set.
FileDescriptor Connect(const Socket::Address& address, bool nonBlocking) {
  const int type = SOCK_STREAM | SOCK_CLOEXEC | (nonBlocking ? SOCK_NONBLOCK : 0);
  FileDescriptor descriptor(socket(AF_UNIX, type, 0));
  if (!descriptor) {
    return descriptor;
  }
  int result = 0;
  do {
    result = connect(descriptor.Get(), address.Get(), address.Length());
  } while (result == -1 && errno == EINTR);
  if (result == -1) {
    const int reason = errno;
    descriptor.Reset();
    errno = reason;
  }
  return descriptor;
}

} // namespace

ClientSocket::ClientSocket(const Address& address, bool nonBlocking)
    : Socket(Connect(address, nonBlocking).Release()) {}

} // namespace orva::util

#include "orvautil/ClientSocket.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>

namespace orva::util {

namespace {

/// Returns the connected descriptor, or -1 with errno set.
int Connect(const Socket::Address& address, bool nonBlocking) {
  const int type = SOCK_STREAM | SOCK_CLOEXEC | (nonBlocking ? SOCK_NONBLOCK : 0);
  const int descriptor = socket(AF_UNIX, type, 0);
  if (descriptor == -1) {
    return -1;
  }
  int result = 0;
  do {
    result = connect(descriptor, address.Get(), address.Length());
  } while (result == -1 && errno == EINTR);
  if (result == -1) {
    const int reason = errno;
    close(descriptor);
    errno = reason;
    return -1;
  }
  return descriptor;
}

} // namespace

ClientSocket::ClientSocket(const Address& address, bool nonBlocking)
    : Socket(Connect(address, nonBlocking)) {}

} // namespace orva::util

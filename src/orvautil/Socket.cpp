#include "orvautil/Socket.h"

#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <poll.h>
#include <sys/ioctl.h>

#include <cerrno>
#include <cstddef>
#include <cstring>

namespace orva::util {

Socket::Address::Address(const std::string& text) {
  if (text.size() < 2 || (text.front() != '/' && text.front() != '@')) {
    throw Exception(FormatString(
        "Not a local socket address, which is the absolute path of a socket or @name: '%s'",
        text.c_str()));
  }
  const bool abstract = text.front() == '@';
  // A path needs room for its NUL; an abstract name has its NUL in front, in place of the '@'.
  const std::size_t size = abstract ? text.size() : text.size() + 1;
  if (size > sizeof address_.sun_path) {
    throw Exception(FormatString("Socket address of more than %zu bytes: '%s'",
                                 sizeof address_.sun_path - (abstract ? 0 : 1), text.c_str()));
  }
  address_.sun_family = AF_UNIX;
  std::memcpy(address_.sun_path, text.data(), text.size());
  if (abstract) {
    address_.sun_path[0] = '\0';
  }
  length_ = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + size);
}

const sockaddr* Socket::Address::Get() const noexcept {
  return reinterpret_cast<const sockaddr*>(&address_);
}

void Socket::Close() {
  descriptor_.Reset();
}

bool Socket::IsDataAvailable(unsigned long long* count) {
  pollfd ready{.fd = Descriptor(), .events = POLLIN, .revents = 0};
  int result = 0;
  do {
    result = poll(&ready, 1, 0);
  } while (result == -1 && errno == EINTR);
  if (!IsOpen() || result != 1) {
    return false;
  }
  if (count != nullptr) {
    int bytes = 0;
    *count = ioctl(Descriptor(), FIONREAD, &bytes) == 0 ? static_cast<unsigned>(bytes) : 0;
  }
  return true;
}

unsigned Socket::Read(void* data, unsigned size) {
  ssize_t count = 0;
  do {
    count = recv(Descriptor(), data, size, 0);
  } while (count == -1 && errno == EINTR);
  return count > 0 ? static_cast<unsigned>(count) : 0;
}

unsigned Socket::Write(const void* data, unsigned size) {
  const auto* bytes = static_cast<const char*>(data);
  unsigned written = 0;
  while (written < size) {
    const ssize_t count = send(Descriptor(), bytes + written, size - written, MSG_NOSIGNAL);
    if (count >= 0) {
      written += static_cast<unsigned>(count);
    } else if (errno != EINTR) {
      break;
    }
  }
  return written;
}

} // namespace orva::util

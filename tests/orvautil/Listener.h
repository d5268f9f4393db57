#pragma once

#include "SocketPair.h"

#include "orvautil/FileDescriptor.h"

#include <sys/socket.h>

#include <cerrno>
#include <string>
#include <system_error>

namespace orva::test {

/// A service that listens at a local address.
class Listener {
public:
  /// Listens at `address`, which was not made by the class under test.
  explicit Listener(const sockaddr_un& address, socklen_t length)
      : descriptor_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const auto* const plain = reinterpret_cast<const sockaddr*>(&address);
    if (!descriptor_ || bind(descriptor_.Get(), plain, length) != 0 ||
        listen(descriptor_.Get(), 8) != 0) {
      throw std::system_error(errno, std::generic_category(), "listen");
    }
  }

  /// Waits for a client; its connection's descriptor goes to the caller.
  int Accept() const { return accept4(descriptor_.Get(), nullptr, nullptr, SOCK_CLOEXEC); }

private:
  util::FileDescriptor descriptor_;
};

/// Listens at a path.
inline Listener ListenAtPath(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  return Listener(address, sizeof address);
}

} // namespace orva::test

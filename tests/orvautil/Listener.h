#pragma once

#include "SocketPair.h"

#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <system_error>

namespace orva::test {

/// A service that listens at a local address.
class Listener {
public:
  /// Binds to `address` with the address made here, not by the class under test, and listens.
  explicit Listener(const sockaddr_un& address, socklen_t length)
      : descriptor_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const auto* const plain = reinterpret_cast<const sockaddr*>(&address);
    if (descriptor_ == -1 || bind(descriptor_, plain, length) != 0 || listen(descriptor_, 8) != 0) {
      throw std::system_error(errno, std::generic_category(), "listen");
    }
  }
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;
  ~Listener() { close(descriptor_); }

  /// Waits for a client; its connection's descriptor goes to the caller.
  int Accept() const { return accept4(descriptor_, nullptr, nullptr, SOCK_CLOEXEC); }

private:
  int descriptor_; ///< owned
};

/// Listens at a path.
inline Listener ListenAtPath(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  return Listener(address, sizeof address);
}

} // namespace orva::test

#pragma once

#include "orvautil/Socket.h"

#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <system_error>

namespace orva::test {

/// One end of a connection as the stream under test.
class PairEnd : public util::Socket {
public:
  explicit PairEnd(int descriptor) : Socket(descriptor) {}
};

/// Two connected local sockets. With SOCK_SEQPACKET each Write arrives as one Read of its own.
class SocketPair {
public:
  explicit SocketPair(int type = SOCK_STREAM) : SocketPair(Make(type)) {}

  PairEnd near; ///< the end under test
  PairEnd far;  ///< the peer's end

private:
  explicit SocketPair(const std::array<int, 2>& descriptors)
      : near(descriptors[0]), far(descriptors[1]) {}

  static std::array<int, 2> Make(int type) {
    std::array<int, 2> descriptors{};
    if (socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, descriptors.data()) != 0) {
      throw std::system_error(errno, std::generic_category(), "socketpair");
    }
    return descriptors;
  }
};

} // namespace orva::test

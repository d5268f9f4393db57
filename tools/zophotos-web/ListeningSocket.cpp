#include "ListeningSocket.h"

#include "SocketAddress.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <string_view>

namespace orva::web {
namespace {

constexpr int FIRST_PASSED = 3;

std::string Variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? "" : value;
}

int OptionOf(int socket, int option) {
  int value = 0;
  socklen_t size = sizeof value;
  return getsockopt(socket, SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
}

/// The socket that systemd passes; none if it passes none. Throws std::runtime_error.
util::FileDescriptor TakePassedSocket() {
  if (Variable("LISTEN_PID") != std::to_string(getpid())) {
    return {};
  }
  if (Variable("LISTEN_FDS") != "1") {
    throw std::runtime_error("systemd has to pass one socket, not " + Variable("LISTEN_FDS"));
  }
  util::FileDescriptor passed(FIRST_PASSED);
  if (OptionOf(passed.Get(), SO_ACCEPTCONN) != 1 ||
      OptionOf(passed.Get(), SO_TYPE) != SOCK_STREAM || !SocketAddress::Of(passed.Get()) ||
      fcntl(passed.Get(), F_SETFD, FD_CLOEXEC) != 0 ||
      fcntl(passed.Get(), F_SETFL, O_NONBLOCK) != 0) {
    throw std::runtime_error("the socket that systemd passes is not a listening stream socket");
  }
  return passed;
}

} // namespace

util::FileDescriptor OpenListeningSocket(const Options& options) {
  util::FileDescriptor passed = options.listen ? util::FileDescriptor() : TakePassedSocket();
  const auto address = passed ? SocketAddress::Of(passed.Get())
                              : SocketAddress::Parse(options.listen.value_or("127.0.0.1:8480"));
  if (!address || (!address->IsLoopback() && !options.allowsEverybody)) {
    throw AddressRefused("other machines can reach " + (address ? address->Url() : "") +
                         ", and everybody who reaches it sees all photos; if that is wanted, "
                         "add --allow-everybody");
  }
  return passed ? std::move(passed) : address->Listen();
}

} // namespace orva::web

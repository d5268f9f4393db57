#pragma once

#include "orvautil/FileDescriptor.h"

#include <sys/socket.h>

#include <optional>
#include <string>

namespace orva::web {

/// The address that a socket has at this end.
class SocketAddress {
public:
  /// Parses "127.0.0.1:8480", "[::1]:8480" or "localhost:8480", which is the first. Returns nothing
  /// for another text.
  static std::optional<SocketAddress> Parse(const std::string& text);

  /// The address of `socket`. Returns nothing if it is not a socket of the internet or of this
  /// machine.
  static std::optional<SocketAddress> Of(int socket);

  /// Whether only this machine can reach it: an address of the loopback, or a socket file.
  bool IsLoopback() const;

  /// The address without the port and brackets, "127.0.0.1"; empty for a socket file.
  std::string Host() const;

  /// "http://127.0.0.1:8480/", or a description of a socket file.
  std::string Url() const;

  /// A socket that listens at the address. Throws std::system_error.
  util::FileDescriptor Listen() const;

private:
  sockaddr_storage address_{};
  socklen_t size_ = 0;
};

} // namespace orva::web

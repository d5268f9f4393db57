#pragma once

#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"

#include <string>

namespace orva::notify {

/// A local socket that accepts connections, non-blocking.
class ListeningSocket : public util::Socket {
public:
  /// Listens on `address`, a text for Socket::Address. Creates the directory of a path, and
  /// replaces a socket that no process listens on any more. Throws util::Exception, also when
  /// another process listens there.
  explicit ListeningSocket(std::string address);

  /// Removes the socket's file.
  ~ListeningSocket() override;

  /// Accepts the next pending connection, non-blocking. Without one, returns none and sets errno.
  util::FileDescriptor Accept();

private:
  void Bind();

  const std::string address_;
  bool isBound_ = false;
};

} // namespace orva::notify

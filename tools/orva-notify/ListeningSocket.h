#pragma once

#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"

#include <string>

namespace orva::notify {

/// A local socket that listens, non-blocking.
class ListeningSocket : public util::Socket {
public:
  /// Listens on `address`, a text for Socket::Address. Makes the directory of a path and takes
  /// the place of a socket on which nobody listens any more. Throws util::Exception, also when
  /// another process listens there, and std::filesystem::filesystem_error.
  explicit ListeningSocket(std::string address);

  /// Takes the socket's file away.
  ~ListeningSocket() override;

  /// The next connection that waits, non-blocking; none, with errno set, when there is none.
  util::FileDescriptor Accept();

private:
  void Bind();

  const std::string address_;
  bool isBound_ = false;
};

} // namespace orva::notify

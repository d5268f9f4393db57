#pragma once

#include "orvautil/Socket.h"

namespace orva::util {

/// A socket connected to a service that listens.
class ClientSocket : public Socket {
public:
  /// Connects to `address`, waiting for the service to accept. When that fails nothing is
  /// thrown and the socket is not open; errno then says why. `nonBlocking` asks for a
  /// descriptor that does not block: Read and Write then end where they would have to wait.
  ClientSocket(const Address& address, bool nonBlocking);
};

} // namespace orva::util

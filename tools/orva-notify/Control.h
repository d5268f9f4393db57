#pragma once

#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>

namespace orva::notify {

/// A command to the service, on a separate control socket. It is sent as a line "send CLIENTS
/// LENGTH" or "drop CLIENTS LENGTH" and LENGTH bytes of message. The answer is a line with the
/// number of clients reached.
struct Request {
  enum class Kind { Send, Drop };

  Kind kind = Kind::Send;
  std::size_t clients = 0; ///< the service waits until so many clients are connected
  std::string message{};   ///< without the delimiter; empty for Drop
};

/// Address of the control socket that belongs to the notification socket at `address`.
std::string ControlAddress(const std::string& address);

/// Sends `request` to the service of the notification socket `address`. Returns the number of
/// clients reached. Throws util::Exception when no service listens, the message is too long, or
/// there is no answer within `wait`.
std::size_t Ask(const std::string& address, const Request& request, std::chrono::seconds wait);

/// The service's end of one request, non-blocking. Closes itself when the other side disconnects or
/// sends anything that is not a request.
class ControlConnection : public util::Socket {
public:
  explicit ControlConnection(util::FileDescriptor connection) : Socket(connection.Release()) {}

  /// Reads the available input.
  void ReadAvailable();

  /// The request, once all of it has arrived.
  const std::optional<Request>& Received() const noexcept { return complete_; }

  /// Answers that `count` clients were reached, then closes the connection.
  void Answer(std::size_t count);

private:
  bool ReadHeader();

  std::string input_;               ///< received, not parsed yet
  std::optional<Request> arriving_; ///< once its header is parsed
  std::size_t length_ = 0;          ///< of its message
  std::optional<Request> complete_;
};

} // namespace orva::notify

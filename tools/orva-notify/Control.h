#pragma once

#include "orvautil/Socket.h"

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>

namespace orva::notify {

/// What the service is asked to do, on a socket of its own beside the clients'. A request goes
/// over the wire as a line "send CLIENTS LENGTH" or "drop CLIENTS LENGTH" and LENGTH bytes of
/// message; the answer is a line with the number of clients reached.
struct Request {
  enum class Kind { Send, Drop };

  Kind kind = Kind::Send;
  std::size_t clients = 0; ///< how many clients must be connected before it is done
  std::string message;     ///< without the delimiter; empty for Drop
};

/// Address of the control socket that belongs to the notification socket at `address`.
std::string ControlAddress(const std::string& address);

/// Has the service at the notification socket `address` do `request` and returns how many
/// clients it reached. Throws util::Exception when no service listens, the message is too long,
/// or no answer comes within `wait`.
std::size_t Ask(const std::string& address, const Request& request, std::chrono::seconds wait);

/// The service's end of one request, non-blocking. Closes itself when the other side is gone or
/// says something that is no request.
class ControlConnection : public util::Socket {
public:
  /// Takes over `descriptor`.
  explicit ControlConnection(int descriptor) : Socket(descriptor) {}

  /// Reads what is there.
  void ReadAvailable();

  /// The request, once all of it has arrived.
  const std::optional<Request>& Received() const noexcept { return complete_; }

  /// Answers that `count` clients were reached and closes the connection.
  void Answer(std::size_t count);

private:
  bool ReadHeader();

  std::string input_;               ///< what has arrived and is not understood yet
  std::optional<Request> arriving_; ///< once its header is understood
  std::size_t length_ = 0;          ///< of its message
  std::optional<Request> complete_;
};

} // namespace orva::notify

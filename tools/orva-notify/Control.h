#pragma once

#include "orva-notify/Client.h"
#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>

namespace orva::notify {

/// A command to the service, on a separate control socket. It is sent as a line "send CLIENTS
/// LENGTH" or "drop CLIENTS LENGTH" and LENGTH bytes of message. The words "raw" and "handled" may
/// follow in the line. The answer is a line with the number of clients reached; with "handled",
/// a second line follows with the number of clients that have handled the message.
struct Request {
  enum class Kind { Send, Drop };

  Kind kind = Kind::Send;
  std::size_t clients = 0; ///< the service waits until so many clients are connected
  std::string message{};   ///< without the delimiter; empty for Drop
  bool handled = false;    ///< Send: the answer waits until all clients have handled the message
  bool raw = false;        ///< Send: the service does not remember what the message announces
};

/// Address of the control socket that belongs to the notification socket at `address`.
std::string ControlAddress(const std::string& address);

/// Sends `request` to the service of the notification socket `address`. Returns the number of
/// clients reached, or, with `handled`, of those that have handled the message. Observers are not
/// counted. Throws util::Exception when no service listens, the message is too long, or there is no
/// answer within `wait`; the clients may then still handle the message.
std::size_t Ask(const std::string& address, const Request& request, std::chrono::seconds wait);

/// The service's end of one request, non-blocking. Closes itself when the other side disconnects or
/// sends anything that is not a request.
class ControlConnection : public util::Socket {
public:
  explicit ControlConnection(util::FileDescriptor connection) : Socket(connection.Release()) {}

  /// Reads all available input, also to notice a requester that has given up.
  void ReadAvailable();

  /// The request, once all of it has arrived, until AwaitHandling().
  const std::optional<Request>& Received() const noexcept { return complete_; }

  /// Answers `count`, then closes the connection.
  void Answer(std::size_t count);

  /// Answers that `count` clients were reached. Another answer follows when they have handled the
  /// message, see Handled().
  void AwaitHandling(std::size_t count, std::shared_ptr<const Handling> handling);

  /// After AwaitHandling, once no client still has to handle the message: how many have.
  std::optional<std::size_t> Handled() const;

private:
  bool ReadChunk();
  bool ReadHeader();
  void WriteLine(std::size_t count);

  std::string input_;               ///< received, not parsed yet
  std::optional<Request> arriving_; ///< once its header is parsed
  std::size_t length_ = 0;          ///< of its message
  std::optional<Request> complete_;
  std::shared_ptr<const Handling> handling_; ///< since AwaitHandling()
};

} // namespace orva::notify

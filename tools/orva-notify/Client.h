#pragma once

#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"

#include <cstddef>
#include <deque>
#include <memory>
#include <string>

namespace orva::notify {

/// Whether a request on a socket that has failed with `error`, an errno, may succeed later.
bool IsTemporary(int error);

/// A queued message, shared by the clients that receive it.
using Message = std::shared_ptr<const std::string>;

/// The limit of the bytes queued for a client that does not read, and thus of a message's length.
constexpr std::size_t MAXIMUM_QUEUED_BYTES = std::size_t{64} * 1024 * 1024;

/// The connection of a client, non-blocking, with the messages that are not sent yet. Closes itself
/// when the client has disconnected.
class Client : public util::Socket {
public:
  /// `number` identifies the client in the output.
  Client(util::FileDescriptor connection, unsigned number)
      : Socket(connection.Release()), number_(number) {}

  unsigned Number() const noexcept { return number_; }

  /// Number of bytes that are not sent yet.
  std::size_t QueuedBytes() const noexcept { return queuedBytes_; }

  /// Appends `message` to the queue and calls SendQueued().
  void Queue(const Message& message);

  /// Sends as much of the queue as the client's buffer takes.
  void SendQueued();

  /// Reads and discards input, to notice when the client disconnects.
  void DiscardInput();

private:
  void RemoveSent(std::size_t count);

  const unsigned number_;
  std::deque<Message> queue_;
  std::size_t sentOfFirst_ = 0;
  std::size_t queuedBytes_ = 0;
};

} // namespace orva::notify

#pragma once

#include "orvautil/Socket.h"

#include <cstddef>
#include <deque>
#include <memory>
#include <string>

namespace orva::notify {

/// A message on its way, shared by the clients that it goes to.
using Message = std::shared_ptr<const std::string>;

/// Most bytes that are kept for a client that does not read them, and so the longest message.
constexpr std::size_t MAXIMUM_QUEUED_BYTES = std::size_t{64} * 1024 * 1024;

/// The connection of a client, non-blocking, with what it has not taken yet. Closes itself when
/// the client is found to be gone.
class Client : public util::Socket {
public:
  /// Takes over `descriptor`; `number` tells the client from others.
  Client(int descriptor, unsigned number) : Socket(descriptor), number_(number) {}

  unsigned Number() const noexcept { return number_; }

  /// Bytes that wait for the client to read.
  std::size_t QueuedBytes() const noexcept { return queuedBytes_; }

  /// Puts `message` behind what waits and sends what the client takes.
  void Queue(const Message& message);

  /// Sends as much of what waits as the client takes.
  void SendQueued();

  /// Reads and forgets what the client says; nothing is expected but its end.
  void DiscardInput();

private:
  void Taken(std::size_t count);

  const unsigned number_;
  std::deque<Message> queue_;
  std::size_t takenOfFirst_ = 0;
  std::size_t queuedBytes_ = 0;
};

} // namespace orva::notify

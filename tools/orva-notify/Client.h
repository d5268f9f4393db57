#pragma once

#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"

#include <cstddef>
#include <deque>
#include <memory>
#include <string>
#include <utility>

namespace orva::notify {

/// Whether a request on a socket that has failed with `error`, an errno, may succeed later.
bool IsTemporary(int error);

/// A queued message, shared by the clients that receive it.
using Message = std::shared_ptr<const std::string>;

/// How many clients have handled everything that was queued before a mark. Each client that has not
/// yet holds a reference.
struct Handling {
  std::size_t handled = 0;
};

/// The limit of the bytes queued for a client that does not read, and thus of a message's length.
constexpr std::size_t MAXIMUM_QUEUED_BYTES = std::size_t{64} * 1024 * 1024;

/// The connection of a client, non-blocking, with the messages that are not sent yet. Closes itself
/// when the client has disconnected.
///
/// A client that writes anything is an observer: it receives every message, but is not waited for.
/// Any other client handles what it has read before it reads on, as the daemon does.
class Client : public util::Socket {
public:
  /// `number` identifies the client in the output.
  Client(util::FileDescriptor connection, unsigned number)
      : Socket(connection.Release()), number_(number) {}

  unsigned Number() const noexcept { return number_; }

  bool IsObserver() const noexcept { return isObserver_; }

  /// Number of bytes that are not sent yet.
  std::size_t QueuedBytes() const noexcept { return queuedBytes_; }

  /// Appends `message` to the queue and calls SendQueued().
  void Queue(const Message& message);

  /// Appends a mark to the queue and calls SendQueued(). When the client has handled everything
  /// before the mark, SendQueued() counts it in `handling`. Not for observers.
  void QueueMark(const std::shared_ptr<Handling>& handling);

  /// Holds a reference until the client has disconnected or is an observer. Replaces the last one.
  void Hold(std::shared_ptr<const Handling> handling) { held_ = std::move(handling); }

  /// Sends as much of the queue as the client's buffer takes, up to a mark that is not reached.
  void SendQueued();

  /// Whether SendQueued() can go on when the client's buffer has space.
  bool AwaitsSpace() const { return !queue_.empty() && !queue_.front().handling; }

  /// Whether SendQueued() can go on when the client has read everything.
  bool AwaitsReader() const { return !queue_.empty() && queue_.front().handling; }

  /// Adds the client to `readers`, a descriptor of epoll, which then becomes readable whenever the
  /// client has read something.
  void ReportReading(int readers);

  /// Reads and discards input, to notice observers, and when the client disconnects.
  void DiscardInput();

private:
  /// A message, or a mark: an empty message, which is sent when all before it was read. The client
  /// reads it when it has handled all before it.
  struct Entry {
    Message message;
    std::shared_ptr<Handling> handling{}; ///< of a mark
  };

  void Append(Entry entry);
  bool HasUnreadBytes() const;
  bool HasHungUp() const;
  void RemoveFirst();
  void BecomeObserver();

  const unsigned number_;
  bool isObserver_ = false;
  bool reportsReading_ = false;
  std::shared_ptr<const Handling> held_;
  std::deque<Entry> queue_;
  std::size_t sentOfFirst_ = 0;
  std::size_t queuedBytes_ = 0;
};

} // namespace orva::notify

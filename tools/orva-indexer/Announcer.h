#pragma once

#include "orva-notify/Notification.h"
#include "orvautil/ClientSocket.h"

#include <cstddef>
#include <deque>
#include <functional>
#include <optional>
#include <string>

namespace orva::indexer {

/// Announces events of volumes through the notification service, one after the other, without
/// waiting. On the program's thread.
class Announcer {
public:
  struct Announcement {
    notify::Event event = notify::Event::End;
    std::string mountPoint{};
    /// Whether the answer comes only when all clients have handled the message.
    bool handled = false;
  };

  /// Called when an announcement is done, with the number of clients that were reached, or, with
  /// `handled`, of those that have handled the message. Nothing if the service is not there.
  using Done = std::function<void(const Announcement&, std::optional<std::size_t>)>;

  /// For the service of the notification socket `address`.
  Announcer(const std::string& address, Done done);

  /// Queues an announcement. One that still waits is not queued again. Returns whether it was
  /// queued.
  bool Announce(const Announcement& announcement);

  /// Forgets what waits for a volume.
  void Forget(const std::string& mountPoint);

  /// The descriptor to be polled for Events(); -1 while nothing is announced.
  int Descriptor() const noexcept { return socket_ ? socket_->Descriptor() : -1; }
  short Events() const noexcept;

  /// Goes on as far as possible.
  void Proceed();

private:
  void Begin();
  void Finish(std::optional<std::size_t> count);
  bool Receive();

  const std::string address_;
  const Done done_;
  std::deque<Announcement> queue_; ///< the first one is being announced while there is a socket
  std::optional<util::ClientSocket> socket_;
  std::string unsent_;
  std::string answer_;
};

} // namespace orva::indexer

#pragma once

#include "orvautil/ClientSocket.h"
#include "orvautil/FileDescriptor.h"

#include <optional>
#include <string>
#include <vector>

namespace orva::notifications {

/// What an Observer reports.
struct Notification {
  enum class Event {
    Connected, ///< to the service, which now sends the state of all volumes; has no mount point
    Plugged,
    Unplugged,
    Scanned,
    TranscodedBatch,
    End,
    Purged
  };

  Event event = Event::Connected;
  std::string mountPoint{}; ///< ends in "/"
  bool isDirectory = false; ///< Plugged: the volume is a plain directory, not a mount point
};

/// A connection to the notification service that is not counted as one of its clients. Connects
/// again whenever the service is there. Never waits. Used by one thread.
class Observer {
public:
  /// For the service at `address`. Throws util::Exception.
  explicit Observer(std::string address);
  Observer(const Observer&) = delete;
  Observer& operator=(const Observer&) = delete;
  ~Observer();

  /// A descriptor that becomes readable when Receive has something to do.
  int Descriptor() const noexcept { return events_.Get(); }

  /// What has arrived since the last call, in order. Connects if necessary; the first call does so
  /// for the first time. A message that cannot be read is skipped.
  std::vector<Notification> Receive();

private:
  bool HasDirectoryChanged();
  void WatchDirectory();
  void Connect(std::vector<Notification>& received);
  void ReadAvailable(std::vector<Notification>& received);
  void TryAgainSoon();

  const std::string address_;
  util::FileDescriptor events_;    ///< an epoll descriptor of the three others
  util::FileDescriptor directory_; ///< an inotify descriptor for the socket's directory
  util::FileDescriptor timer_;
  std::optional<util::ClientSocket> socket_; ///< empty while not connected
  int watch_ = -1;
  int attempts_ = 0; ///< to connect since the directory has changed
  std::string input_;
};

} // namespace orva::notifications

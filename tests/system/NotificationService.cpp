#include "NotificationService.h"

#include "Deadline.h"

#include "orva-notify/Notification.h"
#include "orvautil/Core.h"
#include "orvautil/Socket.h"

#include <linux/sockios.h>
#include <poll.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>
#include <system_error>

namespace orva::test {

NotificationService::NotificationService()
    : listener_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
  const util::Socket::Address address(core::ORVA_NOTIFICATION_SOCKET);
  if (!listener_ || bind(listener_.Get(), address.Get(), address.Length()) != 0 ||
      listen(listener_.Get(), SOMAXCONN) != 0) {
    throw std::system_error(errno, std::generic_category(), core::ORVA_NOTIFICATION_SOCKET);
  }
}

NotificationService::~NotificationService() {
  Stop();
}

void NotificationService::AwaitClient() {
  if (client_) {
    return;
  }
  pollfd waiting{listener_.Get(), POLLIN, 0};
  const auto deadline = std::chrono::milliseconds(DEADLINE).count();
  if (poll(&waiting, 1, static_cast<int>(deadline)) != 1) {
    throw std::runtime_error("no client has connected to the notification service");
  }
  client_.Reset(accept4(listener_.Get(), nullptr, nullptr, SOCK_CLOEXEC));
  if (!client_) {
    throw std::system_error(errno, std::generic_category(), "accept4");
  }
  const timeval patience{.tv_sec = DEADLINE.count(), .tv_usec = 0};
  setsockopt(client_.Get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience);
}

void NotificationService::SendBytes(const std::string& bytes) {
  AwaitClient();
  std::size_t sent = 0;
  while (sent < bytes.size()) {
    const ssize_t count =
        send(client_.Get(), bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL);
    if (count == -1) {
      throw std::system_error(errno, std::generic_category(), "send");
    }
    sent += static_cast<std::size_t>(count);
  }
}

void NotificationService::Send(const std::string& message) {
  SendBytes(notify::Frame(message));
}

// No event reports that a queue has become empty, and a sleep would take a time slice for each
// byte.
void NotificationService::AwaitConsumed() const {
  const auto deadline = std::chrono::steady_clock::now() + DEADLINE;
  int unread = 0;
  while (ioctl(client_.Get(), SIOCOUTQ, &unread) == 0 && unread != 0) {
    if (std::chrono::steady_clock::now() > deadline) {
      throw std::runtime_error("the client of the notification service does not read");
    }
    sched_yield();
  }
}

void NotificationService::StopReading() {
  AwaitClient();
  const int smallest = 1;
  setsockopt(client_.Get(), SOL_SOCKET, SO_RCVBUF, &smallest, sizeof smallest);
}

int NotificationService::Received() {
  AwaitClient();
  int bytes = 0;
  if (ioctl(client_.Get(), FIONREAD, &bytes) != 0) {
    throw std::system_error(errno, std::generic_category(), "FIONREAD");
  }
  return bytes;
}

void NotificationService::CloseClient() {
  AwaitClient();
  client_.Reset();
}

void NotificationService::Stop() {
  // The listener first: a client that sees its connection closed must not reach it again.
  if (listener_) {
    listener_.Reset();
    unlink(core::ORVA_NOTIFICATION_SOCKET.c_str());
  }
  client_.Reset();
}

} // namespace orva::test

#include "Announcer.h"

#include "orva-notify/Control.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <utility>

namespace orva::indexer {

Announcer::Announcer(const std::string& address, Done done)
    : address_(notify::ControlAddress(address)), done_(std::move(done)) {}

bool Announcer::Announce(const Announcement& announcement) {
  const auto waiting = queue_.begin() + (socket_ ? 1 : 0);
  const bool isQueued =
      std::any_of(waiting, queue_.end(), [&announcement](const Announcement& queued) {
        return queued.event == announcement.event && queued.mountPoint == announcement.mountPoint;
      });
  if (!isQueued) {
    queue_.push_back(announcement);
  }
  return !isQueued;
}

void Announcer::Forget(const std::string& mountPoint) {
  const auto waiting = queue_.begin() + (socket_ ? 1 : 0);
  queue_.erase(std::remove_if(waiting, queue_.end(),
                              [&mountPoint](const Announcement& queued) {
                                return queued.mountPoint == mountPoint;
                              }),
               queue_.end());
}

short Announcer::Events() const noexcept {
  return unsent_.empty() ? POLLIN : POLLIN | POLLOUT;
}

void Announcer::Proceed() {
  do {
    if (!socket_) {
      if (queue_.empty()) {
        return;
      }
      Begin();
    }
  } while (socket_ ? Receive() : true);
}

/// Connects and composes the request. See notify::Request for its form.
void Announcer::Begin() {
  socket_.emplace(util::Socket::Address(address_), true);
  if (!socket_->IsOpen()) {
    Finish(std::nullopt);
    return;
  }
  const Announcement& next = queue_.front();
  const std::string message = notify::Compose(next.event, next.mountPoint);
  unsent_ = "send 0 " + std::to_string(message.size()) + (next.handled ? " handled" : "") + '\n' +
            message;
  answer_.clear();
}

/// Sends and receives what is possible. Returns whether the announcement is done.
bool Announcer::Receive() {
  while (!unsent_.empty()) {
    const ssize_t count =
        send(socket_->Descriptor(), unsent_.data(), unsent_.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    if (count < 0) {
      if (errno == EAGAIN || errno == EINTR) {
        return false;
      }
      Finish(std::nullopt);
      return true;
    }
    unsent_.erase(0, static_cast<std::size_t>(count));
  }
  std::array<char, 256> chunk;
  ssize_t count = 0;
  while ((count = recv(socket_->Descriptor(), chunk.data(), chunk.size(), MSG_DONTWAIT)) > 0) {
    answer_.append(chunk.data(), static_cast<std::size_t>(count));
  }
  if (count == -1 && (errno == EAGAIN || errno == EINTR)) {
    return false;
  }
  // The service closes the connection after the last line of its answer.
  const std::size_t lines = static_cast<std::size_t>(std::ranges::count(answer_, '\n'));
  const std::size_t begin = lines > 1 ? answer_.find('\n') + 1 : 0;
  std::size_t clients = 0;
  const auto [end, error] =
      std::from_chars(answer_.data() + begin, answer_.data() + answer_.size(), clients);
  Finish(lines > 0 && error == std::errc() ? std::optional(clients) : std::nullopt);
  return true;
}

void Announcer::Finish(std::optional<std::size_t> count) {
  const Announcement announcement = std::move(queue_.front());
  queue_.pop_front();
  socket_.reset();
  unsent_.clear();
  if (!count) {
    queue_.clear(); // the service is not there
  }
  done_(announcement, count);
}

} // namespace orva::indexer

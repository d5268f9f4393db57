#include "orva-notify/Client.h"

#include "orva-notify/Notification.h"

#include <linux/sockios.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/ioctl.h>

#include <array>
#include <cerrno>
#include <utility>

namespace orva::notify {

bool IsTemporary(int error) {
  return error == EAGAIN || error == EINTR;
}

void Client::Queue(const Message& message) {
  if (!message->empty()) {
    Append({.message = message});
  }
  SendQueued();
}

void Client::QueueMark(const std::shared_ptr<Handling>& handling) {
  Append({.message = std::make_shared<const std::string>(Frame("")), .handling = handling});
  SendQueued();
}

void Client::Append(Entry entry) {
  queuedBytes_ += entry.message->size();
  queue_.push_back(std::move(entry));
}

void Client::SendQueued() {
  while (IsOpen() && !queue_.empty()) {
    const Entry& first = queue_.front();
    if (first.handling && (HasUnreadBytes() || HasHungUp())) {
      return;
    }
    if (sentOfFirst_ == first.message->size()) {
      RemoveFirst();
      continue;
    }
    const ssize_t count = send(Descriptor(), first.message->data() + sentOfFirst_,
                               first.message->size() - sentOfFirst_, MSG_NOSIGNAL);
    if (count >= 0) {
      queuedBytes_ -= static_cast<std::size_t>(count);
      sentOfFirst_ += static_cast<std::size_t>(count);
    } else if (IsTemporary(errno)) {
      return;
    } else {
      Close();
    }
  }
}

void Client::RemoveFirst() {
  if (const auto& handling = queue_.front().handling) {
    ++handling->handled;
  }
  queue_.pop_front();
  sentOfFirst_ = 0;
}

bool Client::HasUnreadBytes() const {
  int bytes = 0;
  // The kernel reports the space of the last message, which is more than a byte, but subtracts its
  // last byte only after that.
  return ioctl(Descriptor(), SIOCOUTQ, &bytes) == 0 && bytes > 1;
}

// What a client leaves unread when it disconnects no longer counts as unread.
bool Client::HasHungUp() const {
  pollfd state{.fd = Descriptor(), .events = POLLRDHUP, .revents = 0};
  return poll(&state, 1, 0) == 1;
}

void Client::ReportReading(int readers) {
  // Edge-triggered: the socket nearly always has space, but there is an event for each message
  // read.
  epoll_event event{.events = EPOLLOUT | EPOLLET, .data = {}};
  if (!std::exchange(reportsReading_, true) &&
      epoll_ctl(readers, EPOLL_CTL_ADD, Descriptor(), &event) != 0) {
    Close();
  }
}

void Client::DiscardInput() {
  std::array<char, 4096> input;
  const ssize_t count = IsOpen() ? recv(Descriptor(), input.data(), input.size(), 0) : 0;
  if (count == 0 || (count == -1 && !IsTemporary(errno))) {
    Close();
  } else if (count > 0) {
    BecomeObserver();
  }
}

void Client::BecomeObserver() {
  isObserver_ = true;
  held_.reset();
  for (auto& entry : queue_) {
    entry.handling.reset();
  }
}

} // namespace orva::notify

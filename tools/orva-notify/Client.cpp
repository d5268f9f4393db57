#include "orva-notify/Client.h"

#include <array>
#include <cerrno>

namespace orva::notify {

bool IsTemporary(int error) {
  return error == EAGAIN || error == EINTR;
}

void Client::Queue(const Message& message) {
  if (!message->empty()) {
    queue_.push_back(message);
    queuedBytes_ += message->size();
  }
  SendQueued();
}

void Client::SendQueued() {
  while (IsOpen() && !queue_.empty()) {
    const std::string& first = *queue_.front();
    const ssize_t count =
        send(Descriptor(), first.data() + sentOfFirst_, first.size() - sentOfFirst_, MSG_NOSIGNAL);
    if (count >= 0) {
      RemoveSent(static_cast<std::size_t>(count));
    } else if (IsTemporary(errno)) {
      return;
    } else {
      Close();
    }
  }
}

void Client::RemoveSent(std::size_t count) {
  queuedBytes_ -= count;
  sentOfFirst_ += count;
  if (sentOfFirst_ == queue_.front()->size()) {
    queue_.pop_front();
    sentOfFirst_ = 0;
  }
}

void Client::DiscardInput() {
  std::array<char, 4096> input;
  const ssize_t count = IsOpen() ? recv(Descriptor(), input.data(), input.size(), 0) : 0;
  if (count == 0 || (count == -1 && !IsTemporary(errno))) {
    Close();
  }
}

} // namespace orva::notify

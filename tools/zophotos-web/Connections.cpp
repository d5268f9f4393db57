#include "Connections.h"

#include <sys/socket.h>

#include <algorithm>

namespace orva::web {

void Connections::Connection::ExpectRequest() {
  deadline_ = Clock::now() + REQUEST_TIME;
  isWaiting_ = true;
}

void Connections::Connection::SendResponse(std::uint64_t size) {
  constexpr std::uint64_t WEEK = 604'800;
  const std::uint64_t seconds = std::min(size / BYTES_PER_SECOND, WEEK);
  isWaiting_ = false;
  deadline_ = Clock::now() + RESPONSE_TIME + std::chrono::seconds(seconds);
}

Connections::Connection& Connections::Add(int socket) {
  const std::lock_guard lock(mutex_);
  if (all_.size() >= crowd_) {
    ShutDownOldest();
  }
  return all_.emplace_back(socket);
}

void Connections::Remove(Connection& connection) {
  const std::lock_guard lock(mutex_);
  all_.remove_if([&](const Connection& other) { return &other == &connection; });
}

void Connections::ShutDownLate() {
  const std::lock_guard lock(mutex_);
  const Clock::time_point now = Clock::now();
  for (const Connection& connection : all_) {
    if (connection.deadline_.load() < now) {
      shutdown(connection.socket_, SHUT_RDWR);
    }
  }
}

void Connections::ShutDownOldest() {
  const auto waitingUntil = [](const Connection& connection) {
    return connection.isWaiting_ ? connection.deadline_.load() : Clock::time_point::max();
  };
  const auto oldest = std::ranges::min_element(all_, {}, waitingUntil);
  if (oldest != all_.end() && oldest->isWaiting_) {
    shutdown(oldest->socket_, SHUT_RDWR);
    oldest->deadline_ = Clock::time_point::max(); // it is displaced once
    oldest->isWaiting_ = false;
  }
}

} // namespace orva::web

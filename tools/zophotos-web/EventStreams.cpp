#include "EventStreams.h"

#include <microhttpd.h>

#include <poll.h>

#include <algorithm>
#include <vector>

namespace orva::web {

void EventStreams::PublishVersion(std::int64_t version) {
  const std::lock_guard lock(mutex_);
  if (version_ != version) {
    version_ = version;
    ResumeAll();
  }
}

void EventStreams::PublishVolumes() {
  const std::lock_guard lock(mutex_);
  ++volumes_;
  ResumeAll();
}

void EventStreams::KeepAlive() {
  const std::lock_guard lock(mutex_);
  EndGone();
  for (Stream& stream : streams_) {
    if (Clock::now() - stream.lastSent >= SILENCE) {
      Resume(stream);
    }
  }
}

void EventStreams::Close() {
  const std::lock_guard lock(mutex_);
  isClosed_ = true;
  ResumeAll();
}

MHD_Response* EventStreams::Open(MHD_Connection* connection) {
  constexpr std::size_t BLOCK = 1024;
  const std::lock_guard lock(mutex_);
  if (streams_.size() >= MOST) {
    EndGone();
  }
  if (isClosed_ || std::ranges::count(streams_, false, &Stream::isGone) >= std::ptrdiff_t{MOST}) {
    return nullptr;
  }
  const int socket =
      MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD)->connect_fd;
  streams_.push_back({.all = *this,
                      .connection = connection,
                      .socket = socket,
                      .unsent = "retry: 3000\n\n",
                      .sentVolumes = volumes_});
  MHD_Response* const response =
      MHD_create_response_from_callback(MHD_SIZE_UNKNOWN, BLOCK, &Read, &streams_.back(), &Free);
  if (response == nullptr) {
    streams_.pop_back();
  }
  return response;
}

std::ptrdiff_t EventStreams::Read(void* stream, std::uint64_t /*position*/, char* buffer,
                                  std::size_t size) {
  Stream& self = *static_cast<Stream*>(stream);
  const std::lock_guard lock(self.all.mutex_);
  if (self.all.isClosed_) {
    return MHD_CONTENT_READER_END_OF_STREAM;
  }
  if (self.isGone) {
    return MHD_CONTENT_READER_END_WITH_ERROR;
  }
  self.all.Collect(self);
  if (self.unsent.empty()) {
    self.isSuspended = true;
    MHD_suspend_connection(self.connection);
    return 0;
  }
  const std::size_t count = self.unsent.copy(buffer, size);
  self.unsent.erase(0, count);
  self.lastSent = Clock::now();
  return static_cast<std::ptrdiff_t>(count);
}

void EventStreams::Free(void* stream) {
  EventStreams& all = static_cast<Stream*>(stream)->all;
  const std::lock_guard lock(all.mutex_);
  all.streams_.remove_if([&](const Stream& other) { return &other == stream; });
}

/// Adds the events that `stream` has not got yet.
void EventStreams::Collect(Stream& stream) const {
  if (!stream.unsent.empty() && stream.sentVersion != -1) {
    return; // a slow client gets the latest state only
  }
  if (stream.sentVersion != version_) {
    stream.unsent += "event: change\ndata: " + std::to_string(version_) + "\n\n";
    stream.sentVersion = version_;
  }
  if (stream.sentVolumes != volumes_) {
    stream.unsent += "event: volumes\ndata: " + std::to_string(version_) + "\n\n";
    stream.sentVolumes = volumes_;
  }
  if (stream.unsent.empty() && Clock::now() - stream.lastSent >= SILENCE) {
    stream.unsent = ":\n\n";
  }
}

void EventStreams::Resume(Stream& stream) {
  if (stream.isSuspended) {
    stream.isSuspended = false;
    MHD_resume_connection(stream.connection);
  }
}

void EventStreams::ResumeAll() {
  for (Stream& stream : streams_) {
    Resume(stream);
  }
}

/// Ends the streams whose clients are gone. libmicrohttpd does not look at the sockets of suspended
/// connections.
void EventStreams::EndGone() {
  std::vector<pollfd> sockets;
  sockets.reserve(streams_.size());
  for (const Stream& stream : streams_) {
    sockets.push_back({.fd = stream.socket, .events = POLLRDHUP, .revents = 0});
  }
  poll(sockets.data(), sockets.size(), 0);
  auto state = sockets.begin();
  for (Stream& stream : streams_) {
    if ((state++->revents & (POLLRDHUP | POLLHUP | POLLERR)) != 0) {
      stream.isGone = true;
      Resume(stream);
    }
  }
}

} // namespace orva::web

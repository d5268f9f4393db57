#include "orva-notify/Control.h"

#include "orvautil/ClientSocket.h"
#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <poll.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <sstream>
#include <string_view>
#include <utility>
#include <vector>

namespace orva::notify {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::size_t MAXIMUM_HEADER = 64;

std::string Encode(const Request& request) {
  return (request.kind == Request::Kind::Send ? "send " : "drop ") +
         std::to_string(request.clients) + ' ' + std::to_string(request.message.size()) +
         (request.raw ? " raw" : "") + (request.handled ? " handled" : "") + '\n' + request.message;
}

/// Waits for `events`. Returns false when `deadline` has passed.
bool WaitFor(const util::Socket& socket, short events, Clock::time_point deadline) {
  for (;;) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
    pollfd ready{.fd = socket.Descriptor(), .events = events, .revents = 0};
    const int result = poll(&ready, 1, static_cast<int>(std::max<long>(left.count(), 0)));
    if (result >= 0 || errno != EINTR) {
      return result > 0;
    }
  }
}

/// Sends `bytes`. Returns false when the deadline has passed. An error is left to ReceiveLine,
/// which finds that the service has closed the connection.
bool SendAll(const util::Socket& socket, std::string_view bytes, Clock::time_point deadline) {
  while (!bytes.empty()) {
    const ssize_t count = send(socket.Descriptor(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count >= 0) {
      bytes.remove_prefix(static_cast<std::size_t>(count));
    } else if (!IsTemporary(errno)) {
      return true;
    } else if (!WaitFor(socket, POLLOUT, deadline)) {
      return false;
    }
  }
  return true;
}

/// The line of the answer, without its newline; nothing when the deadline has passed. The line is
/// empty when the service has closed the connection.
std::optional<std::string> ReceiveLine(util::Socket& socket, Clock::time_point deadline) {
  std::string line;
  char next = 0;
  while (WaitFor(socket, POLLIN, deadline)) {
    if (socket.Read(&next, 1) == 0) {
      return std::string();
    }
    if (next == '\n') {
      return line;
    }
    line += next;
  }
  return std::nullopt;
}

[[noreturn]] void ThrowTooLate(const Request& request, std::chrono::seconds wait) {
  throw util::Exception(
      request.clients == 0
          ? util::FormatString("no answer from the notification service within %lld s",
                               static_cast<long long>(wait.count()))
          : util::FormatString("fewer than %zu clients connected within %lld s", request.clients,
                               static_cast<long long>(wait.count())));
}

/// The number in the next line of the answer; nothing when the deadline has passed.
std::optional<std::size_t> ReceiveCount(util::Socket& socket, Clock::time_point deadline) {
  const auto line = ReceiveLine(socket, deadline);
  if (line && line->empty()) {
    throw util::Exception("the notification service closed the connection without an answer");
  }
  return line ? std::optional(std::stoul(*line)) : std::nullopt;
}

} // namespace

std::string ControlAddress(const std::string& address) {
  return address + ".control";
}

std::size_t Ask(const std::string& address, const Request& request, std::chrono::seconds wait) {
  if (request.message.size() > MAXIMUM_QUEUED_BYTES) {
    throw util::Exception(util::FormatString("a message of %zu bytes is too long, %zu are allowed",
                                             request.message.size(), MAXIMUM_QUEUED_BYTES));
  }
  const auto deadline = Clock::now() + wait;
  util::ClientSocket socket(util::Socket::Address(ControlAddress(address)), true);
  if (!socket.IsOpen() && errno == EACCES) {
    throw util::Exception("permission denied for the control socket " + ControlAddress(address) +
                          "; run it as root");
  }
  if (!socket.IsOpen()) {
    throw util::Exception(
        util::FormatString("no orva-notify serves %s: %s", address.c_str(), strerror(errno)));
  }
  if (!SendAll(socket, Encode(request), deadline)) {
    ThrowTooLate(request, wait);
  }
  const auto reached = ReceiveCount(socket, deadline);
  if (!reached) {
    ThrowTooLate(request, wait);
  }
  if (!request.handled) {
    return *reached;
  }
  const auto handled = ReceiveCount(socket, deadline);
  if (!handled) {
    throw util::Exception(
        util::FormatString("sent, but not yet handled by all clients within %lld s",
                           static_cast<long long>(wait.count())));
  }
  return *handled;
}

void ControlConnection::ReadAvailable() {
  while (IsOpen() && ReadChunk()) {
  }
}

/// Returns false when there is no input for now.
bool ControlConnection::ReadChunk() {
  std::vector<char> chunk(std::size_t{64} * 1024);
  const ssize_t count = recv(Descriptor(), chunk.data(), chunk.size(), 0);
  if (count == -1 && IsTemporary(errno)) {
    return false;
  }
  if (count <= 0 || complete_ || handling_) {
    Close();
    return true;
  }
  input_.append(chunk.data(), static_cast<std::size_t>(count));
  if (!arriving_ && !ReadHeader()) {
    return true;
  }
  if (input_.size() == length_) {
    arriving_->message = std::move(input_);
    complete_ = std::move(arriving_);
  } else if (input_.size() > length_) {
    Close();
  }
  return true;
}

bool ControlConnection::ReadHeader() {
  const auto end = input_.find('\n');
  if (end == std::string::npos && input_.size() < MAXIMUM_HEADER) {
    return false;
  }
  std::istringstream header(input_.substr(0, end));
  std::string kind;
  Request request;
  if (!(header >> kind >> request.clients >> length_) || (kind != "send" && kind != "drop") ||
      length_ > MAXIMUM_QUEUED_BYTES) {
    Close();
    return false;
  }
  request.kind = kind == "send" ? Request::Kind::Send : Request::Kind::Drop;
  for (std::string word; header >> word;) {
    request.raw = request.raw || word == "raw";
    request.handled = request.handled || word == "handled";
  }
  arriving_ = request;
  input_.erase(0, end + 1);
  return true;
}

void ControlConnection::Answer(std::size_t count) {
  WriteLine(count);
  Close();
}

void ControlConnection::AwaitHandling(std::size_t count, std::shared_ptr<const Handling> handling) {
  WriteLine(count);
  handling_ = std::move(handling);
  complete_.reset();
}

std::optional<std::size_t> ControlConnection::Handled() const {
  return handling_ && handling_.use_count() == 1 ? std::optional(handling_->handled) : std::nullopt;
}

void ControlConnection::WriteLine(std::size_t count) {
  const std::string line = std::to_string(count) + '\n';
  static_cast<void>(Write(line.data(), static_cast<unsigned>(line.size())));
}

} // namespace orva::notify

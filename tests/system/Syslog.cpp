#include "Syslog.h"

#include "Deadline.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <iterator>
#include <regex>
#include <stdexcept>
#include <system_error>

namespace orva::test {

namespace {

/// Without a priority, so that it cannot be a message of syslog.
const std::string MARK = "mark";

sockaddr_un Address() {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strcpy(address.sun_path, "/dev/log");
  return address;
}

/// "<142>Nov 21 02:33:26 ident: text"
LogLine Parse(const std::string& datagram) {
  static const std::regex HEAD(R"(<(\d+)>\w{3} [ \d]\d \d\d:\d\d:\d\d [^ :]+: )");
  std::smatch parts;
  if (!std::regex_search(datagram, parts, HEAD, std::regex_constants::match_continuous)) {
    return {-1, datagram};
  }
  return {std::stoi(parts[1]), parts.suffix()};
}

} // namespace

std::ostream& operator<<(std::ostream& stream, const LogLine& line) {
  return stream << line.priority << " \"" << line.text << '"';
}

LogLine Info(const std::string& text) {
  return {LOG_LOCAL1 | LOG_INFO, text};
}
LogLine Error(const std::string& text) {
  return {LOG_LOCAL1 | LOG_ERR, text};
}
LogLine Plain(const std::string& text) {
  return {LOG_USER | LOG_INFO, text};
}

Syslog::Syslog() : socket_(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
  const sockaddr_un address = Address();
  if (!socket_ ||
      bind(socket_.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    throw std::system_error(errno, std::generic_category(), "/dev/log");
  }
  collector_ = std::jthread([this] { Collect(); });
}

Syslog::~Syslog() {
  shutdown(socket_.Get(), SHUT_RDWR); // ends the collector's recv
  collector_.join();
  unlink("/dev/log");
}

std::vector<LogLine> Syslog::Lines(std::size_t first) const {
  const std::unique_lock lock = LockAfterAllSent();
  return {lines_.begin() + static_cast<std::ptrdiff_t>(std::min(first, lines_.size())),
          lines_.end()};
}

// A socket keeps the order of its datagrams: everything that was sent before the mark arrives
// before it.
std::unique_lock<std::mutex> Syslog::LockAfterAllSent() const {
  const sockaddr_un address = Address();
  sendto(socket_.Get(), MARK.data(), MARK.size(), MSG_NOSIGNAL,
         reinterpret_cast<const sockaddr*>(&address), sizeof address);
  ++marksSent_;
  std::unique_lock lock(mutex_);
  if (!arrived_.wait_for(lock, DEADLINE, [this] { return marksSeen_ == marksSent_; })) {
    throw std::runtime_error("the system log does not collect");
  }
  return lock;
}

bool Syslog::Await(const Condition& condition) const {
  std::unique_lock lock(mutex_);
  return arrived_.wait_for(lock, DEADLINE, [&] { return condition(lines_); });
}

bool Syslog::Await(const LogLine& line) const {
  return Await([&line, searched = std::ptrdiff_t{0}](const std::vector<LogLine>& lines) mutable {
    const bool found = std::find(lines.begin() + searched, lines.end(), line) != lines.end();
    searched = std::ssize(lines);
    return found;
  });
}

void Syslog::Collect() {
  std::array<char, 131072> datagram;
  for (;;) {
    const ssize_t size = recv(socket_.Get(), datagram.data(), datagram.size(), 0);
    if (size == -1 && errno == EINTR) {
      continue;
    }
    if (size <= 0) {
      return;
    }
    {
      const std::string text(datagram.data(), static_cast<std::size_t>(size));
      const std::lock_guard lock(mutex_);
      if (text == MARK) {
        ++marksSeen_;
      } else {
        lines_.push_back(Parse(text));
      }
    }
    arrived_.notify_all();
  }
}

} // namespace orva::test

#include "notifications/Observer.h"

#include "orvautil/Decodestring.h"
#include "orvautil/Exception.h"
#include "orvautil/MessageProcessor.h"
#include "orvautil/Xml.h"

#include <xercesc/dom/DOMNode.hpp>
#include <xercesc/util/PlatformUtils.hpp>

#include <sys/epoll.h>
#include <sys/inotify.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>

namespace orva::notifications {
namespace {

using Event = Notification::Event;

constexpr std::array<unsigned char, 4> DELIMITER{};
constexpr std::string_view DELIMITER_TEXT("\0\0\0\0", DELIMITER.size());

/// A service creates its socket's file before it listens. So refused attempts are repeated for some
/// seconds.
constexpr long RETRY_NANOSECONDS = 100'000'000;
constexpr int MOST_ATTEMPTS = 50;

constexpr std::array EVENTS = {
    std::pair{"Plugged", Event::Plugged}, std::pair{"Unplugged", Event::Unplugged},
    std::pair{"Scanned", Event::Scanned}, std::pair{"TranscodedBatch", Event::TranscodedBatch},
    std::pair{"End", Event::End},         std::pair{"Purged", Event::Purged}};

/// Reads single messages.
class MessageReader : public util::MessageProcessor {
public:
  /// What `message` says; nothing if it is not a notification.
  std::optional<Notification> Read(util::Stream& stream, std::string_view message) const {
    notification_.reset();
    try {
      ParseMessage(stream, reinterpret_cast<const unsigned char*>(message.data()), message.size());
    } catch (...) {        // also the parser's own exceptions
      return std::nullopt; // the daemon receives the message, too, and logs it
    }
    return notification_;
  }

  bool IsValidMessage(const std::string& /*message*/) const override { return true; }
  std::pair<const unsigned char*, unsigned long> GetDelimiter() const override {
    return {DELIMITER.data(), DELIMITER.size()};
  }
  void HandleMessage(util::Stream& /*stream*/, const unsigned char* /*data*/,
                     unsigned long /*length*/, const xercesc::DOMNode& root) const override {
    if (util::XMLCh2string(root.getNodeName()) != "ORVANotification") {
      return;
    }
    const auto* const attributes = root.getAttributes();
    const std::string name = util::GetAttributeValue("Name", attributes);
    std::string mountPoint = util::Decodestring(util::GetAttributeValue("MountPoint", attributes));
    if (!mountPoint.starts_with('/')) {
      return;
    }
    if (!mountPoint.ends_with('/')) {
      mountPoint += '/';
    }
    for (const auto& [text, event] : EVENTS) {
      if (name == text) {
        notification_ = {.event = event,
                         .mountPoint = std::move(mountPoint),
                         .isDirectory = util::GetAttributeValue("Kind", attributes) == "directory"};
        return;
      }
    }
  }

private:
  mutable std::optional<Notification> notification_;
};

util::FileDescriptor Checked(int descriptor) {
  if (descriptor == -1) {
    throw util::Exception("cannot wait for notifications: " +
                          std::generic_category().message(errno));
  }
  return util::FileDescriptor(descriptor);
}

void Add(int events, int descriptor) {
  epoll_event event{.events = EPOLLIN, .data = {}};
  if (epoll_ctl(events, EPOLL_CTL_ADD, descriptor, &event) != 0) {
    Checked(-1);
  }
}

/// The directory of the file at `path`, or the nearest one above that exists.
std::filesystem::path ExistingDirectory(const std::string& path) {
  std::filesystem::path directory = std::filesystem::path(path).parent_path();
  std::error_code ignored;
  while (!std::filesystem::is_directory(directory, ignored) && directory.has_relative_path()) {
    directory = directory.parent_path();
  }
  return directory;
}

} // namespace

Observer::Observer(std::string address)
    : address_(std::move(address)), events_(Checked(epoll_create1(EPOLL_CLOEXEC))),
      directory_(Checked(inotify_init1(IN_NONBLOCK | IN_CLOEXEC))),
      timer_(Checked(timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC))) {
  xercesc::XMLPlatformUtils::Initialize();
  Add(events_.Get(), directory_.Get());
  Add(events_.Get(), timer_.Get());
  TryAgainSoon();
}

Observer::~Observer() {
  xercesc::XMLPlatformUtils::Terminate();
}

std::vector<Notification> Observer::Receive() {
  std::vector<Notification> received;
  std::uint64_t expirations = 0;
  const bool isTime = read(timer_.Get(), &expirations, sizeof expirations) > 0;
  const bool hasChanged = HasDirectoryChanged();
  if (hasChanged) {
    attempts_ = 0;
  }
  if (!socket_ && (isTime || hasChanged || watch_ == -1)) {
    Connect(received);
  }
  if (socket_) {
    ReadAvailable(received);
  }
  return received;
}

bool Observer::HasDirectoryChanged() {
  alignas(inotify_event) std::array<char, 4096> changes;
  bool hasChanged = false;
  while (read(directory_.Get(), changes.data(), changes.size()) > 0) {
    hasChanged = true;
  }
  return hasChanged;
}

void Observer::WatchDirectory() {
  if (!address_.starts_with('/')) {
    return; // an abstract address has no directory
  }
  std::filesystem::path directory;
  do {
    directory = ExistingDirectory(address_);
    const int former = std::exchange(
        watch_, inotify_add_watch(directory_.Get(), directory.c_str(),
                                  IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF));
    if (former != -1 && former != watch_) {
      inotify_rm_watch(directory_.Get(), former);
    }
  } while (watch_ != -1 && directory != ExistingDirectory(address_));
}

void Observer::Connect(std::vector<Notification>& received) {
  WatchDirectory();
  socket_.emplace(util::Socket::Address(address_), true);
  constexpr std::string_view GREETING = "observe\n";
  if (!socket_->IsOpen() || socket_->Write(GREETING.data(), GREETING.size()) != GREETING.size()) {
    socket_.reset();
    TryAgainSoon();
    return;
  }
  Add(events_.Get(), socket_->Descriptor());
  input_.clear();
  received.push_back({.event = Event::Connected});
}

void Observer::TryAgainSoon() {
  if (++attempts_ > MOST_ATTEMPTS && watch_ != -1) {
    return; // until the directory changes
  }
  itimerspec time{};
  time.it_value.tv_nsec = attempts_ == 1 ? 1 : RETRY_NANOSECONDS;
  timerfd_settime(timer_.Get(), 0, &time, nullptr);
}

void Observer::ReadAvailable(std::vector<Notification>& received) {
  const MessageReader reader;
  std::array<char, 16384> chunk;
  ssize_t count = 0;
  while ((count = recv(socket_->Descriptor(), chunk.data(), chunk.size(), MSG_DONTWAIT)) > 0) {
    input_.append(chunk.data(), static_cast<std::size_t>(count));
    std::size_t begin = 0;
    for (auto end = input_.find(DELIMITER_TEXT); end != std::string::npos;
         end = input_.find(DELIMITER_TEXT, begin)) {
      const std::string_view message = std::string_view(input_).substr(begin, end - begin);
      if (auto notification = reader.Read(*socket_, message)) {
        received.push_back(std::move(*notification));
      }
      begin = end + DELIMITER_TEXT.size();
    }
    input_.erase(0, begin);
    if (input_.size() > util::MessageProcessor::MAXIMUM_MESSAGE_LENGTH) {
      break; // connects again, to receive the state of all volumes
    }
  }
  const bool isWaiting = count == -1 && (errno == EAGAIN || errno == EINTR);
  if (!isWaiting) {
    socket_.reset(); // which also removes it from the epoll descriptor
    attempts_ = 1;
    TryAgainSoon();
  }
}

} // namespace orva::notifications

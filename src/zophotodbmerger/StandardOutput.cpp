#include "stdafx.h"

#include "StandardOutput.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>

namespace orva::dbmerger {

namespace {

/// Milliseconds that a reader may pause before it loses lines.
constexpr int STALLED_READER_TIMEOUT = 1000;

/// Bytes that are collected before they are written.
constexpr std::size_t MOST_PENDING = 64 << 10;

bool IsNullDevice(const struct stat& status) {
  constexpr unsigned memoryDevices = 1;
  constexpr unsigned null = 3;
  return S_ISCHR(status.st_mode) && status.st_rdev == makedev(memoryDevices, null);
}

bool IsStreamSocket() {
  int type = 0;
  socklen_t size = sizeof type;
  return getsockopt(STDOUT_FILENO, SOL_SOCKET, SO_TYPE, &type, &size) == 0 && type == SOCK_STREAM;
}

/// A pipe or terminal is opened again: O_NONBLOCK belongs to the open file description, which
/// standard output shares with other processes. Where that fails, writing may block.
util::FileDescriptor OpenAgain() {
  return util::FileDescriptor(
      open("/proc/self/fd/1", O_WRONLY | O_APPEND | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
}

} // namespace

StandardOutput& StandardOutput::Current() {
  static StandardOutput output;
  output.Inspect();
  return output;
}

void StandardOutput::Inspect() {
  struct stat status {};
  if (fstat(STDOUT_FILENO, &status) != 0 || IsNullDevice(status)) {
    kind_ = Kind::Null;
    pending_.clear();
    own_.Reset();
    return;
  }
  if (kind_ != Kind::Null && status.st_dev == device_ && status.st_ino == inode_) {
    if (kind_ == Kind::Stream && !own_) {
      own_ = OpenAgain(); // a FIFO may have a reader now
    }
    return;
  }
  device_ = status.st_dev;
  inode_ = status.st_ino;
  pending_.clear();                   // the rest of a line of the former output
  pending_.reserve(2 * MOST_PENDING); // once, so that the daemon does not grow
  isInLine_ = false;
  isStalled_ = false;
  own_.Reset();
  if (S_ISREG(status.st_mode)) {
    kind_ = Kind::File;
  } else if (S_ISSOCK(status.st_mode)) {
    kind_ = IsStreamSocket() ? Kind::Socket : Kind::Datagrams;
  } else {
    kind_ = Kind::Stream;
    own_ = OpenAgain();
  }
}

void StandardOutput::WriteLine(std::initializer_list<std::string_view> pieces) {
  if (IsNull()) {
    return;
  }
  std::size_t size = 1;
  for (const std::string_view piece : pieces) {
    size += piece.size();
  }
  pending_.reserve(pending_.size() + size); // a failure must not leave half a line
  for (const std::string_view piece : pieces) {
    pending_ += piece;
  }
  pending_ += '\n';
  if (pending_.size() >= MOST_PENDING || kind_ == Kind::Datagrams) {
    Flush();
  }
}

void StandardOutput::Flush() {
  std::string_view unwritten = pending_;
  while (!unwritten.empty()) {
    const ssize_t count = Send(unwritten);
    if (count > 0) {
      isInLine_ = unwritten[static_cast<std::size_t>(count) - 1] != '\n';
      isStalled_ = false;
      unwritten.remove_prefix(static_cast<std::size_t>(count));
    } else if (count == -1 && errno == EAGAIN) {
      isStalled_ = isStalled_ || !IsWritable(STALLED_READER_TIMEOUT);
      if (isStalled_) {
        break;
      }
    } else if (count == 0 || errno != EINTR) {
      break;
    }
  }
  // What could not be written is dropped, but for the rest of a line whose beginning was written.
  pending_.erase(0, pending_.size() - unwritten.size());
  pending_.resize(isInLine_ ? std::min(pending_.find('\n') + 1, pending_.size()) : 0);
}

ssize_t StandardOutput::Send(std::string_view text) const {
  if (kind_ == Kind::Socket || kind_ == Kind::Datagrams) {
    return send(STDOUT_FILENO, text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
  }
  return write(own_ ? own_.Get() : STDOUT_FILENO, text.data(), text.size());
}

bool StandardOutput::IsWritable(int timeout) const {
  pollfd ready{.fd = own_ ? own_.Get() : STDOUT_FILENO, .events = POLLOUT, .revents = 0};
  int result = 0;
  do {
    result = poll(&ready, 1, timeout);
  } while (result == -1 && errno == EINTR);
  return result == 1;
}

} // namespace orva::dbmerger

#include "stdafx.h"

#include "Util.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace orva::dbmerger {

namespace {

/// Milliseconds that a reader of standard output may pause before it loses lines.
constexpr int STALLED_READER_TIMEOUT = 1000;

/// Writes all of `text` in as few writes as the descriptor takes; a failure drops the rest.
void WriteAll(int descriptor, std::string_view text) {
  while (!text.empty()) {
    const ssize_t count = write(descriptor, text.data(), text.size());
    if (count >= 0) {
      text.remove_prefix(static_cast<std::size_t>(count));
    } else if (errno != EINTR) {
      return;
    }
  }
}

bool IsWritable(int descriptor, int timeout) {
  pollfd ready{.fd = descriptor, .events = POLLOUT, .revents = 0};
  int result = 0;
  do {
    result = poll(&ready, 1, timeout);
  } while (result == -1 && errno == EINTR);
  return result == 1;
}

/// Writes to a pipe or a terminal through a description of our own: not to wait is a property of
/// the description, and standard output's is shared with other processes. Where it cannot be had
/// the reader is waited for.
class NonBlockingOutput {
public:
  NonBlockingOutput() = default;
  NonBlockingOutput(const NonBlockingOutput&) = delete;
  NonBlockingOutput& operator=(const NonBlockingOutput&) = delete;
  ~NonBlockingOutput() {
    if (descriptor_ != -1) {
      close(descriptor_);
    }
  }

  ssize_t Write(std::string_view text) const {
    return write(descriptor_ != -1 ? descriptor_ : STDOUT_FILENO, text.data(), text.size());
  }

private:
  int descriptor_ =
      open("/proc/self/fd/1", O_WRONLY | O_APPEND | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
};

/// Writes `text` by `writeSome`, which does not wait. A reader that pauses for too long loses the
/// rest, and every line after it until it reads again.
template <typename WriteSome>
void WriteToReader(std::string_view text, WriteSome writeSome) {
  static bool stalled = false;
  while (!text.empty()) {
    const ssize_t count = writeSome(text);
    if (count >= 0) {
      text.remove_prefix(static_cast<std::size_t>(count));
      stalled = false;
    } else if (errno == EAGAIN) {
      stalled = stalled || !IsWritable(STDOUT_FILENO, STALLED_READER_TIMEOUT);
      if (stalled) {
        return;
      }
    } else if (errno != EINTR) {
      return;
    }
  }
}

/// Opens the locator file, making it when there is none; -1 when that cannot be. The directory is
/// everybody's: what stands at the name may be a trap.
int OpenLocatorFile() {
  const char* const path = ZOPHOTODBMERGER_CONFIG_FILE_NAME.c_str();
  constexpr int flags = O_WRONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
  // Where files of others are protected, one that could also be made there cannot be opened.
  const int descriptor = open(path, flags);
  return descriptor == -1 && errno == ENOENT ? open(path, flags | O_CREAT, 0666) : descriptor;
}

} // namespace

void writeLine(std::initializer_list<std::string_view> pieces) {
  static std::string line; // keeps its memory for the next one
  line.clear();
  for (const std::string_view piece : pieces) {
    line += piece;
  }
  line += '\n';

  static const mode_t kind = [] {
    struct stat status {};
    return fstat(STDOUT_FILENO, &status) == 0 ? status.st_mode : S_IFREG;
  }();
  if (S_ISREG(kind)) {
    WriteAll(STDOUT_FILENO, line);
  } else if (S_ISSOCK(kind)) {
    WriteToReader(line, [](std::string_view text) {
      return send(STDOUT_FILENO, text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    });
  } else {
    const NonBlockingOutput output;
    WriteToReader(line, [&](std::string_view text) { return output.Write(text); });
  }
}

void updateLocatorFile(const std::string& mountPoint) {
  const int descriptor = OpenLocatorFile();
  if (descriptor == -1) {
    return;
  }
  struct stat status {};
  if (fstat(descriptor, &status) == 0 && S_ISREG(status.st_mode) && status.st_nlink == 1 &&
      ftruncate(descriptor, 0) == 0) {
    std::string line = ZOPHOTOS_DB_PATH + "=";
    if (!mountPoint.empty()) {
      // A mount point that ends in "/" gives two separators in a row; the programs that read the
      // file expect them.
      line += mountPoint + "/.zophotos/zophotos.db";
    }
    WriteAll(descriptor, line + "\n");
  }
  close(descriptor);
}

} // namespace orva::dbmerger

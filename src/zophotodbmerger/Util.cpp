#include "stdafx.h"

#include "Util.h"

#include "orvautil/FileDescriptor.h"

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

/// Writes all of `text`, with one write where possible. A failure drops the rest.
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

/// Writes `text` by `writeSome`, which does not block. A reader that pauses for too long loses the
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

/// Opens the locator file and creates it when there is none. Every user may write to the directory,
/// so that anything may be at the name.
util::FileDescriptor OpenLocatorFile() {
  const char* const path = ZOPHOTODBMERGER_CONFIG_FILE_NAME.c_str();
  constexpr int flags = O_WRONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
  // First without O_CREAT, which systems may refuse for an existing file of another user
  // (fs.protected_regular).
  util::FileDescriptor file(open(path, flags));
  if (!file && errno == ENOENT) {
    file.Reset(open(path, flags | O_CREAT, 0666));
  }
  return file;
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
    // A pipe or terminal is opened again: O_NONBLOCK belongs to the open file description, which
    // standard output shares with other processes. Where that fails, writing may block.
    const util::FileDescriptor own(
        open("/proc/self/fd/1", O_WRONLY | O_APPEND | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    const int output = own ? own.Get() : STDOUT_FILENO;
    WriteToReader(line,
                  [&](std::string_view text) { return write(output, text.data(), text.size()); });
  }
}

void updateLocatorFile(const std::string& mountPoint) {
  const util::FileDescriptor file = OpenLocatorFile();
  struct stat status {};
  if (file && fstat(file.Get(), &status) == 0 && S_ISREG(status.st_mode) && status.st_nlink == 1 &&
      ftruncate(file.Get(), 0) == 0) {
    std::string line = ZOPHOTOS_DB_PATH + "=";
    if (!mountPoint.empty()) {
      // A mount point that ends in "/" gives two separators in a row. Programs that read the file
      // rely on them.
      line += mountPoint + "/.zophotos/zophotos.db";
    }
    WriteAll(file.Get(), line + "\n");
  }
}

} // namespace orva::dbmerger

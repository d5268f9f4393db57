#include "stdafx.h"

#include "Util.h"

#include "Constants.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>

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

/// Standard output as a pipe, a socket or a terminal: somebody may stop reading it.
void WriteToReader(std::string_view text) {
  static bool stalled = false;
  while (!text.empty()) {
    // As much as a writable pipe takes without waiting.
    const std::string_view piece = text.substr(0, PIPE_BUF);
    stalled = !IsWritable(STDOUT_FILENO, stalled ? 0 : STALLED_READER_TIMEOUT);
    if (stalled) {
      return;
    }
    WriteAll(STDOUT_FILENO, piece);
    text.remove_prefix(piece.size());
  }
}

} // namespace

void writeLine(std::initializer_list<std::string_view> pieces) {
  std::string line;
  for (const std::string_view piece : pieces) {
    line += piece;
  }
  line += '\n';

  struct stat status {};
  if (fstat(STDOUT_FILENO, &status) == 0 && S_ISREG(status.st_mode)) {
    WriteAll(STDOUT_FILENO, line);
  } else {
    WriteToReader(line);
  }
}

void updateLocatorFile(const std::string& mountPoint) {
  // The directory is everybody's: what stands at the name may be a trap.
  const int descriptor = open(ZOPHOTODBMERGER_CONFIG_FILE_NAME.c_str(),
                              O_WRONLY | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0666);
  if (descriptor == -1) {
    return;
  }
  struct stat status {};
  if (fstat(descriptor, &status) == 0 && S_ISREG(status.st_mode) && ftruncate(descriptor, 0) == 0) {
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

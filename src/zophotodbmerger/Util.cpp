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

/// A pipe, a socket or a terminal as standard output, whose reader may stop reading. Written
/// through a description of our own, since not to wait is a property of the description, and
/// standard output's is shared with other processes.
class ReaderOutput {
public:
  ReaderOutput() = default;
  ReaderOutput(const ReaderOutput&) = delete;
  ReaderOutput& operator=(const ReaderOutput&) = delete;
  ~ReaderOutput() { Forget(); }

  /// `status` is that of standard output, which may have become another file.
  void Write(const struct stat& status, std::string_view text) {
    if (status.st_dev != device_ || status.st_ino != inode_) {
      Forget();
      device_ = status.st_dev;
      inode_ = status.st_ino;
      isSocket_ = S_ISSOCK(status.st_mode);
      if (!isSocket_) {
        descriptor_ = open("/proc/self/fd/1", O_WRONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
      }
    }
    while (!text.empty()) {
      const ssize_t count = WriteSome(text);
      if (count >= 0) {
        text.remove_prefix(static_cast<std::size_t>(count));
        stalled_ = false;
      } else if (errno == EAGAIN && !stalled_ &&
                 IsWritable(STDOUT_FILENO, STALLED_READER_TIMEOUT)) {
        continue;
      } else if (errno != EINTR) {
        stalled_ = errno == EAGAIN;
        return;
      }
    }
  }

private:
  ssize_t WriteSome(std::string_view text) const {
    if (isSocket_) {
      return send(STDOUT_FILENO, text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    }
    return write(descriptor_ == -1 ? STDOUT_FILENO : descriptor_, text.data(), text.size());
  }

  void Forget() {
    if (descriptor_ != -1) {
      close(descriptor_);
      descriptor_ = -1;
    }
  }

  dev_t device_ = 0;
  ino_t inode_ = 0;
  bool isSocket_ = false;
  bool stalled_ = false;
  int descriptor_ = -1; ///< -1 where it cannot be opened again: then the reader is waited for
};

} // namespace

void writeLine(std::initializer_list<std::string_view> pieces) {
  std::string line;
  for (const std::string_view piece : pieces) {
    line += piece;
  }
  line += '\n';

  struct stat status {};
  if (fstat(STDOUT_FILENO, &status) != 0 || S_ISREG(status.st_mode)) {
    WriteAll(STDOUT_FILENO, line);
  } else {
    static ReaderOutput reader;
    reader.Write(status, line);
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

#include "stdafx.h"

#include "Util.h"

#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>

namespace orva::dbmerger {

namespace {

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

#include "OpenFiles.h"

#include "VolumeRoot.h"

#include "orvautil/FileDescriptor.h"
#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <csignal>

namespace orva::indexer {
namespace {

/// Opens a regular file for reading, without waiting and without a change of its access time.
util::FileDescriptor OpenRegular(const catalog::VolumeRoot& root, const std::string& path) {
  constexpr int FLAGS = O_RDONLY | O_NONBLOCK | O_CLOEXEC;
  // To open a device may have an effect: look before.
  const util::FileDescriptor entry = root.Open(path, O_PATH);
  struct stat status {};
  if (!entry || fstat(entry.Get(), &status) != 0 || !S_ISREG(status.st_mode)) {
    return {};
  }
  const std::string name = util::FormatString("/proc/self/fd/%d", entry.Get());
  util::FileDescriptor file(open(name.c_str(), FLAGS | O_NOATIME));
  if (!file && errno == EPERM) {
    file.Reset(open(name.c_str(), FLAGS));
  }
  return file;
}

} // namespace

std::optional<bool> IsOpenForWriting(const catalog::VolumeRoot& root, const std::string& path) {
  // Sent when a program opens the file for writing before the lease is returned.
  [[maybe_unused]] static const auto formerHandler = std::signal(SIGIO, SIG_IGN);
  const util::FileDescriptor file = OpenRegular(root, path);
  if (!file) {
    return std::nullopt;
  }
  // The system grants a lease for reading only if nobody has the file open for writing.
  if (fcntl(file.Get(), F_SETLEASE, F_RDLCK) == 0) {
    fcntl(file.Get(), F_SETLEASE, F_UNLCK);
    return false;
  }
  return errno == EAGAIN ? std::optional(true) : std::nullopt;
}

} // namespace orva::indexer

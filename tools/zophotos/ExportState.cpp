#include "ExportState.h"

#include "Failure.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <utility>

namespace orva::zophotos {

namespace {

constexpr const char* LOCK = ".lock";
constexpr const char* NEW = ".new";

/// The largest size of STATE: a block of a disk, or more for more photos.
constexpr std::uint64_t BYTES_PER_PHOTO = 40;
constexpr std::uint64_t SMALLEST_LIMIT = 4096;

} // namespace

ExportState::ExportState(const std::string& path)
    : path_(path), name_(std::filesystem::path(path).filename()) {
  const std::string directory = std::filesystem::path(path).parent_path();
  directory_.Reset(
      open(directory.empty() ? "." : directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory_) {
    ThrowError("cannot open the directory of", "");
  }
  if (name_.empty()) {
    throw Failure(ExitStatus::Failed, path_ + " is a directory");
  }
  OpenFile("", O_RDONLY); // creates no lock next to what cannot be a state
  lock_ = OpenFile(LOCK, O_RDWR | O_CREAT);
  if (flock(lock_.Get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno == EWOULDBLOCK) {
      throw Failure(ExitStatus::Locked, "another export uses " + path_ + "; try again");
    }
    ThrowError("cannot lock", LOCK);
  }
}

void ExportState::Synchronise() const {
  // Some file systems cannot synchronise a directory and do not need to.
  if (fsync(directory_.Get()) != 0 && errno != EINVAL) {
    ThrowError("cannot write the directory of", "");
  }
}

void ExportState::Deliver(const PhotoListReader& pending) const {
  if (pending.Size() <= std::max(SMALLEST_LIMIT, pending.Photos() * BYTES_PER_PHOTO)) {
    Rename(NEXT);
    return;
  }
  Feed feed = pending.Header();
  feed.hasPhotos = false;
  Write(NEW, feed).Finish();
  Rename(NEW);
  Remove(NEXT);
}

util::FileDescriptor ExportState::OpenFile(const std::string& suffix, int flags) const {
  // Opening a FIFO would block.
  constexpr int always = O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
  util::FileDescriptor file(
      openat(directory_.Get(), (name_ + suffix).c_str(), flags | always, S_IRUSR | S_IWUSR));
  if (!file) {
    if (errno == ENOENT) {
      return file;
    }
    ThrowError("cannot open", suffix);
  }
  struct stat status {};
  if (fstat(file.Get(), &status) != 0) {
    ThrowError("cannot open", suffix);
  }
  if (!S_ISREG(status.st_mode)) {
    throw Failure(ExitStatus::Failed, path_ + suffix + " is not a regular file");
  }
  return file;
}

std::optional<PhotoListReader> ExportState::Open(const std::string& suffix) const {
  util::FileDescriptor file = OpenFile(suffix, O_RDONLY);
  if (!file) {
    return std::nullopt;
  }
  return PhotoListReader::Open(std::move(file), path_ + suffix);
}

PhotoListWriter ExportState::Write(const std::string& suffix, const Feed& feed) const {
  // A new file has the right owner and mode, and no other name.
  Remove(suffix);
  return {OpenFile(suffix, O_WRONLY | O_CREAT | O_EXCL), path_ + suffix, feed};
}

void ExportState::Rename(const std::string& suffix) const {
  if (renameat(directory_.Get(), (name_ + suffix).c_str(), directory_.Get(), name_.c_str()) != 0) {
    ThrowError("cannot replace", "");
  }
  Synchronise();
}

void ExportState::Remove(const std::string& suffix) const noexcept {
  unlinkat(directory_.Get(), (name_ + suffix).c_str(), 0);
}

void ExportState::ThrowError(const std::string& what, const std::string& suffix) const {
  const int error = errno;
  throw Failure(ExitStatus::Failed,
                what + " " + path_ + suffix + ": " +
                    (error == ELOOP ? "it is a symbolic link" : std::strerror(error)));
}

} // namespace orva::zophotos

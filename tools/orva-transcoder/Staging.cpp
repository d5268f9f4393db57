#include "Staging.h"

#include "Sandbox.h"

#include "orvautil/Exception.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>
#include <vector>

namespace orva::transcoder {
namespace {

[[noreturn]] void ThrowError(const std::string& path) {
  throw util::Exception(path + ": " + std::generic_category().message(errno));
}

/// Lets only this process write the folder, and only the sandbox read it.
void RestrictFolder(const std::string& path) {
  if (chmod(path.c_str(), 0750) != 0) {
    ThrowError(path);
  }
  // Fails where that user does not exist: the sandbox then runs as this process's user.
  static_cast<void>(chown(path.c_str(), static_cast<uid_t>(-1), SANDBOX_USER) == 0);
}

void MakeFolder(const std::string& path) {
  if (mkdir(path.c_str(), 0700) != 0) {
    ThrowError(path);
  }
  RestrictFolder(path);
}

util::FileDescriptor MakeFile(const std::string& path, uid_t owner, gid_t group, mode_t mode) {
  util::FileDescriptor file(
      open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  if (!file) {
    ThrowError(path);
  }
  static_cast<void>(fchown(file.Get(), owner, group) == 0);
  if (fchmod(file.Get(), mode) != 0) {
    ThrowError(path);
  }
  return file;
}

util::FileDescriptor MakeOutput(const std::string& path) {
  return MakeFile(path, SANDBOX_USER, SANDBOX_USER, 0600);
}

std::string FileIn(const std::string& folder, std::size_t number) {
  return folder + '/' + std::to_string(number);
}

void RemoveAll(const std::string& path) {
  std::error_code ignored;
  std::filesystem::remove_all(path, ignored);
}

} // namespace

StagingFolder::StagingFolder(std::string path) : path_(std::move(path)) {
  try {
    MakeFolder(path_);
    MakeFolder(Input());
    MakeFolder(Output());
  } catch (...) {
    RemoveAll(path_);
    throw;
  }
}

StagingFolder::StagingFolder(StagingFolder&& other) noexcept
    : path_(std::exchange(other.path_, {})) {}

StagingFolder::~StagingFolder() {
  if (!path_.empty()) {
    RemoveAll(path_);
  }
}

util::FileDescriptor StagingFolder::Add(std::size_t number) const {
  MakeOutput(FileIn(Output(), number) + ".jpg");
  return MakeFile(FileIn(Input(), number), static_cast<uid_t>(-1), SANDBOX_USER, 0440);
}

void StagingFolder::Remove(std::size_t number) const {
  unlink((FileIn(Output(), number) + ".jpg").c_str());
  unlink(FileIn(Input(), number).c_str());
}

bool StagingFolder::InputContains(std::size_t number, std::string_view text) const {
  const util::FileDescriptor file(
      open(FileIn(Input(), number).c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
  std::vector<char> chunk(std::size_t{256} * 1024);
  std::size_t kept = 0; // the end of the last chunk: the text may begin there
  ssize_t count = 0;
  while ((count = read(file.Get(), chunk.data() + kept, chunk.size() - kept)) > 0) {
    const std::string_view content(chunk.data(), kept + static_cast<std::size_t>(count));
    if (content.find(text) != std::string_view::npos) {
      return true;
    }
    kept = std::min(content.size(), text.size() - 1);
    std::memmove(chunk.data(), content.data() + content.size() - kept, kept);
  }
  return count != 0;
}

util::FileDescriptor StagingFolder::OpenOutput(std::size_t number) const {
  util::FileDescriptor file(open((FileIn(Output(), number) + ".jpg").c_str(),
                                 O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  struct stat status {};
  if (file && (fstat(file.Get(), &status) != 0 || !S_ISREG(status.st_mode))) {
    file.Reset();
  }
  return file;
}

void StagingFolder::UseOutputAsInput(std::size_t number) const {
  const std::string output = FileIn(Output(), number) + ".jpg";
  const std::string input = FileIn(Input(), number);
  if (rename(output.c_str(), input.c_str()) != 0 || chmod(input.c_str(), 0440) != 0) {
    ThrowError(output);
  }
  MakeOutput(output);
}

void PrepareStaging(const std::string& path) {
  RemoveAll(path); // of a mount point, only what is in it
  if (mkdir(path.c_str(), 0700) != 0 && errno != EEXIST) {
    ThrowError(path);
  }
  RestrictFolder(path);
}

StagingSpace SpaceFor(const std::string& path) {
  struct statvfs fileSystem {};
  if (statvfs(path.c_str(), &fileSystem) != 0) {
    ThrowError(path);
  }
  const auto bytes = [&](fsblkcnt_t blocks) {
    return static_cast<long long>(blocks) * static_cast<long long>(fileSystem.f_frsize);
  };
  const long long reserve = bytes(fileSystem.f_blocks) / 4;
  return {.now = std::max(bytes(fileSystem.f_bavail) - reserve, 0LL),
          .most = bytes(fileSystem.f_blocks) - reserve};
}

} // namespace orva::transcoder

#pragma once

#include <unistd.h>

#include <utility>

namespace orva::util {

/// Owns a file descriptor and closes it; -1 stands for none. Not shared between threads.
class FileDescriptor {
public:
  FileDescriptor() noexcept = default;
  /// Takes over `descriptor`.
  explicit FileDescriptor(int descriptor) noexcept : descriptor_(descriptor) {}
  FileDescriptor(FileDescriptor&& other) noexcept : descriptor_(other.Release()) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    Reset(other.Release());
    return *this;
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  ~FileDescriptor() { Reset(); }

  explicit operator bool() const noexcept { return descriptor_ != -1; }
  /// The descriptor, still owned by this object.
  int Get() const noexcept { return descriptor_; }

  /// Hands the descriptor over to the caller.
  [[nodiscard]] int Release() noexcept { return std::exchange(descriptor_, -1); }

  /// Closes the descriptor and takes over another one.
  void Reset(int descriptor = -1) noexcept {
    const int former = std::exchange(descriptor_, descriptor);
    if (former != -1) {
      close(former);
    }
  }

private:
  int descriptor_ = -1;
};

} // namespace orva::util

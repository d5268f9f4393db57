#pragma once

#include <unistd.h>

#include <utility>

namespace orva::notify {

/// Owns a file descriptor; -1 is none.
class OwnedDescriptor {
public:
  explicit OwnedDescriptor(int descriptor) noexcept : descriptor_(descriptor) {}
  OwnedDescriptor(OwnedDescriptor&& other) noexcept : descriptor_(other.Release()) {}
  OwnedDescriptor(const OwnedDescriptor&) = delete;
  OwnedDescriptor& operator=(const OwnedDescriptor&) = delete;
  OwnedDescriptor& operator=(OwnedDescriptor&&) = delete;
  ~OwnedDescriptor() {
    if (descriptor_ != -1) {
      close(descriptor_);
    }
  }

  explicit operator bool() const noexcept { return descriptor_ != -1; }
  int Get() const noexcept { return descriptor_; }

  /// Hands the ownership to the caller.
  int Release() noexcept { return std::exchange(descriptor_, -1); }

private:
  int descriptor_;
};

} // namespace orva::notify

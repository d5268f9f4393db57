#pragma once

#include "orvautil/FileDescriptor.h"
#include "orvautil/Stream.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <string>

namespace orva::util {

/// A local (AF_UNIX) stream socket. Interrupted system calls are retried.
class Socket : public Stream {
public:
  /// Address of a local socket.
  class Address {
  public:
    /// `text` is an absolute path, or '@' and a name for an abstract address. Throws Exception
    /// when it is neither, or too long for the system.
    explicit Address(const std::string& text);

    const sockaddr* Get() const noexcept;
    socklen_t Length() const noexcept { return length_; }

  private:
    sockaddr_un address_{};
    socklen_t length_ = 0;
  };

  /// True exactly when the descriptor is not -1.
  bool IsOpen() const override { return static_cast<bool>(descriptor_); }
  void Close() override;
  /// Does nothing: Write does not buffer.
  void Flush() override {}
  bool IsDataAvailable(unsigned long long* count) override;
  unsigned Read(void* data, unsigned size) override;
  /// Never raises SIGPIPE.
  unsigned Write(const void* data, unsigned size) override;

  /// -1 while not connected. Still owned by the socket.
  int Descriptor() const noexcept { return descriptor_.Get(); }

protected:
  /// Takes over `descriptor`, -1 for none.
  explicit Socket(int descriptor) noexcept : descriptor_(descriptor) {}

private:
  FileDescriptor descriptor_;
};

} // namespace orva::util

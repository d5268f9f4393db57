#include "orva-notify/ListeningSocket.h"

#include "orvautil/ClientSocket.h"
#include "orvautil/Exception.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>
#include <utility>

namespace orva::notify {
namespace {

bool IsPath(const std::string& address) {
  return address.starts_with("/");
}

bool IsSocket(const std::string& path) {
  struct stat status {};
  return lstat(path.c_str(), &status) == 0 && S_ISSOCK(status.st_mode);
}

void MakeDirectory(const std::filesystem::path& directory) {
  std::error_code error;
  std::filesystem::create_directories(directory, error);
  if (error) {
    throw util::Exception("cannot create " + directory.native() + ": " + error.message());
  }
}

// The socket of a service that was killed refuses connections.
void RemoveStaleSocket(const std::string& path) {
  const util::ClientSocket probe(util::Socket::Address(path), true);
  if (!probe.IsOpen() && errno == ECONNREFUSED && IsSocket(path)) {
    unlink(path.c_str());
  }
}

/// Why `address` cannot be bound, and what to do.
std::string Explain(const std::string& address, int error) {
  if (error != EADDRINUSE) {
    return strerror(error);
  }
  if (IsPath(address) && !IsSocket(address)) {
    return "there is a file that is not a socket; remove it";
  }
  return "another service listens there; end it first (the installed one: systemctl stop "
         "orva-notify)";
}

} // namespace

ListeningSocket::ListeningSocket(std::string address)
    : Socket(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)),
      address_(std::move(address)) {
  if (IsPath(address_)) {
    MakeDirectory(std::filesystem::path(address_).parent_path());
    RemoveStaleSocket(address_);
  }
  Bind();
}

ListeningSocket::~ListeningSocket() {
  if (isBound_ && IsPath(address_)) {
    unlink(address_.c_str());
  }
}

void ListeningSocket::Bind() {
  const Address address(address_);
  isBound_ = bind(Descriptor(), address.Get(), address.Length()) == 0;
  if (!isBound_ || listen(Descriptor(), SOMAXCONN) != 0) {
    const std::string reason = Explain(address_, errno);
    throw util::Exception("cannot listen on " + address_ + ": " + reason);
  }
}

util::FileDescriptor ListeningSocket::Accept() {
  int descriptor = -1;
  do {
    descriptor = accept4(Descriptor(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
  } while (descriptor == -1 && (errno == EINTR || errno == ECONNABORTED));
  return util::FileDescriptor(descriptor);
}

} // namespace orva::notify

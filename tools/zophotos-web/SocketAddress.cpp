#include "SocketAddress.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/un.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <system_error>

namespace orva::web {
namespace {

std::optional<std::uint16_t> ParsePort(std::string_view text) {
  std::uint16_t port = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), port);
  return error == std::errc() && end == text.data() + text.size() ? std::optional(port)
                                                                  : std::nullopt;
}

/// The bytes of `address`, which is in `storage`.
template <typename Address>
Address Get(const sockaddr_storage& storage) {
  Address address{};
  std::memcpy(&address, &storage, sizeof address);
  return address;
}

bool IsMapped(const in6_addr& address) {
  return IN6_IS_ADDR_V4MAPPED(&address) != 0;
}

bool IsLoopbackAddress(const in6_addr& address) {
  constexpr std::uint8_t LOOPBACK_NET = 127;
  return IsMapped(address) ? address.s6_addr[12] == LOOPBACK_NET
                           : IN6_IS_ADDR_LOOPBACK(&address) != 0;
}

std::string AddressText(int family, const void* address) {
  std::array<char, INET6_ADDRSTRLEN> text{};
  return inet_ntop(family, address, text.data(), text.size()) == nullptr ? "" : text.data();
}

[[noreturn]] void ThrowError(const std::string& what) {
  throw std::system_error(errno, std::generic_category(), what);
}

} // namespace

std::optional<SocketAddress> SocketAddress::Parse(const std::string& text) {
  const std::size_t colon = text.rfind(':');
  if (colon == std::string::npos) {
    return std::nullopt;
  }
  const auto port = ParsePort(std::string_view(text).substr(colon + 1));
  std::string host = text.substr(0, colon);
  if (host == "localhost") {
    host = "127.0.0.1";
  }
  SocketAddress result;
  sockaddr_in ipv4{};
  sockaddr_in6 ipv6{};
  if (port && inet_pton(AF_INET, host.c_str(), &ipv4.sin_addr) == 1) {
    ipv4.sin_family = AF_INET;
    ipv4.sin_port = htons(*port);
    std::memcpy(&result.address_, &ipv4, sizeof ipv4);
    result.size_ = sizeof ipv4;
    return result;
  }
  if (port && host.size() > 2 && host.front() == '[' && host.back() == ']' &&
      inet_pton(AF_INET6, host.substr(1, host.size() - 2).c_str(), &ipv6.sin6_addr) == 1) {
    ipv6.sin6_family = AF_INET6;
    ipv6.sin6_port = htons(*port);
    std::memcpy(&result.address_, &ipv6, sizeof ipv6);
    result.size_ = sizeof ipv6;
    return result;
  }
  return std::nullopt;
}

std::optional<SocketAddress> SocketAddress::Of(int socket) {
  SocketAddress result;
  result.size_ = sizeof result.address_;
  if (getsockname(socket, reinterpret_cast<sockaddr*>(&result.address_), &result.size_) != 0) {
    return std::nullopt;
  }
  const sa_family_t family = result.address_.ss_family;
  return family == AF_INET || family == AF_INET6 || family == AF_UNIX ? std::optional(result)
                                                                      : std::nullopt;
}

bool SocketAddress::IsLoopback() const {
  if (address_.ss_family == AF_INET) {
    return ntohl(Get<sockaddr_in>(address_).sin_addr.s_addr) >> 24 == IN_LOOPBACKNET;
  }
  return address_.ss_family == AF_UNIX || IsLoopbackAddress(Get<sockaddr_in6>(address_).sin6_addr);
}

std::string SocketAddress::Host() const {
  if (address_.ss_family == AF_INET) {
    const auto ipv4 = Get<sockaddr_in>(address_);
    return AddressText(AF_INET, &ipv4.sin_addr);
  }
  if (address_.ss_family != AF_INET6) {
    return {};
  }
  const auto ipv6 = Get<sockaddr_in6>(address_);
  return IsMapped(ipv6.sin6_addr) ? AddressText(AF_INET, &ipv6.sin6_addr.s6_addr[12])
                                  : AddressText(AF_INET6, &ipv6.sin6_addr);
}

std::string SocketAddress::Url() const {
  if (address_.ss_family == AF_UNIX) {
    return "a socket file";
  }
  // The port is at the same place in both.
  const std::string port = std::to_string(ntohs(Get<sockaddr_in>(address_).sin_port));
  const std::string host = Host();
  const bool isLong = host.find(':') != std::string::npos;
  return "http://" + (isLong ? '[' + host + ']' : host) + ':' + port + '/';
}

util::FileDescriptor SocketAddress::Listen() const {
  util::FileDescriptor listener(
      socket(address_.ss_family, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  const int on = 1;
  if (!listener || setsockopt(listener.Get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof on) != 0 ||
      bind(listener.Get(), reinterpret_cast<const sockaddr*>(&address_), size_) != 0 ||
      listen(listener.Get(), SOMAXCONN) != 0) {
    ThrowError("cannot listen on " + Url());
  }
  return listener;
}

} // namespace orva::web

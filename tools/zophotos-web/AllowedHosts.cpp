#include "AllowedHosts.h"

#include "SocketAddress.h"

#include <algorithm>
#include <cstddef>

namespace orva::web {
namespace {

bool IsDigit(char c) {
  return c >= '0' && c <= '9';
}

bool IsHostCharacter(char c) {
  return IsDigit(c) || (c >= 'a' && c <= 'z') || c == '.' || c == '-' || c == '_';
}

bool IsAddressCharacter(char c) {
  return IsDigit(c) || (c >= 'a' && c <= 'f') || c == ':' || c == '.';
}

bool IsPort(std::string_view text) {
  return text.empty() || (text.starts_with(':') && text.size() <= 6 &&
                          std::ranges::all_of(text.substr(1), IsDigit));
}

std::string LowerCase(std::string_view text) {
  std::string lower(text);
  std::ranges::transform(lower, lower.begin(), [](char c) {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  });
  return lower;
}

} // namespace

std::string HostName(std::string_view header) {
  const std::string text = LowerCase(header);
  const bool isBracketed = text.starts_with('[');
  const std::size_t end = isBracketed ? text.find(']') : std::min(text.find(':'), text.size());
  if (end == std::string::npos ||
      !IsPort(std::string_view(text).substr(end + (isBracketed ? 1 : 0)))) {
    return {};
  }
  const std::string name = isBracketed ? text.substr(1, end - 1) : text.substr(0, end);
  return std::ranges::all_of(name, isBracketed ? IsAddressCharacter : IsHostCharacter) ? name : "";
}

AllowedHosts::AllowedHosts(const std::vector<std::string>& names)
    : names_{"localhost", "127.0.0.1", "::1"} {
  for (const std::string& name : names) {
    const bool isPlainAddress = std::ranges::count(name, ':') > 1 && !name.starts_with('[');
    names_.insert(isPlainAddress ? LowerCase(name) : HostName(name));
  }
  names_.erase("");
}

bool AllowedHosts::Contains(std::string_view header) const {
  return names_.contains(HostName(header));
}

bool AllowedHosts::IsLocalAddress(std::string_view header, int socket) {
  const std::string name = HostName(header);
  const auto address = SocketAddress::Of(socket);
  return !name.empty() && address && address->Host() == name;
}

} // namespace orva::web

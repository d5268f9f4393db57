#include "Request.h"

#include "orvautil/FormatString.h"

#include <algorithm>
#include <charconv>
#include <cstddef>
#include <limits>
#include <system_error>

namespace orva::web {
namespace {

constexpr std::size_t MOST_PARAMETERS = 16;

int HexDigit(char c) {
  if (c >= '0' && c <= '9') {
    return c - '0';
  }
  if (c >= 'a' && c <= 'f') {
    return c - 'a' + 10;
  }
  return c >= 'A' && c <= 'F' ? c - 'A' + 10 : -1;
}

/// Decodes a name or value of the query, as forms encode it.
std::optional<std::string> DecodeFormText(std::string_view text) {
  std::string bytes;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '+') {
      bytes += ' ';
    } else if (text[i] != '%') {
      bytes += text[i];
    } else {
      const int high = i + 2 < text.size() ? HexDigit(text[i + 1]) : -1;
      const int low = i + 2 < text.size() ? HexDigit(text[i + 2]) : -1;
      if (high < 0 || low < 0) {
        return std::nullopt;
      }
      bytes += static_cast<char>(high * 16 + low);
      i += 2;
    }
  }
  return bytes;
}

/// Removes the text up to `separator` from `text`, and the separator, and returns it.
std::string_view TakeUpTo(std::string_view& text, char separator) {
  const std::size_t end = std::min(text.find(separator), text.size());
  const std::string_view part = text.substr(0, end);
  text.remove_prefix(std::min(end + 1, text.size()));
  return part;
}

bool AddParameter(Target& target, std::string_view text) {
  std::string_view rest = text;
  const auto name = DecodeFormText(TakeUpTo(rest, '='));
  const auto value = DecodeFormText(rest);
  if (!name || !value || target.Find(*name) != nullptr ||
      target.parameters.size() == MOST_PARAMETERS) {
    return false;
  }
  target.parameters.emplace_back(*name, *value);
  return true;
}

std::optional<std::uint64_t> ParsePosition(std::string_view text) {
  std::uint64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  return error == std::errc() && end == text.data() + text.size() ? std::optional(number)
                                                                  : std::nullopt;
}

std::string_view TrimBlanks(std::string_view text) {
  const std::size_t first = std::min(text.find_first_not_of(" \t"), text.size());
  text.remove_prefix(first);
  return text.substr(0, text.find_last_not_of(" \t") + 1);
}

} // namespace

const std::string* Target::Find(std::string_view name) const {
  const auto found =
      std::ranges::find(parameters, name, [](const auto& parameter) { return parameter.first; });
  return found == parameters.end() ? nullptr : &found->second;
}

std::optional<Target> ParseTarget(std::string_view text) {
  const auto isGraphic = [](char c) { return c > ' ' && c <= '~'; };
  if (!text.starts_with('/') || !std::ranges::all_of(text, isGraphic)) {
    return std::nullopt;
  }
  Target target;
  target.path = TakeUpTo(text, '?');
  while (!text.empty()) {
    const std::string_view parameter = TakeUpTo(text, '&');
    if (!parameter.empty() && !AddParameter(target, parameter)) {
      return std::nullopt;
    }
  }
  return target;
}

std::string PercentEncoded(std::string_view text) {
  constexpr std::string_view PLAIN = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz"
                                     "0123456789-._~";
  std::string encoded;
  for (const char c : text) {
    if (PLAIN.find(c) != std::string_view::npos) {
      encoded += c;
    } else {
      encoded += util::FormatString("%%%02X", static_cast<unsigned char>(c));
    }
  }
  return encoded;
}

std::optional<std::int64_t> ParseNumber(std::string_view text) {
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || std::to_string(number) != text) {
    return std::nullopt;
  }
  return number;
}

std::optional<ByteRange> ParseRange(std::string_view text, std::uint64_t size) {
  constexpr std::string_view UNIT = "bytes=";
  if (!text.starts_with(UNIT)) {
    return std::nullopt;
  }
  std::string_view rest = text.substr(UNIT.size());
  const std::size_t dash = rest.find('-');
  if (dash == std::string_view::npos) {
    return std::nullopt;
  }
  const std::string_view begin = rest.substr(0, dash);
  const auto first = ParsePosition(begin);
  const auto last = ParsePosition(rest.substr(dash + 1));
  if (begin.empty()) {
    if (!last) {
      return std::nullopt;
    }
    const std::uint64_t count = std::min(*last, size); // the last bytes
    return ByteRange{.first = size - count, .count = count};
  }
  const bool isOpen = dash + 1 == rest.size();
  if (!first || (!last && !isOpen) || (last && *last < *first)) {
    return std::nullopt;
  }
  if (*first >= size) {
    return ByteRange{};
  }
  const std::uint64_t end = isOpen ? size - 1 : std::min(*last, size - 1);
  return ByteRange{.first = *first, .count = end - *first + 1};
}

bool Matches(std::string_view text, std::string_view tag) {
  while (!text.empty()) {
    std::string_view other = TrimBlanks(TakeUpTo(text, ','));
    if (other.starts_with("W/")) {
      other.remove_prefix(2);
    }
    if (other == tag || other == "*") {
      return true;
    }
  }
  return false;
}

} // namespace orva::web

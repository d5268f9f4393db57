#include "Text.h"

#include <boost/locale/utf.hpp>

#include <sys/ioctl.h>
#include <unicode/uchar.h>
#include <unistd.h>

#include <array>
#include <clocale>
#include <cstdio>
#include <ctime>
#include <cwchar>
#include <cwctype>
#include <iterator>

namespace orva::zophotos {

namespace {

namespace utf = boost::locale::utf;

/// Calls `onCharacter` with each code point and its bytes, and `onByte` with each byte that is part
/// of none.
template <typename OnCharacter, typename OnByte>
void ForEachCharacter(std::string_view bytes, const OnCharacter& onCharacter,
                      const OnByte& onByte) {
  for (const char* next = bytes.begin(); next != bytes.end();) {
    const char* const begin = next;
    const utf::code_point point = utf::utf_traits<char>::decode(next, bytes.end());
    if (utf::is_valid_codepoint(point)) {
      onCharacter(point, {begin, next});
    } else {
      onByte(*begin);
      next = std::next(begin);
    }
  }
}

std::size_t CharacterWidth(utf::code_point point) {
  UseUtf8();
  const int width = wcwidth(static_cast<wchar_t>(point));
  return width < 0 ? 0 : static_cast<std::size_t>(width);
}

/// The last characters that fit into `width` columns.
std::string_view Tail(std::string_view printable, std::size_t width) {
  std::size_t excess = Width(printable);
  std::size_t begin = 0;
  ForEachCharacter(
      printable,
      [&](utf::code_point point, std::string_view bytes) {
        if (excess > width) {
          excess -= CharacterWidth(point);
          begin += bytes.size();
        }
      },
      [](char) {});
  return printable.substr(begin);
}

/// Characters that cannot be seen, some of which have what is around them shown otherwise than it
/// is written: those that Unicode calls default ignorable, without the joiners and variation
/// selectors that scripts and emojis need.
bool IsInvisible(utf::code_point point) {
  const auto has = [point](UProperty property) {
    return u_hasBinaryProperty(static_cast<UChar32>(point), property) != 0;
  };
  return has(UCHAR_DEFAULT_IGNORABLE_CODE_POINT) && !has(UCHAR_JOIN_CONTROL) &&
         !has(UCHAR_VARIATION_SELECTOR);
}

bool IsInCalendar(std::int64_t seconds) {
  constexpr std::int64_t beginOfYear1 = -62'135'596'800;
  constexpr std::int64_t endOfYear9999 = 253'402'300'800;
  return seconds >= beginOfYear1 && seconds < endOfYear9999;
}

std::string Format(const char* format, const std::tm& time) {
  std::array<char, 64> text{};
  return {text.data(), std::strftime(text.data(), text.size(), format, &time)};
}

} // namespace

void UseUtf8() {
  static const char* const locale = std::setlocale(LC_CTYPE, "C.UTF-8");
  static_cast<void>(locale);
}

std::string ToUtf8(std::string_view bytes) {
  constexpr const char* replacement = "\uFFFD";
  std::string text;
  ForEachCharacter(
      bytes,
      [&](utf::code_point point, std::string_view character) {
        text += point == 0 ? replacement : character;
      },
      [&](char) { text += replacement; });
  return text;
}

std::string Printable(std::string_view bytes) {
  UseUtf8();
  std::string text;
  const auto escape = [&text](char byte) {
    std::array<char, 5> code{};
    std::snprintf(code.data(), code.size(), "\\x%02x", static_cast<unsigned char>(byte));
    text += code.data();
  };
  ForEachCharacter(
      bytes,
      [&](utf::code_point point, std::string_view character) {
        if (point == '\\') {
          text += "\\\\";
        } else if (std::iswprint(static_cast<std::wint_t>(point)) != 0 && !IsInvisible(point)) {
          text += character;
        } else {
          for (const char byte : character) {
            escape(byte);
          }
        }
      },
      escape);
  return text;
}

std::size_t Width(std::string_view printable) {
  std::size_t columns = 0;
  ForEachCharacter(
      printable, [&](utf::code_point point, std::string_view) { columns += CharacterWidth(point); },
      [](char) {});
  return columns;
}

std::string_view Head(std::string_view printable, std::size_t width) {
  std::size_t columns = 0;
  std::size_t length = 0;
  bool full = false;
  ForEachCharacter(
      printable,
      [&](utf::code_point point, std::string_view bytes) {
        columns += CharacterWidth(point);
        full = full || columns > width;
        length += full ? 0 : bytes.size();
      },
      [](char) {});
  return printable.substr(0, length);
}

std::string Shorten(const std::string& printable, std::size_t width) {
  if (Width(printable) <= width) {
    return printable;
  }
  if (width == 0) {
    return {};
  }
  const std::size_t head = (width - 1) / 2;
  return std::string(Head(printable, head)) + "…" + std::string(Tail(printable, width - 1 - head));
}

std::optional<std::size_t> TerminalWidth() {
  winsize size{};
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_col == 0) {
    return std::nullopt;
  }
  return size.ws_col;
}

std::string LocalTime(std::int64_t seconds) {
  const std::time_t time = seconds;
  std::tm fields{};
  return IsInCalendar(seconds) && localtime_r(&time, &fields) != nullptr
             ? Format("%Y-%m-%d %H:%M:%S", fields)
             : std::to_string(seconds);
}

std::optional<std::string> IsoTime(std::int64_t seconds) {
  const std::time_t time = seconds;
  std::tm fields{};
  if (!IsInCalendar(seconds) || gmtime_r(&time, &fields) == nullptr) {
    return std::nullopt;
  }
  // strftime's %Y has no leading zeros.
  std::array<char, 12> year{};
  std::snprintf(year.data(), year.size(), "%04d", fields.tm_year + 1900);
  return year.data() + Format("-%m-%dT%H:%M:%SZ", fields);
}

std::string Count(std::int64_t number, const std::string& noun) {
  return std::to_string(number) + " " + noun + (number == 1 ? "" : "s");
}

} // namespace orva::zophotos

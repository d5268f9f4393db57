#include "Text.h"

#include <boost/locale/utf.hpp>

#include <sys/ioctl.h>
#include <unicode/uchar.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <clocale>
#include <cstdio>
#include <ctime>
#include <cwchar>
#include <cwctype>
#include <iterator>

namespace orva::zophotos {

namespace {

namespace utf = boost::locale::utf;

/// A code point and its bytes, or a single byte that is not UTF-8.
struct Character {
  utf::code_point point; ///< utf::illegal for such a byte
  std::string_view bytes;
};

/// Removes the first character from `text`, which is not empty.
Character TakeCharacter(std::string_view& text) {
  const char* next = text.begin();
  utf::code_point point = utf::utf_traits<char>::decode(next, text.end());
  if (!utf::is_valid_codepoint(point)) {
    point = utf::illegal;
    next = std::next(text.begin());
  }
  const std::string_view bytes(text.begin(), next);
  text.remove_prefix(bytes.size());
  return {.point = point, .bytes = bytes};
}

std::size_t CharacterWidth(utf::code_point point) {
  UseUtf8();
  const int width = wcwidth(static_cast<wchar_t>(point));
  return width < 0 ? 0 : static_cast<std::size_t>(width);
}

/// The last characters that fit into `width` columns.
std::string_view Tail(std::string_view printable, std::size_t width) {
  for (std::size_t columns = Width(printable); columns > width;) {
    columns -= CharacterWidth(TakeCharacter(printable).point);
  }
  return printable;
}

/// Whether a character is printable and visible. Characters that Unicode calls default ignorable
/// are invisible, and some change how the characters around them are shown. Scripts and emojis
/// need the joiners and variation selectors among them.
bool IsVisible(utf::code_point point) {
  const auto has = [point](UProperty property) {
    return u_hasBinaryProperty(static_cast<UChar32>(point), property) != 0;
  };
  return std::iswprint(static_cast<std::wint_t>(point)) != 0 &&
         (!has(UCHAR_DEFAULT_IGNORABLE_CODE_POINT) || has(UCHAR_JOIN_CONTROL) ||
          has(UCHAR_VARIATION_SELECTOR));
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
  while (!bytes.empty()) {
    const Character character = TakeCharacter(bytes);
    const bool isText = character.point != 0 && character.point != utf::illegal;
    text += isText ? character.bytes : replacement;
  }
  return text;
}

std::string Printable(std::string_view bytes) {
  UseUtf8();
  std::string text;
  while (!bytes.empty()) {
    const Character character = TakeCharacter(bytes);
    if (character.point == '\\') {
      text += "\\\\";
    } else if (IsVisible(character.point)) {
      text += character.bytes;
    } else {
      for (const char byte : character.bytes) {
        std::array<char, 5> code{};
        std::snprintf(code.data(), code.size(), "\\x%02x", static_cast<unsigned char>(byte));
        text += code.data();
      }
    }
  }
  return text;
}

std::string Unescape(std::string_view text) {
  std::string bytes;
  while (!text.empty()) {
    unsigned char code = 0;
    if (text.starts_with("\\\\")) {
      text.remove_prefix(1);
    } else if (text.starts_with("\\x") && text.size() >= 4) {
      const char* const end = text.data() + 4;
      if (std::from_chars(text.data() + 2, end, code, 16).ptr == end) {
        bytes += static_cast<char>(code);
        text.remove_prefix(4);
        continue;
      }
    }
    bytes += text.front();
    text.remove_prefix(1);
  }
  return bytes;
}

std::string FolderColor(const std::string& printable, bool colors) {
  return colors ? "\x1b[1;34m" + printable + "\x1b[0m" : printable;
}

std::size_t Width(std::string_view printable) {
  std::size_t columns = 0;
  while (!printable.empty()) {
    columns += CharacterWidth(TakeCharacter(printable).point);
  }
  return columns;
}

std::string_view Head(std::string_view printable, std::size_t width) {
  std::size_t columns = 0;
  std::size_t length = 0;
  for (std::string_view rest = printable; !rest.empty();) {
    const Character character = TakeCharacter(rest);
    columns += CharacterWidth(character.point);
    if (columns > width) {
      break;
    }
    length += character.bytes.size();
  }
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

std::optional<std::size_t> TerminalHeight() {
  winsize size{};
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_row == 0) {
    return std::nullopt;
  }
  return size.ws_row;
}

bool IsTerminal() {
  return isatty(STDOUT_FILENO) != 0;
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
  // %Y of strftime writes no leading zeros.
  std::array<char, 12> year{};
  std::snprintf(year.data(), year.size(), "%04d", fields.tm_year + 1900);
  return year.data() + Format("-%m-%dT%H:%M:%SZ", fields);
}

} // namespace orva::zophotos

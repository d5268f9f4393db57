#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace orva::zophotos {

/// Lets the C library know all characters, whatever the locale of the user does.
void UseUtf8();

/// `bytes` for programs: what is not UTF-8, and NUL, becomes U+FFFD.
std::string ToUtf8(std::string_view bytes);

/// `bytes` for people: control characters, invisible ones, backslashes and what is not UTF-8 are
/// escaped, so that a name can do nothing to a terminal.
std::string Printable(std::string_view bytes);

/// Columns that a printable text takes on a terminal.
std::size_t Width(std::string_view printable);

/// The first characters of a printable text that fit into `width` columns.
std::string_view Head(std::string_view printable, std::size_t width);

/// A printable text in no more than `width` columns, its middle left out where it is longer.
std::string Shorten(const std::string& printable, std::size_t width);

/// Columns of the terminal behind standard output; nothing when that is none.
std::optional<std::size_t> TerminalWidth();

/// "2026-11-21 09:15:00" in local time, for people; the number outside the years 1 to 9999.
std::string LocalTime(std::int64_t seconds);

/// "2026-11-21T08:15:00Z", for programs; nothing outside the years 1 to 9999.
std::optional<std::string> IsoTime(std::int64_t seconds);

/// "1 file", "2 files".
std::string Count(std::int64_t number, const std::string& noun);

} // namespace orva::zophotos

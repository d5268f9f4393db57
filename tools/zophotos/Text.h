#pragma once

#include "commandline/Count.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace orva::zophotos {

using commandline::Count;

/// Makes the C library handle all Unicode characters, independent of the user's locale.
void UseUtf8();

/// `bytes` for programs: bytes that are not UTF-8, and NUL, become U+FFFD.
std::string ToUtf8(std::string_view bytes);

/// `bytes` for people: control characters, invisible characters, backslashes and bytes that are not
/// UTF-8 are escaped, so that a name cannot control the terminal.
std::string Printable(std::string_view bytes);

/// The bytes that Printable made `text` of. Backslashes that begin no escape stay.
std::string Unescape(std::string_view text);

/// A printable text, in the colour of folders if `colors` is set.
std::string FolderColor(const std::string& printable, bool colors);

/// The number of terminal columns that a printable text takes.
std::size_t Width(std::string_view printable);

/// The first characters of a printable text that fit into `width` columns.
std::string_view Head(std::string_view printable, std::size_t width);

/// A printable text in at most `width` columns. The middle of a longer text is left out.
std::string Shorten(const std::string& printable, std::size_t width);

/// The width of the terminal at standard output; nothing if that is not a terminal.
std::optional<std::size_t> TerminalWidth();

/// The number of its lines.
std::optional<std::size_t> TerminalHeight();

/// Whether standard output is a terminal.
bool IsTerminal();

/// "2026-11-21 09:15:00" in local time, for people; the number outside the years 1 to 9999.
std::string LocalTime(std::int64_t seconds);

/// "2026-11-21T08:15:00Z", for programs; nothing outside the years 1 to 9999.
std::optional<std::string> IsoTime(std::int64_t seconds);

} // namespace orva::zophotos

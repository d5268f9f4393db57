#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace orva::web {

/// What a request asks for: "/photos/12?words=a+b" has a path and one parameter.
struct Target {
  std::string path; ///< as it was sent: no path of ours has an escape
  std::vector<std::pair<std::string, std::string>> parameters; ///< decoded; each name once

  /// The value of a parameter; null if it is missing.
  const std::string* Find(std::string_view name) const;
};

/// Parses the target of a request line. Returns nothing for one that is malformed: without a path,
/// with characters that are not ASCII, with an incomplete escape, with too many parameters or with
/// one parameter twice.
std::optional<Target> ParseTarget(std::string_view text);

/// The text as a value of the query, or in a header: every byte that is no plain character is an
/// escape.
std::string PercentEncoded(std::string_view text);

/// A number as we print it: decimal, without leading zeros or a plus sign. Nothing for any other
/// text.
std::optional<std::int64_t> ParseNumber(std::string_view text);

/// A part of a file.
struct ByteRange {
  std::uint64_t first = 0;
  std::uint64_t count = 0;
};

/// The one part that the Range header `text` asks for, of a file of `size` bytes. Nothing if the
/// whole file is to be sent: the header is malformed or names several parts. `count` is 0 if the
/// file does not have the part.
std::optional<ByteRange> ParseRange(std::string_view text, std::uint64_t size);

/// Whether the If-None-Match header `text` names `tag`, an entity tag with its quotation marks.
bool Matches(std::string_view text, std::string_view tag);

/// A request that the server passes on: its method is GET or HEAD, its host is one of ours, and it
/// has no body.
struct Request {
  Target target;
  std::string ifNoneMatch{};
  std::string ifRange{};
  std::string range{};
};

} // namespace orva::web

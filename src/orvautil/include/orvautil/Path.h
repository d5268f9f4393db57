#pragma once

#include <string>
#include <string_view>

namespace orva::util {

/// A view of a path: the string must outlive the object.
class Path {
public:
  explicit Path(const std::string& path) noexcept : path_(path) {}
  explicit Path(std::string&&) = delete;

  /// True when something exists at the path, links followed.
  bool Exists() const;

  /// Makes this directory, but none of its parents, with `permissions` less the process's
  /// umask. Returns whether it was made.
  bool Create(unsigned permissions) const;

  /// The absolute path without links, dots or trailing separator; empty when nothing exists
  /// there.
  std::string Canonicalize() const;

  /// The path without trailing separators; the root stays "/".
  std::string Basic() const;

  static char GetNativePathSeparator() noexcept { return '/'; }

private:
  const std::string& path_;
};

/// `directory` and `name` joined by exactly one separator, even if `directory` ends or `name`
/// begins with separators. An empty directory gives the name alone, an empty name the directory
/// followed by a separator.
std::string MakePath(std::string_view directory, std::string_view name);

} // namespace orva::util

#pragma once

#include <functional>
#include <map>
#include <string>
#include <vector>

namespace orva::test {

/// The state of all files in some directories: of each path the type, permissions, owner, size,
/// time of the last change and a hash of the content (or the target of a link).
class Tree {
public:
  /// Returns whether a path is left out.
  using Except = std::function<bool(const std::string& path)>;

  static Tree Of(const std::vector<std::string>& directories, const Except& except);

  /// The differences to an earlier state, one line each.
  std::vector<std::string> ChangesSince(const Tree& earlier) const;

private:
  std::map<std::string, std::string> items_; ///< description by path
};

} // namespace orva::test

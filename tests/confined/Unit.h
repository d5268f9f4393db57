#pragma once

#include <map>
#include <string>
#include <vector>

namespace orva::test {

/// The section [Service] of a systemd unit file: the values of each setting in their order. Of the
/// file's syntax only what our units use.
class Unit {
public:
  /// Throws std::runtime_error when the file cannot be read.
  explicit Unit(const std::string& path);

  /// The values of a setting that may stand there more than once.
  std::vector<std::string> All(const std::string& name) const;
  /// The words of its only value; none when it is not there.
  std::vector<std::string> Words(const std::string& name) const;
  /// Whether it is there and says yes.
  bool Is(const std::string& name) const;

  /// The names of all settings.
  std::vector<std::string> Names() const;

private:
  std::map<std::string, std::vector<std::string>> settings_;
};

} // namespace orva::test

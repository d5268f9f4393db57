#pragma once

#include <set>
#include <string>

namespace orva::notify {

/// The plain directories that were announced as volumes, in a file that outlives the service. So
/// the next one knows which of them are volumes no longer.
class AnnouncedDirectories {
public:
  /// Reads the file in `directory`; an empty name means that there is no file.
  explicit AnnouncedDirectories(const std::string& directory);

  /// Those of an earlier service that were not plugged again, and not yet announced as unplugged.
  const std::set<std::string>& Gone() const noexcept { return gone_; }

  /// The directory was announced as a volume.
  void Add(const std::string& path);

  /// All clients know that the directory is no volume.
  void Remove(const std::string& path);

private:
  void Save();

  const std::string file_;
  bool hasFailed_ = false; ///< the file cannot be written, which was printed
  std::set<std::string> plugged_;
  std::set<std::string> gone_;
};

} // namespace orva::notify

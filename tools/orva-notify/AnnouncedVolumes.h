#pragma once

#include <cstddef>
#include <set>
#include <string>

namespace orva::notify {

/// The volumes that were announced as plugged, in a file that outlives the service, and those of
/// them that are gone, until it is known that a client has removed their rows. Only volumes
/// directly below /shares are kept. On the service's thread.
class AnnouncedVolumes {
public:
  /// The limit of the volumes that are gone; above it, one of them is forgotten.
  static constexpr std::size_t MAXIMUM_GONE = 1000;

  /// Reads the file in `directory`; an empty name means that there is no file. All volumes in it
  /// are gone until they are plugged again.
  explicit AnnouncedVolumes(const std::string& directory);

  /// The mount points of the volumes that are gone, without a separator at the end.
  const std::set<std::string>& Gone() const noexcept { return gone_; }

  /// The volume is announced as plugged. Called before that, so that a kill in between loses
  /// nothing.
  void Plug(const std::string& mountPoint);

  /// The volume is announced as unplugged. It is gone, if it was plugged.
  void Unplug(const std::string& mountPoint);

  /// A client has removed the rows of volumes that were gone.
  void Forget(const std::set<std::string>& mountPoints);

private:
  void Save();
  bool Write(const std::string& copy) const;

  const std::string directory_;
  const std::string file_;
  bool hasFailed_ = false; ///< the file cannot be written, which was printed
  std::set<std::string> plugged_;
  std::set<std::string> gone_;
};

} // namespace orva::notify

#pragma once

#include "orvautil/FileDescriptor.h"

#include <optional>
#include <string>

namespace orva::indexer {

/// The daemon's locator file, which names the merged database and so the master volume.
class Locator {
public:
  Locator();

  /// A descriptor that becomes readable when the file may have changed.
  int Descriptor() const noexcept { return inotify_.Get(); }

  /// Reads what has become readable. Returns whether the file may have changed.
  bool HasChanged();

  /// The path of the volume with the merged database, without a separator at its end; nothing if
  /// the file names none, or if another user owns it.
  static std::optional<std::string> Master();

private:
  void Watch();

  util::FileDescriptor inotify_;
  int watch_ = -1;
  bool isOnFile_ = false; ///< the watch is on the file, not on its directory
};

} // namespace orva::indexer

#pragma once

#include "orvautil/FileDescriptor.h"

#include <sys/types.h>

#include <cstdint>
#include <map>
#include <string>
#include <unordered_map>
#include <vector>

namespace orva::indexer {

/// The watches on the folders of one volume. A folder is known by the path at which it was watched;
/// what the events say about renamed folders must be passed on with Forget. Paths are relative to
/// the volume and end in "/"; the root is empty. Watches do not keep the volume busy.
class FolderWatches {
public:
  /// Something happened in a watched folder, or to it.
  struct Event {
    std::uint32_t mask = 0; ///< of inotify(7)
    std::string folder{};   ///< path of the watched folder
    std::string name{};     ///< in the folder; may be empty
  };

  FolderWatches();

  /// The descriptor that becomes readable with events; -1 if there is none.
  int Descriptor() const noexcept { return inotify_.Get(); }

  /// Watches the open folder `descriptor`, which is at `path`. Returns whether that worked; errno
  /// says why not.
  bool Add(const std::string& path, int descriptor);

  /// Whether the open folder `descriptor`, which is watched at `path`, lets other users pass than
  /// at the last call for this path.
  bool HasOtherAccess(const std::string& path, int descriptor);

  /// Whether the folder at `path` is watched.
  bool Has(const std::string& path) const { return byPath_.contains(path); }

  /// Ends the watches on the folder at `path` and on those below it.
  void Forget(const std::string& path);

  /// The events that have happened, up to a limit. Events of folders that are not watched any more
  /// are left out. An event with IN_Q_OVERFLOW means that others were lost.
  std::vector<Event> Read();

private:
  struct Watched {
    int watch = -1;
    bool isAccessKnown = false;
    mode_t passing = 0; ///< who may pass
    gid_t group = 0;
  };

  void End(const std::string& path, int watch);

  util::FileDescriptor inotify_;
  /// A folder has one watch, also if several paths lead to it: it is mounted at another place, or
  /// was just moved.
  std::unordered_multimap<int, std::string> byWatch_;
  std::map<std::string, Watched> byPath_;
};

} // namespace orva::indexer

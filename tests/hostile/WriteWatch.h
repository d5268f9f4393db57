#pragma once

#include "orvautil/FileDescriptor.h"

#include <functional>
#include <map>
#include <string>
#include <vector>

namespace orva::test {

/// Watches for files in some directories that are opened for writing, created, removed or renamed
/// while the object lives.
class WriteWatch {
public:
  using Except = std::function<bool(const std::string& path)>;

  /// Watches `root` and the directories that are below it now. Throws std::system_error.
  WriteWatch(const std::string& root, Except except);

  /// The paths that were written since the last call, with what happened.
  std::vector<std::string> Take();

private:
  void Add(const std::string& directory);

  util::FileDescriptor inotify_;
  Except except_;
  std::map<int, std::string> directories_; ///< by watch
};

} // namespace orva::test

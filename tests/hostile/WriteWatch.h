#pragma once

#include <functional>
#include <map>
#include <string>
#include <vector>

namespace orva::test {

/// Sees every file in some directories that is opened for writing, made, removed or renamed while
/// the object lives, also where that leaves no trace.
class WriteWatch {
public:
  using Except = std::function<bool(const std::string& path)>;

  /// Watches the directories that there are now below `root`. Throws std::system_error.
  WriteWatch(const std::string& root, Except except);
  WriteWatch(const WriteWatch&) = delete;
  WriteWatch& operator=(const WriteWatch&) = delete;
  ~WriteWatch();

  /// The paths that were written since the last call, with what happened.
  std::vector<std::string> Take();

private:
  void Add(const std::string& directory);

  int inotify_; ///< owned
  Except except_;
  std::map<int, std::string> directories_; ///< by watch
};

} // namespace orva::test

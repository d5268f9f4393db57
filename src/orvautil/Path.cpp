#include "orvautil/Path.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <memory>

namespace orva::util {

namespace {

constexpr char SEPARATOR = '/';

} // namespace

bool Path::Exists() const {
  struct stat status {};
  return stat(path_.c_str(), &status) == 0;
}

bool Path::Create(unsigned permissions) const {
  return mkdir(path_.c_str(), permissions) == 0;
}

std::string Path::Canonicalize() const {
  const std::unique_ptr<char, decltype(&std::free)> resolved(realpath(path_.c_str(), nullptr),
                                                             &std::free);
  return resolved ? std::string(resolved.get()) : std::string();
}

std::string Path::Basic() const {
  const std::size_t last = path_.find_last_not_of(SEPARATOR);
  return path_.substr(0, last == std::string::npos ? 1 : last + 1);
}

std::string MakePath(std::string_view directory, std::string_view name) {
  if (directory.empty()) {
    return std::string(name);
  }
  const std::size_t directoryEnd = directory.find_last_not_of(SEPARATOR) + 1;
  const std::size_t nameBegin = std::min(name.find_first_not_of(SEPARATOR), name.size());
  std::string path;
  path.reserve(directoryEnd + 1 + name.size() - nameBegin);
  path.append(directory, 0, directoryEnd).append(1, SEPARATOR).append(name.substr(nameBegin));
  return path;
}

} // namespace orva::util

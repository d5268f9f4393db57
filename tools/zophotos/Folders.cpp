#include "Commands.h"

namespace orva::zophotos {

std::string FolderPath(const std::string& folder) {
  std::string path = folder.starts_with('/') ? folder : "/shares/" + folder;
  if (!path.ends_with('/')) {
    path += '/';
  }
  return path;
}

std::string EndOfFolder(const std::string& path) {
  // '0' is the character after '/'.
  return path.substr(0, path.size() - 1) + "0";
}

} // namespace orva::zophotos

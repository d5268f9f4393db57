#include "orva-notify/AnnouncedDirectories.h"

#include "orva-notify/MountInfo.h"

#include <filesystem>
#include <fstream>
#include <iostream>
#include <system_error>
#include <utility>

namespace orva::notify {

AnnouncedDirectories::AnnouncedDirectories(const std::string& directory)
    : file_(directory.empty() ? "" : directory + "/directories") {
  if (file_.empty()) {
    return;
  }
  std::ifstream file(file_, std::ios::binary);
  for (std::string path; std::getline(file, path, '\0');) {
    if (IsDirectlyBelowShares(path)) { // the file may be damaged
      gone_.insert(path);
    }
  }
}

void AnnouncedDirectories::Add(const std::string& path) {
  const bool wasGone = gone_.erase(path) > 0;
  if (plugged_.insert(path).second && !wasGone) {
    Save();
  }
}

void AnnouncedDirectories::Remove(const std::string& path) {
  if (gone_.erase(path) + plugged_.erase(path) > 0) {
    Save();
  }
}

void AnnouncedDirectories::Save() {
  if (file_.empty()) {
    return;
  }
  const std::string copy = file_ + ".new";
  std::ofstream file(copy, std::ios::binary | std::ios::trunc);
  for (const auto* const paths : {&plugged_, &gone_}) {
    for (const std::string& path : *paths) {
      file << path << '\0';
    }
  }
  file.close();
  std::error_code error;
  std::filesystem::rename(copy, file_, error);
  if ((!file || error) && !std::exchange(hasFailed_, true)) {
    std::cout << "cannot write " << file_
              << ": after a restart, directories that are volumes no longer stay merged"
              << std::endl;
  }
}

} // namespace orva::notify

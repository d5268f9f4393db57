#include "orva-notify/AnnouncedVolumes.h"

#include "orva-notify/MountInfo.h"
#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <iostream>
#include <utility>

namespace orva::notify {
namespace {

std::string WithoutSeparator(std::string mountPoint) {
  if (mountPoint.ends_with('/')) {
    mountPoint.pop_back();
  }
  return mountPoint;
}

bool Synchronize(const std::string& path) {
  const util::FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  return file && fsync(file.Get()) == 0;
}

} // namespace

AnnouncedVolumes::AnnouncedVolumes(const std::string& directory)
    : directory_(directory), file_(directory.empty() ? "" : directory + "/volumes") {
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

void AnnouncedVolumes::Plug(const std::string& mountPoint) {
  const std::string path = WithoutSeparator(mountPoint);
  if (!IsDirectlyBelowShares(path)) {
    return;
  }
  const bool wasGone = gone_.erase(path) > 0;
  if (plugged_.insert(path).second && !wasGone) {
    Save();
  }
}

void AnnouncedVolumes::Unplug(const std::string& mountPoint) {
  // In the file, it stays.
  if (auto volume = plugged_.extract(WithoutSeparator(mountPoint))) {
    gone_.insert(std::move(volume));
  }
  if (gone_.size() > MAXIMUM_GONE) {
    Forget({*gone_.begin()});
  }
}

void AnnouncedVolumes::Forget(const std::set<std::string>& mountPoints) {
  const auto isForgotten = [&](const std::string& path) { return mountPoints.contains(path); };
  if (std::erase_if(gone_, isForgotten) > 0) {
    Save();
  }
}

void AnnouncedVolumes::Save() {
  if (file_.empty()) {
    return;
  }
  if (!Write(file_ + ".new") && !std::exchange(hasFailed_, true)) {
    std::cout << "cannot write " << file_
              << ": volumes that are removed while this service does not run stay merged"
              << std::endl;
  }
}

/// On the medium before the daemon merges the volume: it may be removed while there is no power.
bool AnnouncedVolumes::Write(const std::string& copy) const {
  std::ofstream file(copy, std::ios::binary | std::ios::trunc);
  for (const auto* const paths : {&plugged_, &gone_}) {
    for (const std::string& path : *paths) {
      file << path << '\0';
    }
  }
  file.close();
  return file && Synchronize(copy) && std::rename(copy.c_str(), file_.c_str()) == 0 &&
         Synchronize(directory_);
}

} // namespace orva::notify

#include "Root.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>
#include <vector>

namespace orva::test {

namespace {

void Check(int result, const std::string& what) {
  if (result == -1) {
    throw std::system_error(errno, std::generic_category(), what);
  }
}

/// A minus in front of a path allows it not to be there.
std::string WithoutMark(const std::string& path) {
  return path.starts_with('-') ? path.substr(1) : path;
}

bool IsPlace(const std::string& path) {
  return std::filesystem::exists(path) && !std::filesystem::is_symlink(path);
}

void MakeReadOnly(const std::string& path) {
  if (!IsPlace(path)) {
    return;
  }
  Check(mount(path.c_str(), path.c_str(), nullptr, MS_BIND | MS_REC, nullptr), path);
  mount_attr attributes{};
  attributes.attr_set = MOUNT_ATTR_RDONLY;
  Check(mount_setattr(AT_FDCWD, path.c_str(), AT_RECURSIVE, &attributes, sizeof attributes), path);
}

void MakeWritable(const std::string& path) {
  Check(mount(path.c_str(), path.c_str(), nullptr, MS_BIND | MS_REC, nullptr), path);
  mount_attr attributes{};
  attributes.attr_clr = MOUNT_ATTR_RDONLY;
  Check(mount_setattr(AT_FDCWD, path.c_str(), 0, &attributes, sizeof attributes), path);
}

void Hide(const std::string& path) {
  if (IsPlace(path)) {
    Check(mount("hidden", path.c_str(), "tmpfs", 0, "mode=000"), path);
  }
}

void HidePlaces(const Unit& unit) {
  if (unit.Is("ProtectHome")) {
    Hide("/home");
    Hide("/root");
    Hide("/run/user");
  }
  for (const std::string& path : unit.Words("InaccessiblePaths")) {
    Hide(WithoutMark(path));
  }
}

void MakePlacesReadOnly(const Unit& unit) {
  std::vector<std::string> places;
  if (unit.Words("ProtectSystem") == std::vector<std::string>{"full"}) {
    places = {"/usr", "/boot", "/efi", "/etc"};
  }
  if (unit.Is("ProtectKernelTunables")) {
    places.insert(places.end(), {"/proc/sys", "/sys"});
  }
  for (const std::string& path : unit.Words("ReadOnlyPaths")) {
    places.push_back(WithoutMark(path));
  }
  for (const std::string& place : places) {
    MakeReadOnly(place);
  }
}

/// The working directory, which the caller has made: the one that the unit makes, for this start.
void KeepWorkingDirectory() {
  MakeWritable(std::filesystem::current_path());
  Check(chdir(std::filesystem::current_path().c_str()), "chdir");
}

int Namespaces(const Unit& unit) {
  return CLONE_NEWNS | (unit.Is("PrivateNetwork") ? CLONE_NEWNET : 0) |
         (unit.Is("PrivateIPC") ? CLONE_NEWIPC : 0) |
         (unit.Is("ProtectHostname") ? CLONE_NEWUTS : 0);
}

} // namespace

void ConfineRoot(const Unit& unit, const std::string& kept) {
  Check(mount(nullptr, "/", nullptr, MS_REC | MS_SHARED, nullptr), "/");
  Check(unshare(Namespaces(unit)), "unshare");
  Check(mount(nullptr, "/", nullptr, MS_REC | MS_SLAVE, nullptr), "/");
  const int tree = open_tree(AT_FDCWD, kept.c_str(), OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC);
  Check(tree, kept);

  MakePlacesReadOnly(unit);
  HidePlaces(unit);
  KeepWorkingDirectory();
  if (!std::filesystem::exists(kept)) {
    std::filesystem::create_directories(kept);
    Check(move_mount(tree, "", AT_FDCWD, kept.c_str(), MOVE_MOUNT_F_EMPTY_PATH), kept);
  }
  close(tree);
}

} // namespace orva::test

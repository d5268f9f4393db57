#include "Volume.h"

#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

namespace orva::test {

namespace {

void Check(int result, const std::string& what) {
  if (result != 0) {
    throw std::system_error(errno, std::generic_category(), what);
  }
}

struct statvfs Query(const std::string& path) {
  struct statvfs facts {};
  Check(statvfs(path.c_str(), &facts), path);
  return facts;
}

} // namespace

Volume::Volume(const std::string& name, const std::string& size) : path_("/shares/" + name) {
  mkdir("/shares", 0755);
  Check(mkdir(path_.c_str(), 0755), path_);
  Check(mount("volume", path_.c_str(), "tmpfs", 0, ("size=" + size).c_str()), path_);
  mounted_ = true;
}

Volume::~Volume() {
  Unmount();
}

void Volume::MakeReadOnly() {
  Check(mount(nullptr, path_.c_str(), nullptr, MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr), path_);
}

void Volume::MakeWritable() {
  Check(mount(nullptr, path_.c_str(), nullptr, MS_REMOUNT | MS_BIND, nullptr), path_);
}

void Volume::Resize(double bytes) {
  const std::string size = "size=" + std::to_string(static_cast<long long>(bytes));
  Check(mount(nullptr, path_.c_str(), nullptr, MS_REMOUNT, size.c_str()), path_);
}

void Volume::Unmount() {
  if (mounted_) {
    umount2(path_.c_str(), MNT_DETACH);
    rmdir(path_.c_str());
    mounted_ = false;
  }
}

double Volume::Capacity() const {
  const struct statvfs facts = Query(path_);
  return static_cast<double>(facts.f_blocks * facts.f_frsize);
}

double Volume::Used() const {
  const struct statvfs facts = Query(path_);
  return static_cast<double>(facts.f_blocks * facts.f_frsize - facts.f_bfree * facts.f_bsize);
}

} // namespace orva::test

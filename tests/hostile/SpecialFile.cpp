#include "SpecialFile.h"

#include "orvautil/FileDescriptor.h"

#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <ostream>
#include <system_error>

namespace orva::test {

namespace {

namespace fs = std::filesystem;

const std::string DEVICE = "/dev/zero";

void Check(int result, const std::string& what) {
  if (result != 0) {
    throw std::system_error(errno, std::generic_category(), what);
  }
}

} // namespace

void MakeSocket(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  const util::FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  Check(bind(socket.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), path);
}

std::string NameOf(SpecialKind kind) {
  return std::vector<std::string>{"Fifo", "Socket",       "Directory",   "Device",
                                  "Link", "LinkToDevice", "DanglingLink"}
      .at(static_cast<std::size_t>(kind));
}

void PrintTo(SpecialKind kind, std::ostream* stream) {
  *stream << NameOf(kind);
}

SpecialFile::SpecialFile(SpecialKind kind, std::string path, const std::string& target)
    : kind_(kind), path_(std::move(path)) {
  fs::remove_all(path_);
  switch (kind_) {
  case SpecialKind::Fifo:
    Check(mkfifo(path_.c_str(), 0666), path_);
    break;
  case SpecialKind::Socket:
    MakeSocket(path_);
    break;
  case SpecialKind::Directory:
    fs::create_directory(path_);
    break;
  case SpecialKind::Device:
    std::ofstream(path_).flush();
    Check(mount(DEVICE.c_str(), path_.c_str(), nullptr, MS_BIND, nullptr), path_);
    break;
  case SpecialKind::Link:
    fs::create_symlink(target, path_);
    break;
  case SpecialKind::LinkToDevice:
    fs::create_symlink(DEVICE, path_);
    break;
  case SpecialKind::DanglingLink:
    fs::create_symlink("/shares/Decoy/nowhere", path_);
    break;
  }
}

SpecialFile::~SpecialFile() {
  if (kind_ == SpecialKind::Device) {
    umount2(path_.c_str(), MNT_DETACH);
  }
  std::error_code ignored;
  fs::remove_all(path_, ignored);
}

} // namespace orva::test

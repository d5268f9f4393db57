// The daemon's own requests to the file system, without SQLite. The linker replaces its calls with
// these functions (--wrap); those of SQLite's library stay as they are.

#include "FaultVfs.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <string>

namespace orva::test {

// The names that the linker uses.
int RealRename(const char* from, const char* to) __asm__("__real_rename");
int RealFsync(int descriptor) __asm__("__real_fsync");
int RealUnlink(const char* path) __asm__("__real_unlink");
int WrapRename(const char* from, const char* to) __asm__("__wrap_rename");
int WrapFsync(int descriptor) __asm__("__wrap_fsync");
int WrapUnlink(const char* path) __asm__("__wrap_unlink");

namespace {

/// Whether the call has to fail; errno says why.
bool Fails(Request request, const std::string& path) {
  FaultVfs* const faults = FaultVfs::Current();
  if (faults == nullptr || !faults->Fails(request, path.c_str())) {
    return false;
  }
  errno = faults->SystemError();
  return true;
}

/// Announces a change of the file to the file system with the fault.
void Touching(const char* path) {
  if (FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Touching(path);
  }
}

std::string PathOf(int descriptor) {
  std::error_code error;
  return std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(descriptor), error);
}

} // namespace

int WrapRename(const char* from, const char* to) {
  if (Fails(Request::Rename, from)) {
    return -1;
  }
  Touching(from);
  Touching(to);
  const int result = RealRename(from, to);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Renamed(from, to);
  }
  return result;
}

int WrapFsync(int descriptor) {
  const std::string path = PathOf(descriptor);
  if (Fails(Request::Sync, path)) {
    return -1;
  }
  const int result = RealFsync(descriptor);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Synced(path.c_str());
  }
  return result;
}

int WrapUnlink(const char* path) {
  if (Fails(Request::Delete, path)) {
    return -1;
  }
  Touching(path);
  const int result = RealUnlink(path);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Deleted(path);
  }
  return result;
}

} // namespace orva::test

// The daemon's own requests to the file system, beside those of SQLite. The linker replaces its
// calls with these functions (--wrap); those of SQLite's library stay as they are.

#include "FaultVfs.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <string>

namespace orva::test {

// The names that the linker uses.
int RealRename(int fromFolder, const char* from, int toFolder,
               const char* to) __asm__("__real_renameat");
int RealFsync(int descriptor) __asm__("__real_fsync");
int RealUnlink(int folder, const char* name, int flags) __asm__("__real_unlinkat");
int WrapRename(int fromFolder, const char* from, int toFolder,
               const char* to) __asm__("__wrap_renameat");
int WrapFsync(int descriptor) __asm__("__wrap_fsync");
int WrapUnlink(int folder, const char* name, int flags) __asm__("__wrap_unlinkat");

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
void Touching(const std::string& path) {
  if (FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Touching(path.c_str());
  }
}

std::string PathOf(int descriptor) {
  std::error_code error;
  return std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(descriptor), error);
}

std::string PathIn(int folder, const char* name) {
  return PathOf(folder) + '/' + name;
}

} // namespace

int WrapRename(int fromFolder, const char* from, int toFolder, const char* to) {
  const std::string fromPath = PathIn(fromFolder, from);
  const std::string toPath = PathIn(toFolder, to);
  if (Fails(Request::Rename, fromPath)) {
    return -1;
  }
  Touching(fromPath);
  Touching(toPath);
  const int result = RealRename(fromFolder, from, toFolder, to);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Renamed(fromPath.c_str(), toPath.c_str());
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

int WrapUnlink(int folder, const char* name, int flags) {
  const std::string path = PathIn(folder, name);
  if (FaultVfs::Current() != nullptr && FaultVfs::Current()->IsDeleting()) {
    return RealUnlink(folder, name, flags); // SQLite's request, which was counted there
  }
  if (Fails(Request::Delete, path)) {
    return -1;
  }
  Touching(path);
  const int result = RealUnlink(folder, name, flags);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Deleted(path.c_str());
  }
  return result;
}

} // namespace orva::test

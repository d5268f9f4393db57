// What the daemon itself asks of the file system, past SQLite. The linker hands its calls to these
// (--wrap), and no others: SQLite's library keeps its own.

#include "FaultVfs.h"

#include <sqlite3.h>

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <string>

namespace orva::test {
namespace {

/// Whether the call has to fail; errno says why.
bool Fails(Request request, const std::string& path) {
  FaultVfs* const faults = FaultVfs::Current();
  if (faults == nullptr || !faults->Fails(request, path.c_str())) {
    return false;
  }
  errno = faults->Code() == SQLITE_FULL ? ENOSPC : EIO;
  return true;
}

std::string PathOf(int descriptor) {
  std::error_code error;
  return std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(descriptor), error);
}

} // namespace
} // namespace orva::test

// The linker's names.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" {

int __real_rename(const char* from, const char* to);
int __real_fsync(int descriptor);
int __real_unlink(const char* path);
int __wrap_rename(const char* from, const char* to);
int __wrap_fsync(int descriptor);
int __wrap_unlink(const char* path);

int __wrap_rename(const char* from, const char* to) {
  using namespace orva::test;
  if (Fails(Request::Rename, from)) {
    return -1;
  }
  const int result = __real_rename(from, to);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Renamed(from, to);
  }
  return result;
}

int __wrap_fsync(int descriptor) {
  using namespace orva::test;
  const std::string path = PathOf(descriptor);
  if (Fails(Request::Sync, path)) {
    return -1;
  }
  const int result = __real_fsync(descriptor);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Synced(path.c_str());
  }
  return result;
}

int __wrap_unlink(const char* path) {
  using namespace orva::test;
  if (Fails(Request::Delete, path)) {
    return -1;
  }
  const int result = __real_unlink(path);
  if (result == 0 && FaultVfs::Current() != nullptr) {
    FaultVfs::Current()->Deleted(path);
  }
  return result;
}

} // extern "C"
// NOLINTEND(bugprone-reserved-identifier)

// Preloaded into a program: a file system that stores no holes, or does not know of them. It
// reports as many allocated blocks as a file has bytes, and data everywhere.

#include <dlfcn.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace {

constexpr long BLOCK_SIZE = 512;

/// The next library's function of this name.
template <typename Function>
Function* Next(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

template <typename Status>
int Claim(int result, Status* status) {
  if (result == 0 && S_ISREG(status->st_mode)) {
    status->st_blocks = (status->st_size + BLOCK_SIZE - 1) / BLOCK_SIZE;
  }
  return result;
}

} // namespace

// The names that programs use.
int ClaimStat(const char* path, struct stat* status) __asm__("stat");
int ClaimStat64(const char* path, struct stat64* status) __asm__("stat64");
int ClaimLstat(const char* path, struct stat* status) __asm__("lstat");
int ClaimLstat64(const char* path, struct stat64* status) __asm__("lstat64");
int ClaimFstat(int file, struct stat* status) __asm__("fstat");
int ClaimFstat64(int file, struct stat64* status) __asm__("fstat64");
int ClaimFstatat(int directory, const char* path, struct stat* status,
                 int flags) __asm__("fstatat");
int ClaimFstatat64(int directory, const char* path, struct stat64* status,
                   int flags) __asm__("fstatat64");
int ClaimStatx(int directory, const char* path, int flags, unsigned mask,
               struct statx* status) __asm__("statx");
off_t SeekWithoutHoles(int file, off_t offset, int whence) __asm__("lseek");
off64_t SeekWithoutHoles64(int file, off64_t offset, int whence) __asm__("lseek64");

int ClaimStat(const char* path, struct stat* status) {
  return Claim(Next<int(const char*, struct stat*)>("stat")(path, status), status);
}

int ClaimStat64(const char* path, struct stat64* status) {
  return Claim(Next<int(const char*, struct stat64*)>("stat64")(path, status), status);
}

int ClaimLstat(const char* path, struct stat* status) {
  return Claim(Next<int(const char*, struct stat*)>("lstat")(path, status), status);
}

int ClaimLstat64(const char* path, struct stat64* status) {
  return Claim(Next<int(const char*, struct stat64*)>("lstat64")(path, status), status);
}

int ClaimFstat(int file, struct stat* status) {
  return Claim(Next<int(int, struct stat*)>("fstat")(file, status), status);
}

int ClaimFstat64(int file, struct stat64* status) {
  return Claim(Next<int(int, struct stat64*)>("fstat64")(file, status), status);
}

int ClaimFstatat(int directory, const char* path, struct stat* status, int flags) {
  using Function = int(int, const char*, struct stat*, int);
  return Claim(Next<Function>("fstatat")(directory, path, status, flags), status);
}

int ClaimFstatat64(int directory, const char* path, struct stat64* status, int flags) {
  using Function = int(int, const char*, struct stat64*, int);
  return Claim(Next<Function>("fstatat64")(directory, path, status, flags), status);
}

int ClaimStatx(int directory, const char* path, int flags, unsigned mask, struct statx* status) {
  using Function = int(int, const char*, int, unsigned, struct statx*);
  const int result = Next<Function>("statx")(directory, path, flags, mask, status);
  if (result == 0 && S_ISREG(status->stx_mode)) {
    status->stx_blocks = (status->stx_size + BLOCK_SIZE - 1) / BLOCK_SIZE;
  }
  return result;
}

off_t SeekWithoutHoles(int file, off_t offset, int whence) {
  const auto next = Next<off_t(int, off_t, int)>("lseek");
  if (whence != SEEK_DATA && whence != SEEK_HOLE) {
    return next(file, offset, whence);
  }
  struct stat status {};
  if (ClaimFstat(file, &status) != 0) {
    return -1;
  }
  if (offset < 0 || offset >= status.st_size) {
    errno = ENXIO;
    return -1;
  }
  return next(file, whence == SEEK_DATA ? offset : status.st_size, SEEK_SET);
}

off64_t SeekWithoutHoles64(int file, off64_t offset, int whence) {
  return SeekWithoutHoles(file, offset, whence);
}

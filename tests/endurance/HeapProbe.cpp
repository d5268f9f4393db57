// Preloaded into the daemon: whenever it is about to wait for the next bytes from its socket, tells
// a file how many bytes of the heap are in use. The file is named by HEAP_PROBE.

#undef _FORTIFY_SOURCE // its headers define recv as well

#include <dlfcn.h>
#include <malloc.h>
#include <sys/socket.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

namespace {

void TellHeap() {
  const char* const path = std::getenv("HEAP_PROBE");
  if (path == nullptr) {
    return;
  }
  const std::string next = std::string(path) + ".next";
  const struct mallinfo2 heap = mallinfo2();
  std::ofstream(next) << heap.uordblks + heap.hblkhd;
  std::rename(next.c_str(), path); // whoever reads finds a whole number
}

} // namespace

extern "C" ssize_t recv(int fd, void* buf, size_t n, int flags) {
  TellHeap();
  static void* const next = dlsym(RTLD_NEXT, "recv");
  return reinterpret_cast<ssize_t (*)(int, void*, size_t, int)>(next)(fd, buf, n, flags);
}

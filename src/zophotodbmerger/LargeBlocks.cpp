#include "stdafx.h"

#include "LargeBlocks.h"

#include <sys/mman.h>

#include <cstddef>
#include <new>

namespace orva::dbmerger {

namespace {

constexpr std::size_t HUGE_PAGE = 2 << 20;

class Resource final : public std::pmr::memory_resource {
private:
  void* do_allocate(std::size_t bytes, std::size_t alignment) override {
    if (bytes < HUGE_PAGE) {
      return ::operator new(bytes, std::align_val_t(alignment));
    }
    void* const block = ::operator new(bytes, std::align_val_t(HUGE_PAGE));
    // Only whole huge pages: the rest belongs to other blocks. A system may refuse.
    static_cast<void>(madvise(block, bytes / HUGE_PAGE * HUGE_PAGE, MADV_HUGEPAGE));
    return block;
  }

  void do_deallocate(void* block, std::size_t bytes, std::size_t alignment) override {
    ::operator delete(block, std::align_val_t(bytes < HUGE_PAGE ? alignment : HUGE_PAGE));
  }

  bool do_is_equal(const std::pmr::memory_resource& other) const noexcept override {
    return this == &other;
  }
};

} // namespace

std::pmr::memory_resource* LargeBlocks() noexcept {
  static Resource resource;
  return &resource;
}

} // namespace orva::dbmerger

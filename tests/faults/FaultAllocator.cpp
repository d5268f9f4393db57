#include "FaultAllocator.h"

#include <sqlite3.h>

#include <stdexcept>

namespace orva::test {

namespace {

FaultAllocator* currentAllocator = nullptr;
sqlite3_mem_methods real;

bool Fails() {
  return currentAllocator != nullptr && currentAllocator->Fails();
}

void* Allocate(int bytes) {
  return Fails() ? nullptr : real.xMalloc(bytes);
}

void* Reallocate(void* memory, int bytes) {
  return Fails() ? nullptr : real.xRealloc(memory, bytes);
}

void Check(int code) {
  if (code != SQLITE_OK) {
    throw std::logic_error("SQLite is in use already");
  }
}

} // namespace

void FaultAllocator::Install() {
  Check(sqlite3_config(SQLITE_CONFIG_GETMALLOC, &real));
  sqlite3_mem_methods methods = real;
  methods.xMalloc = Allocate;
  methods.xRealloc = Reallocate;
  Check(sqlite3_config(SQLITE_CONFIG_MALLOC, &methods));
  Check(sqlite3_config(SQLITE_CONFIG_LOOKASIDE, 0, 0));
}

FaultAllocator::FaultAllocator(int nth, bool permanent) : nth_(nth), permanent_(permanent) {
  if (currentAllocator != nullptr) {
    throw std::logic_error("two fault allocators");
  }
  currentAllocator = this;
}

FaultAllocator::~FaultAllocator() {
  currentAllocator = nullptr;
}

bool FaultAllocator::Fails() noexcept {
  ++seen_;
  const bool fails = seen_ == nth_ || (permanent_ && nth_ != 0 && seen_ > nth_);
  failed_ += fails ? 1 : 0;
  return fails;
}

} // namespace orva::test

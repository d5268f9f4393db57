#pragma once

#include "orvautil/deleteAll.h"

#include <memory>
#include <utility>
#include <vector>

namespace orva::util {

/// A vector of pointers that owns its elements: they are deleted, first to last, with it.
/// Has only those operations of std::vector that cannot lose an element; the pointers may be
/// reordered in place (std::sort). Null elements are allowed.
template <typename T>
class OwnerVector : private std::vector<T*> {
  using Base = std::vector<T*>;

public:
  using typename Base::const_iterator;
  using typename Base::iterator;
  using typename Base::value_type;

  OwnerVector() = default;
  OwnerVector(OwnerVector&& other) noexcept : Base(std::exchange(other.Mutable(), {})) {}
  OwnerVector(const OwnerVector&) = delete;
  OwnerVector& operator=(const OwnerVector&) = delete;
  OwnerVector& operator=(OwnerVector&&) = delete;

  /// Deletes every element. If destructors throw, all elements are still deleted and all memory is
  /// released; then the first exception is rethrown.
  ~OwnerVector() noexcept(false) { deleteAll(Mutable()); }

  using Base::back;
  using Base::begin;
  using Base::empty;
  using Base::end;
  using Base::front;
  using Base::reserve;
  using Base::size;
  using Base::operator[];

  /// Appends `element` and takes it over.
  void push_back(std::unique_ptr<T> element) {
    Base::push_back(element.get());
    static_cast<void>(element.release());
  }

  /// The elements as a plain vector, for operations that only read them.
  const std::vector<T*>& Elements() const noexcept { return *this; }

private:
  std::vector<T*>& Mutable() noexcept { return *this; }
};

} // namespace orva::util

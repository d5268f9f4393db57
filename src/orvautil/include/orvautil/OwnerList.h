#pragma once

#include "orvautil/deleteAll.h"

#include <list>
#include <memory>

namespace orva::util {

/// A list of pointers that owns its elements: they are deleted in list order with it.
/// Null elements are allowed.
template <typename T>
class OwnerList : private std::list<T*> {
  using Base = std::list<T*>;

public:
  using typename Base::const_iterator;
  using typename Base::iterator;
  using typename Base::value_type;

  OwnerList() = default;
  OwnerList(const OwnerList&) = delete;
  OwnerList& operator=(const OwnerList&) = delete;

  /// Deletes every element. If destructors throw, all elements are still deleted and all memory is
  /// released; then the first exception is rethrown.
  ~OwnerList() noexcept(false) { deleteAll(static_cast<std::list<T*>&>(*this)); }

  using Base::back;
  using Base::begin;
  using Base::empty;
  using Base::end;
  using Base::front;
  using Base::size;

  /// Appends `element` and takes it over.
  void push_back(std::unique_ptr<T> element) {
    Base::push_back(element.get());
    static_cast<void>(element.release());
  }
};

} // namespace orva::util

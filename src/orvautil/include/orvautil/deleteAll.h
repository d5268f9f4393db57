#pragma once

#include <exception>

namespace orva::util {

/// Deletes every element of a container of owning pointers, in order. If destructors throw, all
/// elements are still deleted; then the first exception is rethrown.
template <typename Container>
void deleteAll(Container& pointers) {
  std::exception_ptr first;
  for (auto* const pointer : pointers) {
    try {
      delete pointer;
    } catch (...) {
      if (!first) {
        first = std::current_exception();
      }
    }
  }
  if (first) {
    std::rethrow_exception(first);
  }
}

} // namespace orva::util

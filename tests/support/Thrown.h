#pragma once

#include <stdexcept>
#include <string>

namespace orva::test {

/// What `action` throws: a text, as the database layer does, unless another type is named. Throws
/// std::logic_error when nothing is thrown.
template <typename Exception = std::string, typename Action>
Exception Thrown(Action action) {
  try {
    action();
  } catch (const Exception& thrown) {
    return thrown;
  }
  throw std::logic_error("nothing was thrown");
}

} // namespace orva::test

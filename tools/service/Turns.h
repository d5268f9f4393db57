#pragma once

#include <algorithm>
#include <string>

namespace orva::service {

/// The next element of `map` after the key `last` for which `condition` holds; after the end come
/// the elements from the beginning to `last`. Returns the end if there is none.
template <typename Map, typename Condition>
auto NextInTurn(Map& map, const std::string& last, Condition condition) {
  const auto after = map.upper_bound(last);
  const auto next = std::find_if(after, map.end(), condition);
  if (next != map.end()) {
    return next;
  }
  const auto first = std::find_if(map.begin(), after, condition);
  return first == after ? map.end() : first;
}

} // namespace orva::service

#pragma once

#include "Text.h"

#include <nlohmann/json.hpp>

#include <iostream>

namespace orva::zophotos {

/// Keeps the members in the order in which they are added.
using Json = nlohmann::ordered_json;

/// A time for programs; null if IsoTime returns nothing.
inline Json JsonTime(std::int64_t seconds) {
  const auto text = IsoTime(seconds);
  return text ? Json(*text) : Json();
}

/// The stamp up to which a volume is merged; null for 0, which means none.
inline Json JsonStamp(std::int64_t seconds) {
  return seconds == 0 ? Json() : JsonTime(seconds);
}

/// Prints an object as one line. Its texts must be UTF-8.
inline void PrintLine(const Json& object) {
  std::cout << object.dump() << '\n';
}

} // namespace orva::zophotos

#pragma once

#include "Text.h"

#include <nlohmann/json.hpp>

#include <iostream>

namespace orva::zophotos {

/// Members in the order in which they are given.
using Json = nlohmann::ordered_json;

/// A time as programs get it; null where IsoTime has none.
inline Json JsonTime(std::int64_t seconds) {
  const auto text = IsoTime(seconds);
  return text ? Json(*text) : Json();
}

/// The stamp up to which a volume is merged; null for 0, which stands for none.
inline Json JsonStamp(std::int64_t seconds) {
  return seconds == 0 ? Json() : JsonTime(seconds);
}

/// Prints an object, whose texts are UTF-8, as one line.
inline void PrintLine(const Json& object) {
  std::cout << object.dump() << '\n';
}

} // namespace orva::zophotos

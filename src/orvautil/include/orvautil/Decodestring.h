#pragma once

#include <string>

namespace orva::util {

/// Decodes percent-encoding. A malformed escape stays as it is, and so does "%00", because a path
/// cannot contain that byte; "+" is an ordinary character.
std::string Decodestring(const std::string& encoded);

} // namespace orva::util

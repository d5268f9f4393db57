#pragma once

#include <string>

namespace orva::util {

/// Decodes percent-encoding. A malformed escape stays as it is, and so does "%00", because no name
/// holds that byte; "+" is an ordinary character.
std::string Decodestring(const std::string& encoded);

} // namespace orva::util

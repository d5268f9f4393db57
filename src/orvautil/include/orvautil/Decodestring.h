#pragma once

#include <string>

namespace orva::util {

/// Decodes percent-encoding. An escape that is malformed stays as it stands, and so does "%00",
/// because no name holds that byte; "+" is an ordinary character.
std::string Decodestring(const std::string& encoded);

} // namespace orva::util

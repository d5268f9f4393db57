#pragma once

#include <string>
#include <string_view>

namespace orva::web {

/// The value of a Content-Disposition header that has a browser save a response as a file named
/// `name`, which may be any bytes. Characters that control the display of the name are replaced.
std::string Attachment(std::string_view name);

} // namespace orva::web

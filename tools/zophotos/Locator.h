#pragma once

#include <string>

namespace orva::zophotos {

/// Path of the merged database, as the daemon's locator file names it now. Throws Failure, which
/// says why there is none.
std::string FindDatabase();

} // namespace orva::zophotos

#pragma once

#include <string>

namespace orva::zophotos {

/// The path of the merged database that the daemon's locator file names at the moment. Throws
/// Failure with the reason if there is none.
std::string FindDatabase();

} // namespace orva::zophotos

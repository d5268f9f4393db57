#pragma once

#include <string>

namespace orva::dbmerger {

/// Publishes in the locator file that the merged database is on the volume at `mountPoint`, which
/// is written as given; an empty one publishes that there is none. A link or a FIFO in the file's
/// place is not written. Failures are ignored.
void updateLocatorFile(const std::string& mountPoint);

} // namespace orva::dbmerger

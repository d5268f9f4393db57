#pragma once

#include <initializer_list>
#include <string>
#include <string_view>

namespace orva::dbmerger {

/// Writes the pieces and a line feed to standard output with one write. A line that cannot be
/// written is lost: a closed output is ignored, and a reader that has stopped reading is waited for
/// once and then loses lines until it reads again. One thread at a time.
void writeLine(std::initializer_list<std::string_view> pieces);

/// Publishes in the locator file that the merged database is on the volume at `mountPoint`, which
/// is written as given; an empty one publishes that there is none. A link or a FIFO in the file's
/// place is not written. Failures are ignored.
void updateLocatorFile(const std::string& mountPoint);

} // namespace orva::dbmerger

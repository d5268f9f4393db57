#pragma once

#include <initializer_list>
#include <string>
#include <string_view>

namespace orva::dbmerger {

/// Writes the pieces and a line feed to standard output with one write. An output that nobody
/// reads costs the line and nothing else: a closed one is ignored, and one whose reader has
/// stopped reading is waited for once and then skipped until it reads again. One thread at a
/// time.
void writeLine(std::initializer_list<std::string_view> pieces);

/// Publishes in the locator file that the merged database is on the volume at `mountPoint`, which
/// is taken as it stands; an empty one publishes that there is none. A link or a FIFO in the
/// file's place is left alone, and a file that cannot be written is passed over silently.
void updateLocatorFile(const std::string& mountPoint);

} // namespace orva::dbmerger

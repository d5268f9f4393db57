#pragma once

#include "WorkWatch.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace orva::catalog {
class VolumeRoot;
}

namespace orva::web {

/// The ids that the catalog of a volume has for the files at `paths`, which are relative to it;
/// nothing for those that it does not have. Only reads: changes nothing on the volume, and needs no
/// right to. The catalog is untrusted. Throws std::string if it cannot be read at the moment.
std::vector<std::optional<std::int64_t>> FindFileIds(const catalog::VolumeRoot& volume,
                                                     const std::vector<std::string>& paths,
                                                     WorkWatch& watch);

} // namespace orva::web

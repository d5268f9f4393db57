#pragma once

#include <optional>
#include <string>

namespace orva::catalog {
class VolumeRoot;
} // namespace orva::catalog

namespace orva::indexer {

/// Whether a program on this machine has the file at `path` open for writing. Nothing where that
/// cannot be found out, as on most network and FUSE file systems. May be called by any thread.
std::optional<bool> IsOpenForWriting(const catalog::VolumeRoot& root, const std::string& path);

} // namespace orva::indexer

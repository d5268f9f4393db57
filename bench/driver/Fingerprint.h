#pragma once

#include <cstdint>
#include <string>

namespace orva::bench {

/// What a merged database says, ids aside: of each table the number of rows and a sum over them
/// that does not depend on their order; and its schema.
struct Fingerprint {
  struct Rows {
    std::uint64_t count = 0;
    std::uint64_t sum = 0;
    bool operator==(const Rows&) const = default;
  };

  Rows folders; ///< path, path of the parent, date, volume
  Rows files;   ///< folder's path, name, dates, volume
  Rows statistics;
  Rows schema;
  bool operator==(const Fingerprint&) const = default;
};

/// Reads the merged database at `path`. Throws std::string.
Fingerprint TakeFingerprint(const std::string& path);

} // namespace orva::bench

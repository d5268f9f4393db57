#pragma once

#include <cstdint>
#include <string>

namespace orva::bench {

/// The content of a merged database without its ids: for each table, and for the schema, the number
/// of rows and a checksum that does not depend on their order.
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

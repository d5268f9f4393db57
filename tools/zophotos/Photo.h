#pragma once

#include <cstdint>
#include <string>

namespace orva::zophotos {

/// A file of the merged database, as the exports print it.
struct Photo {
  std::string path;          ///< full path; bytes, which need not be UTF-8
  std::string volume;        ///< of its folder
  std::int64_t modified = 0; ///< seconds since the epoch, like all times
  std::int64_t created = 0;

  bool operator==(const Photo&) const = default;
};

} // namespace orva::zophotos

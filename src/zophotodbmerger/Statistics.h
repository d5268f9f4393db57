#pragma once

#include <cstdint>
#include <ctime>
#include <string>

namespace orva::dbmerger {

/// What the merged database stores about one volume in addition to its folders and files.
struct Statistics {
  std::string volume;                ///< its mount point
  std::int64_t photos_xcoded = 0;    ///< photos with a finished rendition
  std::int64_t photos_total = 0;     ///< all its photos
  std::time_t last_updated_time = 0; ///< newest transcoding that has been merged
};

} // namespace orva::dbmerger

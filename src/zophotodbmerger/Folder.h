#pragma once

#include <cstdint>
#include <ctime>
#include <string>

namespace orva::dbmerger {

/// A folder of the merged database.
struct Folder {
  std::int64_t folder_id = -1;
  std::int64_t parent_folder_id = -1;
  std::string name;              ///< full path, with a trailing "/"
  std::string folder_name;       ///< last component of the path
  std::time_t modified_date = 0; ///< seconds since the epoch
  std::string volume;            ///< mount point of its volume
};

} // namespace orva::dbmerger

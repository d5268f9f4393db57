#pragma once

#include <cstdint>
#include <ctime>
#include <string>

namespace orva::dbmerger {

/// A file of the merged database.
struct File {
  std::int64_t file_id = -1;
  std::int64_t folder_id = -1;
  std::string name;              ///< without its folder's path
  std::time_t modified_date = 0; ///< seconds since the epoch
  std::string volume;            ///< mount point of its volume
  std::time_t created_date = 0;  ///< seconds since the epoch
};

} // namespace orva::dbmerger

#pragma once

#include <cstdint>
#include <ctime>
#include <string>

namespace orva::dbmerger {

/// The merged database's status row.
struct Status {
  std::int64_t id = -1;
  std::string mc_version = "1.0"; ///< version of the schema
  std::time_t mdate = 0;          ///< last change of the content, seconds since the epoch
  int etype = 0;
  std::string desc;
};

} // namespace orva::dbmerger

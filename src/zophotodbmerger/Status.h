#pragma once

#include <cstdint>
#include <ctime>
#include <string>

namespace orva::dbmerger {

/// The merged database's status row.
struct Status {
  std::int64_t id = -1;
  std::string mc_version = "1.0"; ///< version of the schema
  /// 1000 in a new database, otherwise when the database at the shares root was last emptied;
  /// seconds since the epoch.
  std::time_t mdate = 0;
  int etype = 0;
  std::string desc;
};

} // namespace orva::dbmerger

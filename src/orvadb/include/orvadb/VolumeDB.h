#pragma once

#include "orvadb/DB.h"

#include <string>

namespace orva::db {

/// Connection to the media catalog of one volume.
class VolumeDB : public DB {
public:
  /// Finds and opens the catalog of the volume mounted at `path`. `writable` opens it for
  /// writing and creates it when there is none (its folder must exist); otherwise it is only
  /// read and must exist. Throws std::string.
  VolumeDB(const std::string& path, bool writable);

  /// The mount point as it was given.
  std::string GetPrefix() const override { return prefix_; }

private:
  /// Opens a catalog in WAL mode where SQLite cannot make the shared memory for its log.
  void OpenImmutable(const std::string& catalog);

  std::string prefix_;
};

} // namespace orva::db

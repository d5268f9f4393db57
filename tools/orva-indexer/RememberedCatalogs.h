#pragma once

#include "orvadb/DB.h"

#include <ctime>
#include <optional>
#include <string>

namespace orva::indexer {

/// Which catalog was last announced at a mount point, and up to which stamp, for each master: each
/// has a merged database of its own. Kept in a database of the indexer's own, over restarts.
/// Failures are thrown as std::string.
class RememberedCatalogs {
public:
  struct Catalog {
    std::string identity;
    std::time_t newestStamp = 0;
  };

  /// Opens the database in `directory`; makes it again if it is damaged.
  explicit RememberedCatalogs(const std::string& directory);

  /// The catalog that was last announced at `mountPoint`. `master` is the identity of the catalog
  /// on the master volume.
  std::optional<Catalog> Find(const std::string& master, const std::string& mountPoint) const;

  void Store(const std::string& master, const std::string& mountPoint,
             const Catalog& catalog) const;

  /// The newest stamp of all; 0 if there is none. The clock was there once.
  std::time_t NewestStamp() const;

private:
  void Prepare(const std::string& path);

  db::DB database_;
};

} // namespace orva::indexer

#pragma once

#include "CatalogSchema.h"

#include "orvadb/DB.h"

#include <ctime>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>

namespace orva::indexer {

/// Which catalog was last announced at a mount point, and up to which stamp, for each master: each
/// has a merged database of its own. Kept in a database of the indexer's own, over restarts. While
/// that cannot be used, which is logged once, they are kept in memory. On the program's thread.
class RememberedCatalogs {
public:
  using Catalog = catalog::CatalogState;

  /// Reads the database in `directory`; makes it again if it is damaged.
  explicit RememberedCatalogs(std::string directory);

  /// The catalog that was last announced at `mountPoint`. `master` is the identity of the catalog
  /// on the master volume.
  std::optional<Catalog> Find(const std::string& master, const std::string& mountPoint) const;

  void Store(const std::string& master, const std::string& mountPoint, const Catalog& catalog);

  /// `catalog` was found at `mountPoint`. Forgets for all masters what was announced there of other
  /// catalogs, and of the same one in states that it was not in: it was replaced by a copy of an
  /// earlier time. The catalog of a master may be such a copy, and thus its merged database: then
  /// all that was announced for this master is forgotten.
  void ForgetOthers(const std::string& mountPoint, const db::DB& catalog);

  /// A catalog of ours has this stamp, also if nobody merges it.
  void StoreStamp(std::time_t stamp);

  /// The newest stamp of all; 0 if there is none. The clock was there once.
  std::time_t NewestStamp() const;

private:
  using Key = std::pair<std::string, std::string>; ///< master and mount point

  bool IsMasterReplaced(const std::string& identity, const db::DB& catalog) const;
  void Open();
  void Read(const std::string& path);
  void Save();

  const std::string directory_;
  db::DB database_; ///< closed while it cannot be used
  std::map<Key, Catalog> catalogs_;
  std::time_t newestStamp_ = 0; ///< of StoreStamp
  bool isStampUnsaved_ = false;
  std::set<Key> unsaved_;
  bool hasFailed_ = false;
};

} // namespace orva::indexer

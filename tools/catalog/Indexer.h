#pragma once

#include "FolderIndexer.h"

#include <ctime>
#include <functional>
#include <string>

namespace orva::db {
class DB;
} // namespace orva::db

namespace orva::catalog {

/// Brings the whole catalog of a volume up to date with the files on it. New and changed photos are
/// finished at once. An object makes one run, on the catalog's thread.
class Indexer {
public:
  /// Called with the counts so far, after each folder that contains no others.
  using Progress = std::function<void(const IndexSummary&)>;

  /// `catalog` is open for writing, has its schema and outlives the indexer. `mountPoint` is the
  /// volume that it describes; `now` is the time of the run.
  Indexer(const db::DB& catalog, std::string mountPoint, std::time_t now, Progress progress = {});

  /// Walks the volume and writes every change in one transaction. Throws std::string (database) or
  /// util::Exception (the volume cannot be read).
  IndexSummary Run();

private:
  const db::DB& catalog_;
  const std::string mountPoint_;
  const std::time_t now_;
  const Progress progress_;
};

} // namespace orva::catalog

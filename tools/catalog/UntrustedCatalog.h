#pragma once

#include "orvautil/Exception.h"

#include <ctime>
#include <memory>
#include <string>

namespace orva::db {
class DB;
class VolumeDB;
} // namespace orva::db

namespace orva::catalog {

class VolumeRoot;

/// Why a catalog cannot be used.
enum class CatalogProblem {
  Foreign,  ///< it is damaged, or no program of ours has made it
  NoFolder, ///< its folder is something else than a folder
  ReadOnly, ///< the volume is read-only
  Full,     ///< the volume is full
  Busy,     ///< another program is writing it
  Other     ///< for example, a failure of the medium
};

/// A catalog that cannot be used; what() says why.
class CatalogError : public util::Exception {
public:
  CatalogError(CatalogProblem problem, const std::string& message)
      : Exception(message), problem_(problem) {}

  CatalogProblem Problem() const noexcept { return problem_; }

private:
  CatalogProblem problem_;
};

/// What a failure of the database layer on a catalog means.
CatalogProblem ProblemOf(const std::string& failure);

/// The same for the catalog of this volume, which may have no space for a log.
CatalogProblem ProblemOf(const std::string& failure, const VolumeRoot& volume);

/// Connects to the catalog of a volume that anybody may have prepared, for writing, and checks
/// nothing. Values much longer than ours cannot be read: they would take much memory. Throws
/// std::string.
std::unique_ptr<db::VolumeDB> ConnectToCatalog(const VolumeRoot& volume);

/// Opens the catalog of a volume that anybody may have prepared, for writing. Creates its folder,
/// the catalog and its schema if they are missing. `latest` is the time of the latest stamp that a
/// catalog may have, usually the present. Waits `busyTimeout` milliseconds for other programs.
/// Throws CatalogError.
std::unique_ptr<db::VolumeDB> OpenUntrustedCatalog(const VolumeRoot& volume, std::time_t latest,
                                                   unsigned busyTimeout);

/// Renames the catalog and its logs, which nobody uses any more. Of the catalogs that were renamed
/// before, the latest two are kept. Returns the new name. Throws CatalogError.
std::string SetCatalogAside(const VolumeRoot& volume);

/// Throws CatalogError if an index does not have exactly one entry for each row of its table.
void CheckIndexes(const db::DB& catalog);

} // namespace orva::catalog

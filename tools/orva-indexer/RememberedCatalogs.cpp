#include "RememberedCatalogs.h"

#include "Sql.h"
#include "UntrustedCatalog.h"
#include "service/Log.h"

#include <filesystem>
#include <system_error>

namespace orva::indexer {

using catalog::Execute;
using catalog::SelectNumber;

RememberedCatalogs::RememberedCatalogs(const std::string& directory) {
  std::error_code ignored;
  std::filesystem::create_directories(directory, ignored);
  const std::string path = directory + "/catalogs.db";
  try {
    Prepare(path);
  } catch (const std::string& failure) {
    if (catalog::ProblemOf(failure) != catalog::CatalogProblem::Foreign) {
      throw;
    }
    // Every catalog will be announced as purged, which is always right.
    service::LogError("The catalogs that were announced are not known any more: " +
                      service::Printable(failure));
    database_.Close();
    for (const char* const suffix : {"", "-journal", "-wal", "-shm"}) {
      std::filesystem::remove(path + suffix, ignored);
    }
    Prepare(path);
  }
}

void RememberedCatalogs::Prepare(const std::string& path) {
  database_.Open(path);
  Execute(database_,
          "CREATE TABLE IF NOT EXISTS Catalogs(master TEXT NOT NULL, mountPoint TEXT NOT NULL, "
          "identity TEXT NOT NULL, newestStamp INTEGER NOT NULL, PRIMARY KEY(master, mountPoint))");
  SelectNumber(database_, "SELECT count(*) FROM Catalogs");
}

std::optional<RememberedCatalogs::Catalog>
RememberedCatalogs::Find(const std::string& master, const std::string& mountPoint) const {
  db::Statement row(database_, "SELECT identity, newestStamp FROM Catalogs "
                               "WHERE master = ? AND mountPoint = ?");
  row.BindText(1, master);
  row.BindText(2, mountPoint);
  if (!row.Fetch()) {
    return std::nullopt;
  }
  return Catalog{.identity = row.GetText(0), .newestStamp = row.GetTime(1)};
}

void RememberedCatalogs::Store(const std::string& master, const std::string& mountPoint,
                               const Catalog& catalog) const {
  Execute(database_,
          "INSERT OR REPLACE INTO Catalogs(master, mountPoint, identity, newestStamp) "
          "VALUES(?, ?, ?, ?)",
          master, mountPoint, catalog.identity, catalog.newestStamp);
}

std::time_t RememberedCatalogs::NewestStamp() const {
  return SelectNumber(database_, "SELECT max(newestStamp) FROM Catalogs");
}

} // namespace orva::indexer

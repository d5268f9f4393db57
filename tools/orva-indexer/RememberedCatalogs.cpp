#include "RememberedCatalogs.h"

#include "Sql.h"
#include "UntrustedCatalog.h"
#include "service/Log.h"

#include <algorithm>
#include <filesystem>
#include <system_error>

namespace orva::indexer {

using catalog::Execute;

RememberedCatalogs::RememberedCatalogs(std::string directory) : directory_(std::move(directory)) {
  Save();
}

std::optional<RememberedCatalogs::Catalog>
RememberedCatalogs::Find(const std::string& master, const std::string& mountPoint) const {
  const auto found = catalogs_.find({master, mountPoint});
  return found == catalogs_.end() ? std::nullopt : std::optional(found->second);
}

void RememberedCatalogs::Store(const std::string& master, const std::string& mountPoint,
                               const Catalog& catalog) {
  const Key key(master, mountPoint);
  Catalog& stored = catalogs_[key];
  if (stored != catalog) {
    stored = catalog;
    unsaved_.insert(key);
  }
  if (!unsaved_.empty()) {
    Save();
  }
}

/// The stamps stay: they say how late it may be.
void RememberedCatalogs::ForgetOthers(const std::string& mountPoint, const db::DB& catalog) {
  const std::string identity = catalog::Identity(catalog);
  const bool isMasterReplaced = IsMasterReplaced(identity, catalog);
  for (auto& [key, stored] : catalogs_) {
    const auto& [master, place] = key;
    const bool isOther = place == mountPoint && !catalog::HasBeenIn(catalog, stored);
    if (!stored.identity.empty() && (isOther || (isMasterReplaced && master == identity))) {
      stored.identity.clear();
      unsaved_.insert(key);
    }
  }
  if (!unsaved_.empty()) {
    Save();
  }
}

bool RememberedCatalogs::IsMasterReplaced(const std::string& identity,
                                          const db::DB& catalog) const {
  return std::ranges::any_of(catalogs_, [&](const auto& entry) {
    return entry.first.first == identity && entry.second.identity == identity &&
           !catalog::HasBeenIn(catalog, entry.second);
  });
}

void RememberedCatalogs::StoreStamp(std::time_t stamp) {
  if (stamp > NewestStamp()) {
    newestStamp_ = stamp;
    isStampUnsaved_ = true;
  }
  if (isStampUnsaved_) {
    Save();
  }
}

std::time_t RememberedCatalogs::NewestStamp() const {
  std::time_t newest = newestStamp_;
  for (const auto& [key, catalog] : catalogs_) {
    newest = std::max(newest, catalog.newestStamp);
  }
  return newest;
}

/// If that fails, the volumes are announced as purged after a restart, which is always right.
void RememberedCatalogs::Save() {
  try {
    if (database_.GetPath().empty()) {
      Open();
    }
    for (auto key = unsaved_.begin(); key != unsaved_.end(); key = unsaved_.erase(key)) {
      const Catalog& catalog = catalogs_.at(*key);
      Execute(database_,
              "INSERT OR REPLACE INTO Catalogs(master, mountPoint, identity, newestStamp, "
              "mark) VALUES(?, ?, ?, ?, ?)",
              key->first, key->second, catalog.identity, catalog.newestStamp, catalog.mark);
    }
    if (isStampUnsaved_) {
      Execute(database_, "INSERT OR REPLACE INTO Clock(id, newestStamp) VALUES(0, ?)",
              newestStamp_);
      isStampUnsaved_ = false;
    }
    hasFailed_ = false;
  } catch (const std::string& failure) {
    database_.Close();
    if (!std::exchange(hasFailed_, true)) {
      service::LogError(directory_ + " cannot be used. After a restart, all volumes are merged " +
                        "from the beginning: " + service::Printable(failure));
    }
  }
}

void RememberedCatalogs::Open() {
  std::error_code ignored;
  std::filesystem::create_directories(directory_, ignored);
  const std::string path = directory_ + "/catalogs.db";
  try {
    Read(path);
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
    Read(path);
  }
}

/// Creates the database if there is none. What is known already is newer.
void RememberedCatalogs::Read(const std::string& path) {
  database_.Open(path);
  Execute(database_,
          "CREATE TABLE IF NOT EXISTS Catalogs(master TEXT NOT NULL, mountPoint TEXT NOT NULL, "
          "identity TEXT NOT NULL, newestStamp INTEGER NOT NULL, mark INTEGER NOT NULL, "
          "PRIMARY KEY(master, mountPoint))");
  Execute(database_, "CREATE TABLE IF NOT EXISTS Clock(id INTEGER PRIMARY KEY, "
                     "newestStamp INTEGER NOT NULL)");
  newestStamp_ = std::max<std::time_t>(
      newestStamp_, catalog::SelectNumber(database_, "SELECT newestStamp FROM Clock"));
  std::map<Key, Catalog> stored;
  catalog::ForEachRow(database_,
                      "SELECT master, mountPoint, identity, newestStamp, mark FROM Catalogs",
                      [&stored](const db::Statement& row) {
                        stored[{row.GetText(0), row.GetText(1)}] = {.identity = row.GetText(2),
                                                                    .newestStamp = row.GetTime(3),
                                                                    .mark = row.GetInt64(4)};
                      });
  catalogs_.merge(stored);
}

} // namespace orva::indexer

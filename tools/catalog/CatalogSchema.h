#pragma once

#include <chrono>
#include <ctime>
#include <memory>
#include <string>

namespace orva::db {
class DB;
class VolumeDB;
} // namespace orva::db

// The media catalog of a volume; doc/catalog.md describes it. Failures of the database are thrown
// as std::string, others as orva::util::Exception. Each connection belongs to one thread.
namespace orva::catalog {

/// How long a transaction waits for another indexer, in milliseconds.
inline constexpr unsigned BUSY_TIMEOUT = 5000;

/// Opens the catalog of the volume at `mountPoint` for writing. Creates its folder and its schema
/// if they are missing.
std::unique_ptr<db::VolumeDB> OpenCatalog(const std::string& mountPoint);

/// Whether every table, index, trigger and view of the catalog is one that this program would have
/// made, with the same definition. In others, writing a row may do anything.
bool HasOwnSchema(const db::DB& catalog);

/// Whether the catalog with our schema has all indexes.
bool HasIndexes(const db::DB& catalog);

/// Creates the tables, indexes and the identity that are missing. Waits `busyTimeout` milliseconds
/// for other programs.
void CreateSchema(const db::DB& catalog, unsigned busyTimeout = BUSY_TIMEOUT);

/// The two halves of CreateSchema: rows are inserted faster while there are no indexes.
void CreateTables(const db::DB& catalog);
void CreateIndexes(const db::DB& catalog);

/// Drops the tables that describe the volume's content. The identity and the newest stamp stay.
void DropTables(const db::DB& catalog);

/// A random text that tells this catalog from all others, also when it is mounted elsewhere. The
/// content of a catalog with another identity has nothing to do with this one's.
std::string Identity(const db::DB& catalog);

/// Gives the catalog another identity: its content is replaced by another.
void RenewIdentity(const db::DB& catalog);

/// What tells a catalog from copies of it of an earlier time, and from what was made of these.
struct CatalogState {
  std::string identity{}; ///< empty: not known
  std::time_t newestStamp = 0;
  long long mark = 0; ///< the random number that was given out with this stamp; 0: there is none

  bool operator==(const CatalogState&) const = default;
};

/// The present state of the catalog.
CatalogState StateOf(const db::DB& catalog);

/// Whether the catalog was in `state` once. Only the latest thousand stamps are known.
bool HasBeenIn(const db::DB& catalog, const CatalogState& state);

/// The newest stamp that was given out, seconds since the epoch; 0 in a new catalog.
std::time_t NewestStamp(const db::DB& catalog);

/// Gives out the stamp for changes made at `now`, inside the caller's transaction. It is later than
/// every stamp in the catalog, also within one second and after the clock was set back: a reader
/// looks for later stamps than it has seen.
std::time_t NextStamp(const db::DB& catalog, std::time_t now);

/// How long a service waits after a commit at `now` that took `stamp`, before it takes another one.
/// So stamps stay close to the clock: catalogs with stamps far in the future are refused.
std::chrono::seconds PauseAfterStamp(std::time_t stamp, std::time_t now);

/// Moves all commits from the write-ahead log into the catalog's file, unless a reader still needs
/// the log. A volume that is mounted read-only afterwards can then be read without it.
void Checkpoint(const db::DB& catalog);

} // namespace orva::catalog

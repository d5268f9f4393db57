#pragma once

#include <ctime>
#include <memory>
#include <string>

namespace orva::db {
class DB;
class VolumeDB;
} // namespace orva::db

// The media catalog of a volume; doc/catalog.md describes it. Failures of the database are thrown
// as std::string, others as orva::util::Exception. One thread for each connection.
namespace orva::catalog {

/// How long a transaction waits for another indexer, in milliseconds.
inline constexpr unsigned BUSY_TIMEOUT = 5000;

/// Opens the catalog of the volume at `mountPoint` for writing, with its folder and schema, which
/// are made where they are missing.
std::unique_ptr<db::VolumeDB> OpenCatalog(const std::string& mountPoint);

/// Creates the tables and indices that are missing.
void CreateSchema(const db::DB& catalog);

/// The two halves of CreateSchema: rows go in faster while the indices are not there.
void CreateTables(const db::DB& catalog);
void CreateIndices(const db::DB& catalog);

/// Drops the tables with everything in them.
void DropTables(const db::DB& catalog);

/// The stamp for changes made at `now`: later than every stamp in the catalog, even within one
/// second or after the clock was set back, so that a reader that has seen all of those sees these.
std::time_t NextStamp(const db::DB& catalog, std::time_t now);

/// Moves what was committed from the write-ahead log into the catalog's file, unless a reader
/// holds on to it: a volume that is made read only next is then readable without the log.
void Checkpoint(const db::DB& catalog);

} // namespace orva::catalog

// Compares a statement of the database layer, which compiles a text once, with one of SQLite's C
// interface, compiled for each use.

#include "orvadb/DB.h"
#include "orvadb/Statement.h"

#include <benchmark/benchmark.h>

#include <sqlite3.h>

#include <string>

namespace orva::bench {
namespace {

const char* const TABLE = "CREATE TABLE Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, "
                          "parent_folder_id INTEGER NOT NULL, name TEXT NOT NULL, modified_date "
                          "INTEGER NOT NULL, volume TEXT NOT NULL)";
const char* const INDEX = "CREATE INDEX Folders_path ON Folders(name)";
const char* const ROW = "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) "
                        "VALUES(1, '/shares/A/Pictures/', 0, '/shares/A/')";
const char* const QUERY = "select * FROM Folders where name = ?";
const std::string PATH = "/shares/A/Pictures/";

/// A database in a file in /tmp, which is in memory.
class OneFolder : public db::DB {
public:
  OneFolder() {
    Open("/tmp/micro.db");
    for (const char* const sql : {"DROP TABLE IF EXISTS Folders", TABLE, INDEX, ROW}) {
      db::Statement(*this, sql).Execute();
    }
  }

  using db::DB::Handle;
};

void KeptStatement(benchmark::State& state) {
  const OneFolder database;
  while (state.KeepRunning()) {
    db::Statement query(database, QUERY);
    query.BindText(1, PATH);
    if (!query.Fetch()) {
      state.SkipWithError("no row");
    }
    benchmark::DoNotOptimize(query.GetInt64(0));
  }
}

void CompiledStatement(benchmark::State& state) {
  const OneFolder database;
  while (state.KeepRunning()) {
    sqlite3_stmt* query = nullptr;
    sqlite3_prepare_v2(database.Handle(), QUERY, -1, &query, nullptr);
    sqlite3_bind_text(query, 1, PATH.data(), static_cast<int>(PATH.size()), SQLITE_STATIC);
    if (sqlite3_step(query) != SQLITE_ROW) {
      state.SkipWithError("no row");
    }
    benchmark::DoNotOptimize(sqlite3_column_int64(query, 0));
    sqlite3_finalize(query);
  }
}

BENCHMARK(KeptStatement)->Name("statement kept, or compiled each time/ours");
BENCHMARK(CompiledStatement)->Name("statement kept, or compiled each time/theirs");

} // namespace
} // namespace orva::bench

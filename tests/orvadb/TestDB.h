#pragma once

#include "orvadb/DB.h"

#include <sqlite3.h>

#include <stdexcept>
#include <string>
#include <vector>

namespace orva::test {

/// A database whose connection a test may look at.
class TestDB : public db::DB {
public:
  TestDB() = default;
  explicit TestDB(const std::string& path) { Open(path); }

  using DB::Access;
  using DB::Create;
  using DB::Handle;
  using DB::Open;

  /// Runs `sql` on the layer's connection without its statements. Returns the first column.
  std::vector<std::string> Rows(const std::string& sql) const {
    std::vector<std::string> rows;
    const auto collect = [](void* place, int /*count*/, char** values, char** /*names*/) {
      static_cast<std::vector<std::string>*>(place)->emplace_back(values[0] == nullptr ? "NULL"
                                                                                       : values[0]);
      return 0;
    };
    if (sqlite3_exec(Handle(), sql.c_str(), collect, &rows, nullptr) != SQLITE_OK) {
      throw std::runtime_error(sqlite3_errmsg(Handle()) + (" in " + sql));
    }
    return rows;
  }

  /// The compiled statements that the connection has.
  std::vector<sqlite3_stmt*> Compiled() const {
    std::vector<sqlite3_stmt*> statements;
    for (sqlite3_stmt* each = sqlite3_next_stmt(Handle(), nullptr); each != nullptr;
         each = sqlite3_next_stmt(Handle(), each)) {
      statements.push_back(each);
    }
    return statements;
  }
};

} // namespace orva::test

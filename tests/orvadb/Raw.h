#pragma once

#include "orvadb/DB.h"

#include <sqlite3.h>

#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

namespace orva::test {

/// Runs `sql` on a plain connection and returns its result code; the rows of its first column go
/// to `rows`.
inline int Try(sqlite3* handle, const std::string& sql, std::vector<std::string>* rows = nullptr) {
  const auto collect = [](void* place, int /*count*/, char** values, char** /*names*/) {
    if (place != nullptr) {
      static_cast<std::vector<std::string>*>(place)->emplace_back(values[0] == nullptr ? "NULL"
                                                                                       : values[0]);
    }
    return 0;
  };
  return sqlite3_exec(handle, sql.c_str(), collect, rows, nullptr);
}

/// The same, which must succeed; returns the first column.
inline std::vector<std::string> Query(sqlite3* handle, const std::string& sql) {
  std::vector<std::string> rows;
  if (Try(handle, sql, &rows) != SQLITE_OK) {
    throw std::runtime_error(sqlite3_errmsg(handle) + (" in " + sql));
  }
  return rows;
}

/// Another program's connection, without a busy time-out.
class Raw {
public:
  explicit Raw(const std::string& path) {
    if (sqlite3_open(path.c_str(), &handle_) != SQLITE_OK) {
      sqlite3_close(handle_);
      throw std::runtime_error("cannot open " + path);
    }
  }
  Raw(const Raw&) = delete;
  Raw& operator=(const Raw&) = delete;
  ~Raw() { sqlite3_close(handle_); }

  operator sqlite3*() const { return handle_; }

private:
  sqlite3* handle_ = nullptr;
};

/// A database whose connection a test may look at.
class TestDB : public db::DB {
public:
  TestDB() = default;
  explicit TestDB(const std::string& path) { Open(path); }

  using DB::Access;
  using DB::Create;
  using DB::Handle;
  using DB::Open;

  /// Runs `sql` behind the layer's back; returns the first column.
  std::vector<std::string> Rows(const std::string& sql) const { return Query(Handle(), sql); }

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

/// The std::string that `action` throws; "nothing thrown" when it throws none.
inline std::string Thrown(const std::function<void()>& action) {
  try {
    action();
  } catch (const std::string& message) {
    return message;
  }
  return "nothing thrown";
}

} // namespace orva::test

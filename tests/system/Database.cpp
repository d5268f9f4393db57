#include "Database.h"

#include <sqlite3.h>

#include <stdexcept>

namespace orva::test {

namespace {

struct Finalizer {
  void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
};

std::string Row(sqlite3_stmt* statement) {
  std::string row;
  for (int column = 0; column < sqlite3_column_count(statement); ++column) {
    const unsigned char* text = sqlite3_column_text(statement, column);
    row += column == 0 ? "" : "|";
    row += text == nullptr ? "NULL" : reinterpret_cast<const char*>(text);
  }
  return row;
}

} // namespace

void Database::Closer::operator()(sqlite3* handle) const {
  sqlite3_close(handle);
}

Database::Database(const std::string& path, bool create) {
  sqlite3* handle = nullptr;
  const int flags = SQLITE_OPEN_READWRITE | (create ? SQLITE_OPEN_CREATE : 0);
  const int code = sqlite3_open_v2(path.c_str(), &handle, flags, nullptr);
  handle_.reset(handle);
  if (code != SQLITE_OK) {
    throw std::runtime_error(path + ": " + sqlite3_errmsg(handle));
  }
  sqlite3_busy_timeout(handle, 60'000);
}

std::vector<std::string> Database::Run(const std::string& sql, const Values& values) const {
  sqlite3_stmt* prepared = nullptr;
  sqlite3_prepare_v2(handle_.get(), sql.c_str(), -1, &prepared, nullptr);
  const std::unique_ptr<sqlite3_stmt, Finalizer> statement(prepared);
  for (std::size_t i = 0; i < values.size(); ++i) {
    sqlite3_bind_text(prepared, static_cast<int>(i + 1), values[i].data(),
                      static_cast<int>(values[i].size()), SQLITE_STATIC);
  }
  std::vector<std::string> rows;
  int code = prepared == nullptr ? SQLITE_ERROR : sqlite3_step(prepared);
  for (; code == SQLITE_ROW; code = sqlite3_step(prepared)) {
    rows.push_back(Row(prepared));
  }
  if (code != SQLITE_DONE) {
    throw std::runtime_error(sql + ": " + sqlite3_errmsg(handle_.get()));
  }
  return rows;
}

} // namespace orva::test

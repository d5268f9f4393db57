#include "orvadb/Connection.h"

#include "orvautil/FormatString.h"

#include <sqlite3.h>

namespace orva::db {

void StatementFinalizer::operator()(sqlite3_stmt* statement) const noexcept {
  sqlite3_finalize(statement);
}

void Connection::CheckIn::operator()(sqlite3_stmt* statement) const noexcept {
  // A failed step was reported when it was made; reset only repeats its code.
  sqlite3_reset(statement);
  sqlite3_clear_bindings(statement);
  place->reset(statement);
}

Connection::CheckedOut Connection::CheckOut(const char* sql, const char* file, unsigned line) {
  const auto kept = statements_.find(std::string_view(sql));
  Compiled& place = kept != statements_.end() ? kept->second : statements_[sql];
  Compiled compiled = place ? std::move(place) : Compile(sql, file, line);
  return {compiled.release(), CheckIn{&place}};
}

Connection::Compiled Connection::Compile(const char* sql, const char* file, unsigned line) const {
  sqlite3_stmt* statement = nullptr;
  const int code =
      sqlite3_prepare_v3(handle_, sql, -1, SQLITE_PREPARE_PERSISTENT, &statement, nullptr);
  Compiled compiled(statement);
  if (code != SQLITE_OK) {
    throw ErrorMessage(handle_, sql, file, line);
  }
  return compiled;
}

std::string ErrorMessage(sqlite3* handle, const char* sql, const char* file, unsigned line) {
  return util::FormatString("%s:%u: %s (extended code %d) in \"%s\"", file, line,
                            sqlite3_errmsg(handle), sqlite3_extended_errcode(handle), sql);
}

} // namespace orva::db

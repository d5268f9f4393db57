#pragma once

#include "orvadb/DB.h"
#include "orvadb/Statement.h"

#include <concepts>
#include <string>

namespace orva::catalog {

/// A statement's text and the place in the source that uses it, for error messages. Not explicit,
/// so that a call can pass a string literal.
struct Sql {
  Sql(const char* sql, const char* callersFile = __builtin_FILE(),
      unsigned callersLine = __builtin_LINE()) noexcept
      : text(sql), file(callersFile), line(callersLine) {}

  const char* text;
  const char* file;
  unsigned line;
};

inline void Bind(db::Statement& statement, int index, const std::string& value, const Sql& sql) {
  statement.BindText(index, value, sql.file, sql.line);
}

inline void Bind(db::Statement& statement, int index, std::integral auto value, const Sql& sql) {
  statement.BindInt64(index, static_cast<long long>(value), sql.file, sql.line);
}

/// Binds `values` to the parameters 1, 2, ... of `statement`. Throws std::string.
template <typename... Values>
void BindAll(db::Statement& statement, const Sql& sql, const Values&... values) {
  int index = 0;
  (Bind(statement, ++index, values, sql), ...);
}

/// Runs a statement without a result on `catalog`. Throws std::string.
template <typename... Values>
void Execute(const db::DB& catalog, const Sql& sql, const Values&... values) {
  db::Statement statement(catalog, sql.text, sql.file, sql.line);
  BindAll(statement, sql, values...);
  statement.Execute(sql.file, sql.line);
}

/// Calls `visit(statement)` for each row of a query without parameters. Throws std::string.
template <typename Visit>
void ForEachRow(const db::DB& catalog, const Sql& sql, Visit visit) {
  db::Statement statement(catalog, sql.text, sql.file, sql.line);
  while (statement.Fetch(sql.file, sql.line)) {
    visit(statement);
  }
}

/// The number in the first column of the first row; 0 when there is none. Throws std::string.
template <typename... Values>
long long SelectNumber(const db::DB& catalog, const Sql& sql, const Values&... values) {
  db::Statement statement(catalog, sql.text, sql.file, sql.line);
  BindAll(statement, sql, values...);
  return statement.Fetch(sql.file, sql.line) ? statement.GetInt64(0) : 0;
}

} // namespace orva::catalog

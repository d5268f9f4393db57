#include "orvadb/Statement.h"

#include "orvadb/DB.h"
#include "orvadb/ErrorMessage.h"

#include <sqlite3.h>

#include <cstddef>

namespace orva::db {

static_assert(Statement::ROW == SQLITE_ROW && Statement::DONE == SQLITE_DONE);

Statement::Statement(const DB& db, const char* sql, const char* file, unsigned int line)
    : connection_(db.OpenConnection(sql, file, line)),
      statement_(connection_.CheckOut(sql, file, line)) {}

Statement::Statement(const DB& db, const char* sql, Rows& rows, const char* file, unsigned int line)
    : connection_(db.OpenConnection(sql, file, line)),
      statement_(connection_.CheckOut(sql, rows, file, line)) {}

int Statement::Step(const char* file, unsigned int line) {
  return connection_.Step(statement_, file, line);
}

bool Statement::Fetch(const char* file, unsigned int line) {
  const int code = Step(file, line);
  if (code != ROW && code != DONE) {
    throw ErrorMessage(statement_.get(), file, line);
  }
  return code == ROW;
}

void Statement::Execute(const char* file, unsigned int line) {
  while (Fetch(file, line)) {
  }
}

void Statement::BindInt(int index, int value, const char* file, unsigned int line) {
  CheckBind(sqlite3_bind_int(statement_.get(), index, value), file, line);
}

void Statement::BindInt64(int index, long long value, const char* file, unsigned int line) {
  CheckBind(sqlite3_bind_int64(statement_.get(), index, value), file, line);
}

void Statement::BindText(int index, const std::string& value, const char* file, unsigned int line) {
  CheckBind(sqlite3_bind_text64(statement_.get(), index, value.data(), value.size(),
                                SQLITE_TRANSIENT, SQLITE_UTF8),
            file, line);
}

void Statement::BindTextView(int index, std::string_view value, const char* file,
                             unsigned int line) {
  CheckBind(sqlite3_bind_text64(statement_.get(), index, value.data(), value.size(), SQLITE_STATIC,
                                SQLITE_UTF8),
            file, line);
}

void Statement::BindTime(int index, long value, const char* file, unsigned int line) {
  BindInt64(index, value, file, line);
}

int Statement::GetInt(int column) const {
  return sqlite3_column_int(statement_.get(), column);
}

long long Statement::GetInt64(int column) const {
  return sqlite3_column_int64(statement_.get(), column);
}

bool Statement::IsText(int column) const {
  return sqlite3_column_type(statement_.get(), column) == SQLITE_TEXT;
}

bool Statement::IsInteger(int column) const {
  return sqlite3_column_type(statement_.get(), column) == SQLITE_INTEGER;
}

std::string Statement::GetText(int column) const {
  return std::string(GetTextView(column));
}

std::string_view Statement::GetTextView(int column) const {
  const unsigned char* const text = sqlite3_column_text(statement_.get(), column);
  if (text == nullptr) {
    if (sqlite3_errcode(sqlite3_db_handle(statement_.get())) == SQLITE_NOMEM) {
      throw ErrorMessage(statement_.get());
    }
    return {};
  }
  return {reinterpret_cast<const char*>(text),
          static_cast<std::size_t>(sqlite3_column_bytes(statement_.get(), column))};
}

std::time_t Statement::GetTime(int column) const {
  return sqlite3_column_int64(statement_.get(), column);
}

bool Statement::GetBool(int column) const {
  return sqlite3_column_int64(statement_.get(), column) != 0;
}

void Statement::CheckBind(int code, const char* file, unsigned int line) const {
  if (code != SQLITE_OK) {
    throw ErrorMessage(statement_.get(), file, line);
  }
}

} // namespace orva::db

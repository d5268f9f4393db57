#include "orvadb/Statement.h"

#include "orvadb/DB.h"

#include "orvautil/FormatString.h"

#include <sqlite3.h>

#include <cstddef>

namespace orva::db {

static_assert(Statement::ROW == SQLITE_ROW && Statement::DONE == SQLITE_DONE);

namespace {

Connection& OpenConnection(Connection* connection, sqlite3* handle, const char* sql,
                           const char* file, unsigned int line) {
  if (connection == nullptr) {
    throw util::FormatString("%s:%u: database not open in \"%s\"", file, line, sql);
  }
  // SQLite rolls back by itself after some failures. What the transaction's owner still does would
  // then be written at once, statement by statement.
  if (connection->transaction != 0 && sqlite3_get_autocommit(handle) != 0) {
    throw util::FormatString("%s:%u: \"%s\" in a transaction that was rolled back: %s", file, line,
                             sql, connection->failedStep.c_str());
  }
  return *connection;
}

} // namespace

Statement::Statement(const DB& db, const char* sql, const char* file, unsigned int line)
    : db_(db), statement_(OpenConnection(db.connection_.get(), db.handle_, sql, file, line)
                              .CheckOut(sql, file, line)) {}

int Statement::Step(const char* file, unsigned int line) {
  const int code = sqlite3_step(statement_.get());
  if (code == SQLITE_ROW || code == SQLITE_DONE || code == SQLITE_OK) {
    return code;
  }
  std::string& failedStep = db_.connection_->failedStep;
  if (failedStep.empty()) {
    failedStep = ErrorMessage(db_.handle_, sqlite3_sql(statement_.get()), file, line);
  }
  return code;
}

bool Statement::Fetch(const char* file, unsigned int line) {
  const int code = Step(file, line);
  if (code != ROW && code != DONE) {
    throw ErrorMessage(db_.handle_, sqlite3_sql(statement_.get()), file, line);
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

int Statement::TakeCost() const {
  return sqlite3_stmt_status(statement_.get(), SQLITE_STMTSTATUS_VM_STEP, 1);
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

bool Statement::IsNull(int column) const {
  return sqlite3_column_type(statement_.get(), column) == SQLITE_NULL;
}

std::string Statement::GetText(int column) const {
  return std::string(GetTextView(column));
}

std::string_view Statement::GetTextView(int column) const {
  const unsigned char* const text = sqlite3_column_text(statement_.get(), column);
  if (text == nullptr) {
    if (sqlite3_errcode(db_.handle_) == SQLITE_NOMEM) {
      throw ErrorMessage(db_.handle_, sqlite3_sql(statement_.get()), __FILE__, __LINE__);
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
    throw ErrorMessage(db_.handle_, sqlite3_sql(statement_.get()), file, line);
  }
}

} // namespace orva::db

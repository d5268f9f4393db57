#include "orvadb/Connection.h"

#include "WorkLimit.h"

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

Connection::Connection(sqlite3* handle, int busyTimeout, long long bytes)
    : handle_(handle), busyTimeout_(busyTimeout),
      workLimit_(std::make_unique<WorkLimit>(handle, bytes)) {}

Connection::~Connection() = default;

void Connection::SetFileSize(long long bytes) noexcept {
  workLimit_->SetFileSize(bytes);
}

Connection::CheckedOut Connection::CheckOut(const char* sql, const char* file, unsigned line) {
  workLimit_->Restart();
  const auto kept = statements_.find(std::string_view(sql));
  Compiled& place = kept != statements_.end() ? kept->second : statements_[sql];
  Compiled compiled = place ? std::move(place) : Compile(sql, file, line);
  return {compiled.release(), CheckIn{&place}};
}

Connection::Compiled Connection::Compile(const char* sql, const char* file, unsigned line) const {
  sqlite3_stmt* statement = nullptr;
  // A virtual table would run a module's code on a stranger's data.
  const int code = sqlite3_prepare_v3(
      handle_, sql, -1, SQLITE_PREPARE_PERSISTENT | SQLITE_PREPARE_NO_VTAB, &statement, nullptr);
  Compiled compiled(statement);
  if (code != SQLITE_OK) {
    throw ErrorMessage(handle_, sql, file, line);
  }
  return compiled;
}

std::string ErrorMessage(sqlite3* handle, const char* sql, const char* file, unsigned line) {
  const int code = sqlite3_extended_errcode(handle);
  // Nobody else interrupts.
  const char* const reason = code == SQLITE_INTERRUPT
                                 ? "more work than a database of this size can need"
                                 : sqlite3_errmsg(handle);
  // A name in a stranger's schema may be of any length, but no line of the system log may be.
  return util::FormatString("%s:%u: %.500s (extended code %d) in \"%.500s\"", file, line, reason,
                            code, sql);
}

} // namespace orva::db

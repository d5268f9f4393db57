#include "orvadb/Connection.h"

#include "DatabaseVfs.h"
#include "MemoryTable.h"
#include "WorkLimit.h"

#include "orvadb/ErrorMessage.h"

#include "orvautil/FormatString.h"

#include <sqlite3.h>

#include <algorithm>
#include <array>
#include <utility>

namespace orva::db {

namespace {

/// Whether `sql` may change the schema, or a setting that SQLite compiles statements with:
/// everything but the statements on rows and most of those on transactions.
bool MayChangeSchema(const char* sql) {
  return std::ranges::none_of(
      std::to_array<std::string_view>({"SELECT", "INSERT", "UPDATE", "DELETE", "BEGIN", "COMMIT"}),
      [sql](std::string_view word) {
        return sqlite3_strnicmp(sql, word.data(), static_cast<int>(word.size())) == 0;
      });
}

/// Counts the requests for pages of the file so far.
std::pair<int, int> PageRequests(sqlite3* handle) {
  int hits = 0;
  int misses = 0;
  int highest = 0;
  sqlite3_db_status(handle, SQLITE_DBSTATUS_CACHE_HIT, &hits, &highest, 0);
  sqlite3_db_status(handle, SQLITE_DBSTATUS_CACHE_MISS, &misses, &highest, 0);
  return {hits, misses};
}

} // namespace

void StatementFinalizer::operator()(sqlite3_stmt* statement) const noexcept {
  sqlite3_finalize(statement);
}

void Connection::CheckIn::operator()(sqlite3_stmt* statement) const noexcept {
  // A failed step was reported when it was made; reset only repeats its code.
  sqlite3_reset(statement);
  sqlite3_clear_bindings(statement);
  place->statement.reset(statement);
  place->schema = schema;
}

Connection::Connection(sqlite3* handle, int busyTimeout, const DatabaseVfs& vfs)
    : handle_(handle), busyTimeout_(busyTimeout),
      workLimit_(std::make_unique<WorkLimit>(handle, vfs)) {
  sqlite3_busy_timeout(handle_, busyTimeout_);
}

Connection::~Connection() = default;

bool Connection::IsReadOnly() const noexcept {
  return sqlite3_db_readonly(handle_, "main") == 1;
}

Connection::CheckedOut Connection::CheckOut(const char* sql, const char* file, unsigned int line) {
  // A virtual table would run a module's code on untrusted data.
  return CheckOut(sql, SQLITE_PREPARE_PERSISTENT | SQLITE_PREPARE_NO_VTAB, file, line);
}

Connection::CheckedOut Connection::CheckOut(const char* sql, Rows& rows, const char* file,
                                            unsigned int line) {
  if (!memoryTable_) {
    memoryTable_ = std::make_unique<MemoryTable>(handle_, *workLimit_);
  }
  memoryTable_->Provide(rows);
  return CheckOut(sql, SQLITE_PREPARE_PERSISTENT, file, line);
}

Connection::CheckedOut Connection::CheckOut(const char* sql, unsigned flags, const char* file,
                                            unsigned int line) {
  // SQLite rolls back by itself after some failures. It would commit every later statement of the
  // transaction's owner at once.
  if (inTransaction_ && sqlite3_get_autocommit(handle_) != 0) {
    throw ErrorMessage(util::FormatString("\"%s\" in a transaction that was rolled back: %s", sql,
                                          failedStep_.c_str()),
                       file, line);
  }
  workLimit_->Restart();
  DatabaseVfs::ForgetRefusal(); // of a statement that went on without the file
  const auto kept = statements_.find(std::string_view(sql));
  Kept& place = kept != statements_.end() ? kept->second : statements_[sql];
  Compiled compiled = std::move(place.statement);
  if (!compiled || place.schema != schema_) {
    place.mayChangeSchema = MayChangeSchema(sql);
    compiled = Compile(sql, flags, file, line);
  }
  return {compiled.release(), CheckIn{.place = &place, .schema = schema_}};
}

Connection::Compiled Connection::Compile(const char* sql, unsigned flags, const char* file,
                                         unsigned int line) {
  const auto requestsBefore = PageRequests(handle_);
  sqlite3_stmt* statement = nullptr;
  const int code = sqlite3_prepare_v3(handle_, sql, -1, flags, &statement, nullptr);
  Compiled compiled(statement);
  // Compiling reads pages only to load the schema.
  if (PageRequests(handle_) != requestsBefore) {
    ++schema_;
  }
  if (code != SQLITE_OK) {
    throw ErrorMessage(handle_, sql, file, line);
  }
  return compiled;
}

int Connection::Step(const CheckedOut& statement, const char* file, unsigned int line) {
  if (HasFailedToRead()) {
    return SQLITE_ABORT;
  }
  const int code = sqlite3_step(statement.get());
  const bool failed = code != SQLITE_ROW && code != SQLITE_DONE;
  if (failed && failedStep_.empty()) {
    failedStep_ = ErrorMessage(statement.get(), file, line);
  }
  // The first step compiles the statement again if another program has changed the schema.
  if (failed || statement.get_deleter().place->mayChangeSchema ||
      sqlite3_stmt_status(statement.get(), SQLITE_STMTSTATUS_REPREPARE, 1) != 0) {
    ++schema_;
  }
  return code;
}

void Connection::Execute(const CheckedOut& statement, const char* file, unsigned int line) {
  if (Step(statement, file, line) != SQLITE_DONE) {
    throw ErrorMessage(statement.get(), file, line);
  }
}

void Connection::BeginTransaction(unsigned int busyTimeout, const char* file, unsigned int line) {
  const CheckedOut begin = CheckOut(IsReadOnly() ? "BEGIN" : "BEGIN IMMEDIATE", file, line);
  failedStep_.clear();
  sqlite3_busy_timeout(handle_, static_cast<int>(busyTimeout));
  try {
    Execute(begin, file, line);
    inTransaction_ = true;
  } catch (...) {
    sqlite3_busy_timeout(handle_, busyTimeout_);
    throw;
  }
}

void Connection::CommitTransaction(const char* file, unsigned int line) {
  if (!failedStep_.empty()) {
    throw ErrorMessage(
        util::FormatString("not committed after a failed step: %s", failedStep_.c_str()), file,
        line);
  }
  if (checkBeforeCommit_) {
    checkBeforeCommit_();
  }
  Execute(CheckOut("COMMIT", file, line), file, line);
  EndTransaction();
}

void Connection::RollBackTransaction() noexcept {
  // SQLite may already have rolled back by itself.
  if (sqlite3_get_autocommit(handle_) == 0) {
    sqlite3_exec(handle_, "ROLLBACK", nullptr, nullptr, nullptr);
  }
  ++schema_; // changes of the schema were rolled back, too
  EndTransaction();
}

void Connection::EndTransaction() noexcept {
  sqlite3_busy_timeout(handle_, busyTimeout_);
  inTransaction_ = false;
}

} // namespace orva::db

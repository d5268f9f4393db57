#include "orvadb/Transaction.h"

#include "orvadb/Connection.h"
#include "orvadb/DB.h"
#include "orvadb/Statement.h"

#include "orvautil/FormatString.h"

#include <sqlite3.h>

namespace orva::db {

Transaction::Transaction(const DB& db, unsigned int busyTimeout, const char* file,
                         unsigned int line)
    : db_(db) {
  const bool readOnly = db.handle_ != nullptr && sqlite3_db_readonly(db.handle_, "main") == 1;
  Statement begin(db, readOnly ? "BEGIN" : "BEGIN IMMEDIATE", file, line);
  sqlite3_busy_timeout(db.handle_, static_cast<int>(busyTimeout));
  db.connection_->failedStep.clear();
  db.connection_->beforeCommit.clear();
  try {
    begin.Execute(file, line);
    db.connection_->transaction = db.connection_->NextTransaction();
  } catch (...) {
    sqlite3_busy_timeout(db.handle_, db.connection_->BusyTimeout());
    throw;
  }
}

Transaction::~Transaction() {
  if (open_) {
    // Where SQLite has rolled back by itself there is nothing left to do.
    if (sqlite3_get_autocommit(db_.handle_) == 0) {
      sqlite3_exec(db_.handle_, "ROLLBACK", nullptr, nullptr, nullptr);
    }
    End();
  }
}

void Transaction::Commit(const char* file, unsigned int line) {
  const std::string& failedStep = db_.connection_->failedStep;
  if (!failedStep.empty()) {
    throw util::FormatString("%s:%u: not committed after a failed step: %s", file, line,
                             failedStep.c_str());
  }
  for (const char* const sql : db_.connection_->beforeCommit) {
    Statement(db_, sql, file, line).Execute(file, line);
  }
  Statement(db_, "COMMIT", file, line).Execute(file, line);
  End();
}

void Transaction::End() noexcept {
  sqlite3_busy_timeout(db_.handle_, db_.connection_->BusyTimeout());
  db_.connection_->transaction = 0;
  open_ = false;
}

} // namespace orva::db

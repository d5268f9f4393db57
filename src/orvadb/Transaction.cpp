#include "orvadb/Transaction.h"

#include "orvadb/Connection.h"
#include "orvadb/DB.h"

namespace orva::db {

Transaction::Transaction(const DB& db, unsigned int busyTimeout, const char* file,
                         unsigned int line)
    : connection_(db.OpenConnection("BEGIN IMMEDIATE", file, line)) {
  connection_.BeginTransaction(busyTimeout, file, line);
}

Transaction::~Transaction() {
  if (open_) {
    connection_.RollBackTransaction();
  }
}

void Transaction::Commit(const char* file, unsigned int line) {
  connection_.CommitTransaction(file, line);
  open_ = false;
}

} // namespace orva::db

#include "orvadb/ErrorMessage.h"

#include "DatabaseVfs.h"

#include "orvautil/FormatString.h"

#include <sqlite3.h>

namespace orva::db {

std::string ErrorMessage(const std::string& reason, const char* file, unsigned int line) {
  return util::FormatString("%s:%u: ", file, line) + reason;
}

std::string ErrorMessage(sqlite3* handle, const char* sql, const char* file, unsigned int line) {
  const int code = sqlite3_extended_errcode(handle);
  std::string reason = DatabaseVfs::LastRefusal();
  if (reason.empty()) {
    // Only WorkLimit interrupts statements.
    reason = code == SQLITE_INTERRUPT ? "more work than a database of this size can need"
                                      : sqlite3_errmsg(handle);
  }
  // A name in an untrusted schema may be of any length, but a line of the system log may not.
  return ErrorMessage(
      util::FormatString("%.500s (extended code %d) in \"%.500s\"", reason.c_str(), code, sql),
      file, line);
}

std::string ErrorMessage(sqlite3_stmt* statement, const char* file, unsigned int line) {
  return ErrorMessage(sqlite3_db_handle(statement), sqlite3_sql(statement), file, line);
}

} // namespace orva::db

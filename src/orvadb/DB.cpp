#include "orvadb/DB.h"

#include "DatabaseVfs.h"

#include "orvadb/Connection.h"
#include "orvadb/ErrorMessage.h"
#include "orvadb/Statement.h"

#include "orvautil/FormatString.h"

#include <sqlite3.h>

#include <string_view>
#include <utility>
#include <vector>

namespace orva::db {

namespace {

/// Milliseconds. A reader of the database must not make a change of it fail.
constexpr int BUSY_TIMEOUT = 1000;

/// Keeps SQLite from counting every allocation under a lock: the counts are not used. Must run
/// before SQLite is first used in the process.
void ConfigureOnce() {
  static const int configured = sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
  static_cast<void>(configured);
}

/// Bytes of the longest text or row. Ours are far shorter.
constexpr int LONGEST_VALUE = 16 << 20;

/// Most indexes on one table. Inserting a row updates them all.
constexpr std::size_t MOST_INDEXES = 32;

/// Runs one statement that has no result. Throws std::string.
void Run(sqlite3* handle, const char* sql) {
  if (sqlite3_exec(handle, sql, nullptr, nullptr, nullptr) != SQLITE_OK) {
    throw ErrorMessage(handle, sql);
  }
}

/// Databases on volumes are untrusted: nothing that the schema defines is run.
void DisableUntrustedFeatures(sqlite3* handle) {
  for (const auto& [option, value] :
       {std::pair(SQLITE_DBCONFIG_ENABLE_TRIGGER, 0), std::pair(SQLITE_DBCONFIG_ENABLE_VIEW, 0),
        std::pair(SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0), std::pair(SQLITE_DBCONFIG_DEFENSIVE, 1)}) {
    sqlite3_db_config(handle, option, value, nullptr);
  }
  sqlite3_drop_modules(handle, nullptr);
  sqlite3_limit(handle, SQLITE_LIMIT_LENGTH, LONGEST_VALUE);
  Run(handle, "PRAGMA cell_size_check = ON");
  Run(handle, "PRAGMA ignore_check_constraints = ON");
}

/// The pragma with a name, which may be any text, as its argument.
std::string Pragma(const char* pragma, const std::string& name) {
  const std::unique_ptr<char, decltype(&sqlite3_free)> sql(
      sqlite3_mprintf("PRAGMA %s(%Q)", pragma, name.c_str()), &sqlite3_free);
  if (!sql) {
    throw ErrorMessage("out of memory");
  }
  return sql.get();
}

/// Whether a column's default, given as its SQL text, is a number, a plain text or absent.
bool IsLiteral(const std::string& text) {
  return text.find_first_not_of("+-.0123456789") == std::string::npos || text == "NULL" ||
         (text.size() >= 2 && text.front() == '\'' && text.find('\'', 1) == text.size() - 1);
}

/// `path` as a URI that promises SQLite that the file does not change.
std::string ImmutableUri(const std::string& path) {
  std::string uri = "file:";
  for (const char byte : path) {
    if (std::string_view("%?#").find(byte) == std::string_view::npos) {
      uri.push_back(byte);
    } else {
      uri += util::FormatString("%%%02x", static_cast<unsigned char>(byte));
    }
  }
  return uri + "?immutable=1";
}

} // namespace

DB::DB() = default;

DB::~DB() {
  Close();
}

std::string DB::GetPrefix() const {
  return {};
}

void DB::UpdateStatus(const std::string& /*key*/, const std::string& /*value*/) const {}

void DB::Open(const std::string& path) {
  Open(path, Access::ReadWrite, BUSY_TIMEOUT, false);
}

void DB::Open(std::string path, Access access, int busyTimeout, bool immutable) {
  Close();
  ConfigureOnce();
  DatabaseVfs::ForgetRefusal();
  vfs_ = std::make_unique<DatabaseVfs>(path, access == Access::ReadWrite);
  const int mode = access == Access::ReadWrite ? SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE
                                               : SQLITE_OPEN_READONLY;
  const int flags = mode | SQLITE_OPEN_NOFOLLOW | SQLITE_OPEN_PRIVATECACHE | SQLITE_OPEN_NOMUTEX |
                    (immutable ? SQLITE_OPEN_URI : 0);
  const std::string& name = immutable ? ImmutableUri(path) : path;
  const int code = sqlite3_open_v2(name.c_str(), &handle_, flags, vfs_->Name());
  path_ = std::move(path);
  try {
    if (code != SQLITE_OK) {
      throw ErrorMessage(handle_, ("open '" + path_ + "'").c_str());
    }
    connection_ = std::make_unique<Connection>(handle_, busyTimeout, *vfs_);
    DisableUntrustedFeatures(handle_);
    if (access == Access::ReadWrite) {
      // A merge keeps its changes in memory until it commits, so that readers wait only then.
      Run(handle_, "PRAGMA cache_size = -65536");
      // What SQLite keeps for a statement is small: ids of folders, or an emptied database.
      Run(handle_, "PRAGMA temp_store = MEMORY");
    }
  } catch (...) {
    Close();
    throw;
  }
}

void DB::Create(const std::string& path, const std::function<void()>& build) {
  ConfigureOnce();
  const DatabaseFiles target(DatabaseVfs::FullPath(path), true);
  const DatabaseFiles unfinished(target.Path() + ".new", true);
  if (!unfinished.DeleteAll()) {
    // What an earlier attempt left there must not become part of the new database.
    throw ErrorMessage(util::FormatString("cannot remove '%s'", unfinished.Path().c_str()));
  }
  try {
    Open(path + ".new");
    build();
    Close();
    unfinished.Publish(target);
  } catch (...) {
    Close();
    unfinished.DeleteAll();
    throw;
  }
}

void DB::Close() {
  connection_.reset();
  // The connection has no statements left, so that SQLite closes it at once.
  sqlite3_close_v2(handle_);
  handle_ = nullptr;
  vfs_.reset();
  path_.clear();
}

Connection& DB::OpenConnection(const char* sql, const char* file, unsigned int line) const {
  if (!connection_) {
    throw ErrorMessage(util::FormatString("database not open in \"%s\"", sql), file, line);
  }
  return *connection_;
}

long long DB::BytesRead() const noexcept {
  return vfs_ ? vfs_->BytesRead() : 0;
}

void DB::CheckBeforeCommit(std::function<void()> check) const {
  connection_->CheckBeforeCommit(std::move(check));
}

const DatabaseFiles& DB::Files() const noexcept {
  return vfs_->Files();
}

void DB::RejectComputedColumns(const std::string& table) const {
  if (connection_->HasFailedToRead()) {
    return; // nothing is read from the table any more
  }
  const bool written = !connection_->IsReadOnly();
  const auto rejectIf = [&](bool computed, const char* what) {
    if (computed) {
      throw ErrorMessage(
          util::FormatString("%s in table %.500s of '%s'", what, table.c_str(), path_.c_str()));
    }
  };
  constexpr int virtualColumn = 2; // and above: stored ones
  constexpr int expression = -2;   // in the place of a column's number

  const std::string listColumns = Pragma("table_xinfo", table);
  Statement column(*this, listColumns.c_str());
  while (column.Fetch()) {
    rejectIf(column.GetInt(6) >= virtualColumn, "generated column");
    rejectIf(written && !IsLiteral(column.GetText(4)), "default value that is no literal");
  }
  if (!written) {
    return;
  }
  std::vector<std::string> indexes;
  const std::string listIndexes = Pragma("index_list", table);
  Statement index(*this, listIndexes.c_str());
  while (index.Fetch()) {
    rejectIf(index.GetBool(4), "partial index");
    indexes.push_back(index.GetText(1));
    rejectIf(indexes.size() > MOST_INDEXES, "too many indexes");
  }
  for (const std::string& name : indexes) {
    const std::string listKeys = Pragma("index_xinfo", name);
    Statement key(*this, listKeys.c_str());
    while (key.Fetch()) {
      rejectIf(key.GetInt(1) == expression, "index on an expression");
    }
  }
}

bool DB::IsInTransaction() const noexcept {
  return handle_ != nullptr && sqlite3_get_autocommit(handle_) == 0;
}

long long DB::LastInsertId() const noexcept {
  return sqlite3_last_insert_rowid(handle_);
}

} // namespace orva::db

#include "orvadb/DB.h"

#include "DatabaseFile.h"

#include "orvadb/Connection.h"
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

/// Keeps SQLite from counting every allocation under a lock; nobody reads the counts. Only before
/// it is first used in the process.
void ConfigureOnce() {
  static const int configured = sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
  static_cast<void>(configured);
}

/// Texts and rows of more bytes are read by nobody.
constexpr int LONGEST_VALUE = 16 << 20;

/// Indices on one table, all of which each of its rows has to be entered in.
constexpr std::size_t MOST_INDICES = 32;

/// Runs one statement that has no result. Throws std::string.
void Run(sqlite3* handle, const char* sql) {
  if (sqlite3_exec(handle, sql, nullptr, nullptr, nullptr) != SQLITE_OK) {
    throw ErrorMessage(handle, sql, __FILE__, __LINE__);
  }
}

/// A volume is whoever's plugged it in: nothing that its database brings along is run.
void DisableUntrustedFeatures(sqlite3* handle) {
  for (const auto& [option, value] :
       {std::pair(SQLITE_DBCONFIG_ENABLE_TRIGGER, 0), std::pair(SQLITE_DBCONFIG_ENABLE_VIEW, 0),
        std::pair(SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0), std::pair(SQLITE_DBCONFIG_DEFENSIVE, 1)}) {
    sqlite3_db_config(handle, option, value, nullptr);
  }
  sqlite3_limit(handle, SQLITE_LIMIT_LENGTH, LONGEST_VALUE);
  Run(handle, "PRAGMA cell_size_check = ON");
  Run(handle, "PRAGMA ignore_check_constraints = ON");
}

/// The pragma with a name, which may be any text, as its argument.
std::string Pragma(const char* pragma, const std::string& name) {
  const std::unique_ptr<char, decltype(&sqlite3_free)> sql(
      sqlite3_mprintf("PRAGMA %s(%Q)", pragma, name.c_str()), &sqlite3_free);
  if (!sql) {
    throw util::FormatString("%s:%d: out of memory", __FILE__, __LINE__);
  }
  return sql.get();
}

/// Whether the text of a column's default is that of a number, a plain text or nothing.
bool IsLiteral(const std::string& text) {
  return text.find_first_not_of("+-.0123456789") == std::string::npos || text == "NULL" ||
         (text.size() >= 2 && text.front() == '\'' && text.find('\'', 1) == text.size() - 1);
}

/// `path` as a URI that promises that nobody writes the file.
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
  const long long size = CheckDatabaseFiles(path, access == Access::ReadWrite);
  if (access == Access::ReadWrite) {
    CheckJournal(path);
  }
  ConfigureOnce();
  const int mode = access == Access::ReadWrite ? SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE
                                               : SQLITE_OPEN_READONLY;
  const int flags = mode | SQLITE_OPEN_NOFOLLOW | SQLITE_OPEN_PRIVATECACHE | SQLITE_OPEN_NOMUTEX |
                    (immutable ? SQLITE_OPEN_URI : 0);
  const std::string& name = immutable ? ImmutableUri(path) : path;
  const int code = sqlite3_open_v2(name.c_str(), &handle_, flags, nullptr);
  path_ = std::move(path);
  try {
    if (code != SQLITE_OK) {
      throw ErrorMessage(handle_, ("open '" + path_ + "'").c_str(), __FILE__, __LINE__);
    }
    connection_ = std::make_unique<Connection>(handle_, busyTimeout, size);
    sqlite3_busy_timeout(handle_, busyTimeout);
    DisableUntrustedFeatures(handle_);
    if (access == Access::ReadWrite) {
      // A merge keeps its changes in memory until it commits, so that readers wait only then.
      Run(handle_, "PRAGMA cache_size = -65536");
    }
  } catch (...) {
    Close();
    throw;
  }
}

void DB::Create(const std::string& path, const std::function<void()>& build) {
  const std::string unfinished = path + ".new";
  if (!RemoveDatabase(unfinished)) {
    // It would be taken for what is built now.
    throw util::FormatString("%s:%d: cannot remove '%s'", __FILE__, __LINE__, unfinished.c_str());
  }
  try {
    Open(unfinished);
    build();
    Close();
    PublishDatabase(unfinished, path);
  } catch (...) {
    Close();
    RemoveDatabase(unfinished);
    throw;
  }
}

void DB::Close() {
  connection_.reset();
  // The connection has no statements left, so that this cannot be refused.
  sqlite3_close_v2(handle_);
  handle_ = nullptr;
  path_.clear();
}

long long DB::MeasureFile() const {
  const bool written = sqlite3_db_readonly(handle_, "main") == 0;
  const long long size = CheckDatabaseFiles(path_, written);
  connection_->SetFileSize(size);
  return size;
}

void DB::RejectComputedColumns(const std::string& table) const {
  const bool written = sqlite3_db_readonly(handle_, "main") == 0;
  const auto refuse = [&](bool computed, const char* what) {
    if (computed) {
      throw util::FormatString("%s:%d: %s in table %.500s of '%s'", __FILE__, __LINE__, what,
                               table.c_str(), path_.c_str());
    }
  };
  constexpr int virtualColumn = 2; // and above: stored ones
  constexpr int expression = -2;   // in the place of a column's number

  const std::string listColumns = Pragma("table_xinfo", table);
  Statement column(*this, listColumns.c_str(), __FILE__, __LINE__);
  while (column.Fetch(__FILE__, __LINE__)) {
    refuse(column.GetInt(6) >= virtualColumn, "generated column");
    refuse(written && !IsLiteral(column.GetText(4)), "default value that is no literal");
  }
  if (!written) {
    return;
  }
  std::vector<std::string> indices;
  const std::string listIndices = Pragma("index_list", table);
  Statement index(*this, listIndices.c_str(), __FILE__, __LINE__);
  while (index.Fetch(__FILE__, __LINE__)) {
    refuse(index.GetBool(4), "partial index");
    indices.push_back(index.GetText(1));
    refuse(indices.size() > MOST_INDICES, "more indices than a row is worth");
  }
  for (const std::string& name : indices) {
    const std::string listKeys = Pragma("index_xinfo", name);
    Statement key(*this, listKeys.c_str(), __FILE__, __LINE__);
    while (key.Fetch(__FILE__, __LINE__)) {
      refuse(key.GetInt(1) == expression, "index on an expression");
    }
  }
}

unsigned long long DB::RunningTransaction() const noexcept {
  return connection_ ? connection_->transaction : 0;
}

void DB::CreateTransientIndex(const char* create, const char* drop, const char* file,
                              unsigned int line) const {
  Statement(*this, create, file, line).Execute(file, line);
  connection_->beforeCommit.push_back(drop);
}

long long DB::LastInsertId() const noexcept {
  return sqlite3_last_insert_rowid(handle_);
}

} // namespace orva::db

#include "orvadb/DB.h"

#include "orvadb/Connection.h"
#include "orvadb/Statement.h"

#include "orvautil/FormatString.h"

#include <sqlite3.h>

#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <string_view>

namespace orva::db {

namespace {

/// Milliseconds. A reader of the database must not make a change of it fail.
constexpr int BUSY_TIMEOUT = 1000;

/// SQLite would wait for the other end of a FIFO, or write into a device: neither the database
/// nor what it keeps beside it may be one.
void RefuseSpecialFiles(const std::string& path) {
  for (const char* const suffix : {"", "-journal", "-wal", "-shm"}) {
    const std::string name = path + suffix;
    struct stat status {};
    if (lstat(name.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
      throw util::FormatString("%s:%d: '%s' is not a regular file", __FILE__, __LINE__,
                               name.c_str());
    }
  }
}

/// Keeps SQLite from counting every allocation under a lock; nobody reads the counts. Only before
/// it is first used in the process.
void ConfigureOnce() {
  static const int configured = sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
  static_cast<void>(configured);
}

/// Lets a merge keep its changes in memory until it commits, so that readers wait only then.
void SetCacheSize(sqlite3* handle) {
  sqlite3_exec(handle, "PRAGMA cache_size = -65536", nullptr, nullptr, nullptr);
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
  RefuseSpecialFiles(path);
  ConfigureOnce();
  const int mode = access == Access::ReadWrite ? SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE
                                               : SQLITE_OPEN_READONLY;
  const int flags = mode | SQLITE_OPEN_NOFOLLOW | SQLITE_OPEN_PRIVATECACHE | SQLITE_OPEN_NOMUTEX |
                    (immutable ? SQLITE_OPEN_URI : 0);
  const std::string& name = immutable ? ImmutableUri(path) : path;
  const int code = sqlite3_open_v2(name.c_str(), &handle_, flags, nullptr);
  path_ = std::move(path);
  if (code != SQLITE_OK) {
    std::string message =
        ErrorMessage(handle_, ("open '" + path_ + "'").c_str(), __FILE__, __LINE__);
    Close();
    throw std::string(std::move(message));
  }
  sqlite3_busy_timeout(handle_, busyTimeout);
  if (access == Access::ReadWrite) {
    SetCacheSize(handle_);
  }
  connection_ = std::make_unique<Connection>(handle_, busyTimeout);
}

void DB::Close() {
  connection_.reset();
  // The connection has no statements left, so that this cannot be refused.
  sqlite3_close_v2(handle_);
  handle_ = nullptr;
  path_.clear();
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

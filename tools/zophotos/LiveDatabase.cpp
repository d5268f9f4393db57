#include "LiveDatabase.h"

#include "MergedDatabase.h"

#include <SQLiteCpp/Transaction.h>

#include <sys/stat.h>

namespace orva::zophotos {

namespace {

/// Changes when another connection has changed the database.
std::int64_t Version(SQLite::Database& database) {
  return database.execAndGet("PRAGMA data_version").getInt64();
}

} // namespace

void LiveDatabase::Look(const Read& read) {
  const std::string path = findPath_();
  if (!database_ || path != path_ || Identify(path) != identity_) {
    path_ = path;
    database_.reset();
    version_.reset();
    identity_ = Identify(path);
    database_ = OpenDatabase(path);
  }
  if (version_ && *version_ == Version(*database_)) {
    return;
  }
  const SQLite::Transaction oneState(*database_);
  read(*database_, !version_);
  version_ = Version(*database_);
}

std::optional<LiveDatabase::FileIdentity> LiveDatabase::Identify(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) {
    return std::nullopt;
  }
  return FileIdentity(status.st_dev, status.st_ino);
}

} // namespace orva::zophotos

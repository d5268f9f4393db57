#pragma once

#include <SQLiteCpp/Database.h>

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <utility>

namespace orva::zophotos {

/// The time between two looks at a database that may change.
inline constexpr std::chrono::milliseconds LOOK_INTERVAL(250);

/// The current merged database, kept open in place to notice changes. Its volume cannot be
/// unmounted meanwhile.
class LiveDatabase {
public:
  /// Reads an open database. It is new if it was not read since it was opened.
  using Read = std::function<void(SQLite::Database& database, bool isNew)>;

  /// `findPath` returns the merged database's current path, or throws Failure. It must outlive the
  /// object.
  explicit LiveDatabase(const std::function<std::string()>& findPath) : findPath_(findPath) {}

  /// Opens the current database if it is not the open one. Calls `read`, inside a transaction, if
  /// the database is new or has changed since it was read. Throws Failure or SQLite::Exception.
  void Look(const Read& read);

  /// Closes the database: the next look opens it again.
  void Close() { database_.reset(); }

  /// The path that the last look found.
  const std::string& Path() const { return path_; }

private:
  /// Identifies a file independent of its name.
  using FileIdentity = std::pair<dev_t, ino_t>;

  static std::optional<FileIdentity> Identify(const std::string& path);

  const std::function<std::string()>& findPath_;
  std::string path_;
  std::optional<FileIdentity> identity_;
  std::optional<SQLite::Database> database_;
  std::optional<std::int64_t> version_; ///< that was read last; nothing if it is new
};

} // namespace orva::zophotos

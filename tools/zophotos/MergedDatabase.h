#pragma once

#include <SQLiteCpp/Database.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace SQLite {
class Exception;
}

namespace orva::zophotos {

/// Opens the merged database at `path` to read it where it is. A statement on it keeps merges from
/// committing for as long as it is unfinished, and a merge gives up after a second: what is read
/// has to be little, and to be read whole before anything is printed. Throws Failure or
/// SQLite::Exception.
SQLite::Database OpenDatabase(const std::string& path);

/// A private copy of the merged database at `path`, in a temporary file that has no name and goes
/// with the connection. It is one state of the database, and can be read at leisure. Throws
/// Failure or SQLite::Exception.
SQLite::Database CopyDatabase(const std::string& path);

/// One row of Walk: a folder, or a file in it. Valid during the call.
struct Item {
  std::int64_t folderId;
  std::string folder;              ///< full path with its trailing separator
  std::optional<std::string> file; ///< name of the file; nothing for a folder without files
  std::string volume;              ///< the folder's
  std::int64_t folderModified;     ///< seconds since the epoch, as all times
  std::int64_t modified;           ///< of the file
  std::int64_t created;            ///< of the file
};

/// Calls `visit` for each file by its folder, and for each folder without files, in the order of
/// their paths and in constant memory. On a copy. Throws SQLite::Exception.
void Walk(SQLite::Database& copy, const std::function<void(const Item&)>& visit);

/// What to tell the user of a failure of SQLite's while reading the database at `path`.
std::string Explain(const SQLite::Exception& error, const std::string& path);

/// Whether the file turned out to be no whole database.
bool IsDamage(const SQLite::Exception& error);

/// Whether the database can be read when somebody else is done with it.
bool IsLocked(const SQLite::Exception& error);

} // namespace orva::zophotos

#pragma once

#include "Photo.h"

#include <SQLiteCpp/Database.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace SQLite {
class Exception;
}

namespace orva::zophotos {

/// Opens the merged database at `path` to read it in place. An unfinished statement on it keeps
/// merges from committing, and a merge gives up after a second. Read little, and finish reading
/// before you print. Throws Failure or SQLite::Exception.
SQLite::Database OpenDatabase(const std::string& path);

/// A private copy of the merged database at `path`, in a temporary file without a name that is
/// removed with the connection. It is a consistent snapshot, and reading it does not block merges.
/// Throws Failure or SQLite::Exception.
SQLite::Database CopyDatabase(const std::string& path);

/// One row of Walk: a folder, or a file in it. Valid during the call.
struct Item {
  std::int64_t folderId;
  std::string folder;              ///< full path with its trailing separator
  std::optional<std::string> file; ///< name of the file; empty for a folder without files
  std::string volume;              ///< of the folder
  std::int64_t folderModified;     ///< seconds since the epoch, like all times
  std::int64_t modified;           ///< of the file
  std::int64_t created;            ///< of the file
};

/// Calls `visit` for each file that has a folder and for each folder without files, ordered by
/// folder and name, in constant memory. Throws SQLite::Exception.
void Walk(SQLite::Database& copy, const std::function<void(const Item&)>& visit);

/// Calls `visit` for each file that has a folder, ordered by path, byte by byte, in constant
/// memory. The photo is valid during the call. Throws SQLite::Exception.
void WalkPhotos(SQLite::Database& copy, const std::function<void(const Photo&)>& visit);

/// The message for the user about an SQLite error while reading the database at `path`.
std::string Explain(const SQLite::Exception& error, const std::string& path);

/// Whether the error means that the file is damaged or not a database.
bool IsDamage(const SQLite::Exception& error);

/// Whether the error is temporary: the database is locked, or the daemon has to roll a merge back.
bool IsLocked(const SQLite::Exception& error);

} // namespace orva::zophotos

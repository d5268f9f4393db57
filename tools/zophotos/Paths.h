#pragma once

#include <SQLiteCpp/Database.h>

#include <optional>
#include <string>
#include <vector>

namespace orva::zophotos {

/// The absolute paths that a path on the command line can stand for, best first: as it is written,
/// normalized, and both with the escapes of Printable resolved. A relative path is relative to the
/// shares root.
std::vector<std::string> Spellings(const std::string& text);

/// `path` with a separator at its end, as the database names folders.
std::string FolderPath(const std::string& path);

/// The smallest text that sorts after all paths in the folder at `path`.
std::string EndOfFolder(const std::string& path);

/// The first of `spellings` that is a folder in the database, or the beginning of a folder's path,
/// as a FolderPath. Throws SQLite::Exception.
std::optional<std::string> FindFolder(SQLite::Database& database,
                                      const std::vector<std::string>& spellings);

/// Whether there is a file at `path`. Throws SQLite::Exception.
bool IsFile(SQLite::Database& database, const std::string& path);

/// The volume that is gone, if one of `spellings` is its path or one on it: only its statistics are
/// left. Throws SQLite::Exception.
std::optional<std::string> FindGoneVolume(SQLite::Database& database,
                                          const std::vector<std::string>& spellings);

/// Throws a Failure that says why there is nothing at `spellings`: `missing`, unless the volume is
/// gone.
[[noreturn]] void ThrowMissing(SQLite::Database& database,
                               const std::vector<std::string>& spellings,
                               const std::string& missing);

} // namespace orva::zophotos

#pragma once

#include "Failure.h"

#include <functional>
#include <string>

namespace orva::zophotos {

/// For people, or for programs: one JSON object, or one a line where a command lists.
enum class Form { Text, Json };

/// The merged database's path as it is now, since it may move while a command runs.
using FindPath = std::function<std::string()>;

// The commands, one in a source of its own each. `path` is the merged database's. They print to
// standard output, and throw Failure or SQLite::Exception.

/// Where the database is, and how far each volume has come.
ExitStatus ShowStatus(const std::string& path, Form form);

/// What is in a folder, which may be named from the shares root on.
ExitStatus ListFolder(const std::string& path, const std::string& folder, bool isLong, Form form);

/// All folders below one, by their paths.
ExitStatus ShowTree(const std::string& path, const std::string& folder, Form form);

/// What FindItems looks for, and how it prints what it has found.
struct Search {
  std::string pattern;
  bool ignoreCase = false;
  bool nullTerminated = false; ///< the bytes of each path as they are, with a NUL behind them
};

/// Files and folders by their names.
ExitStatus FindItems(const std::string& path, const Search& search, Form form);

/// What is wrong with the database.
ExitStatus CheckDatabase(const std::string& path, Form form);

enum class ExportFormat { Csv, JsonLines };

/// Every file, with its full path.
ExitStatus ExportFiles(const std::string& path, ExportFormat format);

/// A line for each change, until the program is ended or nobody takes its lines. What is thrown by
/// `findPath` is a change, too.
ExitStatus WatchDatabase(const FindPath& findPath, Form form);

/// `folder` as the database has it: from the shares root, with a separator at its end.
std::string FolderPath(const std::string& folder);

/// The first path behind all that are in the folder at `path`.
std::string EndOfFolder(const std::string& path);

} // namespace orva::zophotos

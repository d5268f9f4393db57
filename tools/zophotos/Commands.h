#pragma once

#include "Failure.h"

#include <cstddef>
#include <functional>
#include <string>

namespace orva::zophotos {

struct Activity;

/// Text for people, or JSON for programs: one object, or one object per line from a list.
enum class Form { Text, JsonText };

/// Returns the merged database's current path, which may change while a command runs.
using FindPath = std::function<std::string()>;

// The commands. Each is in its own source. `path` is the path of the merged database. They print to
// standard output, and throw Failure or SQLite::Exception.

/// Shows where the database is, the progress of each volume, and what the services are doing.
ExitStatus ShowStatus(const std::string& path, const Activity& services, Form form);

/// How FollowStatus follows.
struct Following {
  bool services = true; ///< with what the services are doing
  bool redraws = false; ///< on a terminal: replace the last report
};

/// Prints the progress of each volume and what the services are doing, and again after each
/// change, until the output cannot be written.
ExitStatus FollowStatus(const FindPath& findPath, const Following& following, Form form);

/// What List shows, and how.
struct Listing {
  std::string path; ///< of a folder or file, as the user gives it, see Spellings
  bool isLong = false;
  bool escapes = true; ///< print names for people
  bool colors = false; ///< print folders in a colour; needs `escapes`
};

/// Lists a folder, or shows a file.
ExitStatus List(const std::string& path, const Listing& listing, Form form);

/// Shows the folders below a folder, by their paths, down to `levels` below it. `folder` and
/// `colors` are as in Listing.
ExitStatus ShowTree(const std::string& path, const std::string& folder, std::size_t levels,
                    bool colors, Form form);

/// What FindItems searches for, and how it prints the results.
struct Search {
  std::string pattern;
  bool ignoreCase = false;
  bool nullTerminated = false; ///< print the bytes of each path unchanged and a NUL after them
  bool escapes = true;         ///< print paths for people
  bool colors = false;         ///< print folders in a colour; needs `escapes`
  bool folders = true;         ///< find folders
  bool files = true;           ///< find files
  bool hints = false; ///< say on standard error if only the case keeps a name from matching
};

/// Finds files and folders by their names.
ExitStatus FindItems(const std::string& path, const Search& search, Form form);

/// Lists the photos that could not be rendered, with the reasons, from the catalogs of the volumes
/// that the merged database or a service names. `path` selects those of a volume, or in a folder,
/// see Spellings; all if it is empty. Throws Failure if nothing is there. `escapes` is as in
/// Listing.
ExitStatus ListFailedPhotos(const FindPath& findPath, const Activity& services,
                            const std::string& path, bool escapes, Form form);

/// Checks the database for damage.
ExitStatus CheckDatabase(const std::string& path, Form form);

enum class ExportFormat { Csv, JsonLines };

/// Prints every file with its full path. `escapes`: texts in CSV are for people.
ExitStatus ExportFiles(const std::string& path, ExportFormat format, bool escapes);

/// What ExportChanges exports.
struct Changes {
  std::string state;  ///< path of the file that remembers the last feed
  bool whole = false; ///< begin with all photos
};

/// Prints a feed: the photos that were added and removed since the feed that STATE remembers, or
/// all photos if STATE remembers none of this database. Then STATE remembers this feed. A feed that
/// may have been printed only in part is printed again.
ExitStatus ExportChanges(const std::string& path, const Changes& changes, ExportFormat format,
                         bool escapes);

/// Prints a line for each change until the output cannot be written. An exception from `findPath`
/// is a change, too.
ExitStatus WatchDatabase(const FindPath& findPath, Form form);

} // namespace orva::zophotos

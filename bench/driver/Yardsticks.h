#pragma once

#include <ctime>
#include <string>

// What the daemon is measured against: programs that do the same work with less around it. All
// times are in seconds, without the start of the process, which is measured just before. Failures
// are thrown as std::exception.
namespace orva::bench {

/// A whole catalog into the new database `merged` by the floor's loop.
double MergeByFloor(const std::string& catalog, const std::string& merged,
                    const std::string& volume);

/// The same by INSERT ... SELECT in the sqlite3 shell.
double MergeByHorizon(const std::string& catalog, const std::string& merged,
                      const std::string& volume);

/// The reader's statements for the changes after `since`, stepped through by the sqlite3 shell,
/// their rows to /dev/null.
double StepReaderStatements(const std::string& catalog, std::time_t since);

} // namespace orva::bench

#pragma once

#include <ctime>
#include <string>

// What the daemon is compared with: programs that do only the same work. All times are in
// seconds, without the time to start the process, which is measured just before. Failures are
// thrown as std::exception.
namespace orva::bench {

/// Merges a whole catalog into the new database `merged` with the floor's loop.
double MergeByFloor(const std::string& catalog, const std::string& merged,
                    const std::string& volume);

/// Does the same with INSERT ... SELECT in the sqlite3 shell.
double MergeByHorizon(const std::string& catalog, const std::string& merged,
                      const std::string& volume);

/// Runs the reader's statements for the changes after `since` in the sqlite3 shell; their rows go
/// to /dev/null.
double StepReaderStatements(const std::string& catalog, std::time_t since);

} // namespace orva::bench

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

/// Merges the files that have changed after `since` into `merged`, which MergeByHorizon has filled,
/// with INSERT ... SELECT in the sqlite3 shell.
double AddByHorizon(const std::string& catalog, const std::string& merged,
                    const std::string& volume, std::time_t since);

/// Runs the reader's statements for the changes after `since` in the sqlite3 shell; their rows go
/// to /dev/null.
double StepReaderStatements(const std::string& catalog, std::time_t since);

/// Stores the ids of all files of `merged` in the new database `ids`.
void ListFileIds(const std::string& merged, const std::string& ids);

/// Deletes the files with the ids in `ids` from `merged` with one DELETE in the sqlite3 shell.
double DeleteByShell(const std::string& merged, const std::string& ids);

} // namespace orva::bench

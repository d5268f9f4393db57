#pragma once

#include <string>

// The files of a database: the one at its path and those that SQLite keeps next to it.
// Any thread. Failures are thrown as std::string.

namespace orva::db {

/// Makes sure that SQLite may open the database at `path`, which need not exist, to read or also to
/// write it: none of its files is anything other than a regular one, which might block, and none
/// that SQLite writes has a second name. Returns the bytes of the database and its write-ahead log;
/// holes count little.
long long CheckDatabaseFiles(const std::string& path, bool written);

/// Makes sure that undoing an interrupted transaction of the database at `path` touches no other
/// file: rejects a journal that names one.
void CheckJournal(const std::string& path);

/// Removes a database with all its files, as far as they exist. Links are not followed. Returns
/// true if nothing remains.
bool RemoveDatabase(const std::string& path);

/// Gives the closed database at `from` the name `to`, in the same directory, where there is none.
/// First removes the logs that a former database left there, which would damage this one. After a
/// crash at any moment there is either no file at `to` or the whole database.
void PublishDatabase(const std::string& from, const std::string& to);

/// True when the file at `path` does not exist or is empty.
bool IsAbsentOrEmpty(const std::string& path);

} // namespace orva::db

#pragma once

#include <string>

// The files of a database as files: the one at its path and those that SQLite keeps beside it.
// Any thread. Failures are thrown as std::string.

namespace orva::db {

/// Makes sure that SQLite may open the database at `path`, which need not exist, to read or also to
/// write it: that none of its files is anything other than a regular one, which might be waited on,
/// nor written under a second name that somebody else relies on. Returns their size in bytes; holes
/// count for little.
long long CheckDatabaseFiles(const std::string& path, bool written);

/// Makes sure that undoing an interrupted transaction of the database at `path` touches no other
/// file: refuses a journal that names one.
void CheckJournal(const std::string& path);

/// Removes a database with all its files, as far as they are there. Links are not followed. Returns
/// whether none is left.
bool RemoveDatabase(const std::string& path);

/// Gives the closed database at `from` the name `to`, in the same directory, where there is
/// none; what is left there of a former database goes, which would spoil this one. At every
/// instant, whatever stops, there is either nothing at `to` or all of it.
void PublishDatabase(const std::string& from, const std::string& to);

/// True when the file at `path` is not there or holds nothing.
bool IsAbsentOrEmpty(const std::string& path);

} // namespace orva::db

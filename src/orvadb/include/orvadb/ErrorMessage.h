#pragma once

#include <string>

struct sqlite3;
struct sqlite3_stmt;

// The texts that the database layer throws, as std::string. `file` and `line` are those of the
// caller.

namespace orva::db {

/// "file:line: reason".
std::string ErrorMessage(const std::string& reason, const char* file = __builtin_FILE(),
                         unsigned int line = __builtin_LINE());

/// The last failure on `handle`: "file:line: SQLite's message (extended code N) in sql". A null
/// handle means that there was no memory for one.
std::string ErrorMessage(sqlite3* handle, const char* sql, const char* file = __builtin_FILE(),
                         unsigned int line = __builtin_LINE());

/// The same for the connection and the text of `statement`.
std::string ErrorMessage(sqlite3_stmt* statement, const char* file = __builtin_FILE(),
                         unsigned int line = __builtin_LINE());

} // namespace orva::db

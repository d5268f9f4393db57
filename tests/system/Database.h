#pragma once

#include <SQLiteCpp/SQLiteCpp.h>

#include <string>
#include <vector>

namespace orva::test {

/// A database file as other programs see it. Failures are thrown as SQLite::Exception, which is a
/// std::runtime_error.
class Database : public SQLite::Database {
public:
  /// Opens the file at `path`, which must exist unless `create` is set. Waits up to a minute for
  /// locks.
  explicit Database(const std::string& path, bool create = false);

  using Values = std::vector<std::string>;

  /// Runs one statement with the values bound to its parameters, as texts that the columns'
  /// affinities convert. Returns the rows, the columns of each joined by '|'.
  std::vector<std::string> Run(const std::string& sql, const Values& values = {}) const;
};

} // namespace orva::test

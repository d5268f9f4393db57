#pragma once

#include <memory>
#include <string>
#include <vector>

struct sqlite3;

namespace orva::test {

/// A database file as other programs see it, over SQLite's own interface. Failures are thrown
/// as std::runtime_error.
class Database {
public:
  /// Opens the file at `path`, which must exist unless `create` is set.
  explicit Database(const std::string& path, bool create = false);

  using Values = std::vector<std::string>;

  /// Runs one statement with the values bound to its parameters, as texts that the columns'
  /// affinities convert. Returns the rows, the columns of each joined by '|'.
  std::vector<std::string> Run(const std::string& sql, const Values& values = {}) const;

private:
  struct Closer {
    void operator()(sqlite3* handle) const;
  };
  std::unique_ptr<sqlite3, Closer> handle_;
};

} // namespace orva::test

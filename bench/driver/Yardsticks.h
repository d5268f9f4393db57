#pragma once

#include <ctime>
#include <string>

namespace orva::bench {

/// What the daemon is measured against: programs that do the same work with less around it. All
/// times are in seconds, without the start of a process, which is measured here once.
class Yardsticks {
public:
  Yardsticks();

  /// A whole catalog into the new database `merged` by the floor's loop.
  double Floor(const std::string& catalog, const std::string& merged,
               const std::string& volume) const;

  /// The same by INSERT ... SELECT in the sqlite3 shell.
  double Horizon(const std::string& catalog, const std::string& merged,
                 const std::string& volume) const;

  /// The reader's statements for the changes after `since`, stepped through by the sqlite3 shell,
  /// their rows to /dev/null.
  double ReaderStatements(const std::string& catalog, std::time_t since) const;

  double FloorStart() const { return floorStart_; }
  double ShellStart() const { return shellStart_; }

private:
  double floorStart_;
  double shellStart_;
};

} // namespace orva::bench

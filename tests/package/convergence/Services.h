#pragma once

#include <functional>
#include <map>
#include <regex>
#include <string>
#include <vector>

namespace orva::test {

/// The services of the system under test, as systemd and its journal see them.
class Services {
public:
  using Lines = std::vector<std::string>;

  Services();

  static const std::vector<std::string>& Units();

  /// A property of a unit, such as "MainPID".
  static std::string Property(const std::string& unit, const std::string& name);
  static pid_t MainPid(const std::string& unit);

  /// Kills the main process of a unit, which systemd then starts again.
  void Kill(const std::string& unit);
  /// How often that was done.
  int Kills() const { return kills_; }

  /// Stops, starts or restarts a unit.
  void Control(const std::string& verb, const std::string& unit);

  /// Counts the restarts of a unit from now on.
  void CountFromNow(const std::string& unit);

  /// Whether every unit is active, with another process than the one that was killed.
  bool AreActive() const;

  /// What is wrong with the units: one is not active, or has restarted more often than it was
  /// killed.
  Lines Problems() const;

  /// Unexpected lines in the journal since the last call. Those that match `expected` are expected
  /// in addition to the usual ones.
  Lines UnexpectedLines(const std::string& expected = "");

  /// Whether the journal has a line of the unit that contains `text`.
  static bool HasLogged(const std::string& unit, const std::string& text);

private:
  std::map<std::string, int> restarts_;        ///< expected
  std::map<std::string, pid_t> killedProcess_; ///< of each unit
  int kills_ = 0;
};

} // namespace orva::test

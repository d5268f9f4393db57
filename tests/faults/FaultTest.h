#pragma once

#include "DBMerger.h"
#include "DaemonLayerTest.h"

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace orva::test {

/// An operation on the merged database. Throws std::string as the database layer does.
using Action = std::function<void()>;

/// One way in which an operation is disturbed.
struct Fault {
  /// How often there was an opportunity for the fault, and how often it came.
  struct Tally {
    int chances = 0;
    int faults = 0;
  };

  std::string name; ///< as the figures call it
  /// Runs the action with the fault at its `nth` opportunity, counted from 1; 0 is none.
  std::function<Tally(int nth, const Action& action)> run;
  bool stopsProcess = false; ///< nobody is left to throw or to log
};

/// A test of what faults do to the merged database on /shares/Master/, of which /shares/Vol/ is one
/// volume. An operation is run with a fault at every one of its opportunities (in the brief form:
/// at some, evenly spread), from the same files each time.
class FaultTest : public DaemonLayerTest {
protected:
  /// Every file in the database's directory by name; none when there is no directory.
  using Files = std::optional<std::map<std::string, std::string>>;

  /// An operation and what may come of it.
  struct Scenario {
    std::string name; ///< as the figures call it: "a first merge"
    Action operation;
    Files files{};                ///< what it finds
    bool throws = true;           ///< otherwise each failure is one line of a failed merge
    std::vector<Lines> between{}; ///< what it may leave, when it fails, but the following two
    Lines before{};               ///< the content that it finds
    Lines after{};                ///< the content that it leaves when nothing goes wrong
    /// What the volume's next merge must lead to, unless nothing has changed; empty when that is
    /// of no interest.
    Lines merged{};
  };

  FaultTest();
  ~FaultTest() override;

  // The scenarios.

  Scenario FirstMerge();
  Scenario FirstMergeWithoutADatabase();
  Scenario LaterMerge();
  Scenario ReMerge();
  Scenario Removal();
  Scenario Creation();
  Scenario Opening();
  Scenario Clearing();

  /// Runs the scenario with the faults, and looks at what comes of each.
  void ExpectToSurvive(const Scenario& scenario, const std::vector<Fault>& faults);

  /// Everything in the merged database but the ids of folders, files and statistics.
  static Lines Content();

  static Files TakeFiles();
  static void RestoreFiles(const Files& files);

  static const std::string MASTER;
  static const std::string VOLUME;

  dbmerger::DBMerger merger;

private:
  struct Outcome {
    Fault::Tally tally;
    Lines thrown; ///< at most one
    Lines logged; ///< lines of failed merges
  };

  void Merge(const std::string& volume);
  void LayMergedVolumes();
  static std::vector<Lines> PartsOfADeletion();
  Scenario Finish(Scenario scenario, const Lines& volumes);
  Outcome Try(const Fault& fault, int nth, const Action& action);
  int Disturb(const Scenario& scenario, const Fault& fault);
  void CheckOutcome(const Scenario& scenario, const Fault& fault, const Outcome& outcome);
  void ExpectUndisturbed(const Action& action, const Lines& content);
};

} // namespace orva::test

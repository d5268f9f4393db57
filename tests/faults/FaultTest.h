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

/// A kind of fault.
struct Fault {
  /// How many opportunities the fault had, and how often it occurred.
  struct Tally {
    int chances = 0;
    int faults = 0;
  };

  std::string name; ///< in the figures
  /// Runs the action with the fault at its `nth` opportunity, counted from 1; 0 is none.
  std::function<Tally(int nth, const Action& action)> run;
  bool endsProcess = false; ///< so that nothing is thrown or logged
};

/// A test of faults in operations on the merged database on /shares/Master/, of which /shares/Vol/
/// is one volume. An operation is run with a fault at each of its opportunities (in the short form
/// at some, evenly spread), from the same files each time.
class FaultTest : public DaemonLayerTest {
protected:
  /// Every file in the database's directory by name; none when there is no directory.
  using Files = std::optional<std::map<std::string, std::string>>;

  /// An operation and its possible outcomes.
  struct Scenario {
    std::string name; ///< in the figures: "a first merge"
    Action operation;
    Files files{};                ///< the files before it
    bool throws = true;           ///< otherwise a failure is logged as that of a merge
    std::vector<Lines> between{}; ///< further contents that a failure may leave
    Lines before{};               ///< the content before it
    Lines after{};                ///< the content after it without a fault
    /// The content after the volume's next merge, unless the content has not changed; empty where
    /// that is not checked.
    Lines merged{};
  };

  FaultTest();
  ~FaultTest() override;

  // The scenarios.

  Scenario FirstMerge();
  Scenario FirstMergeWithoutADatabase();
  Scenario LaterMerge();
  Scenario LaterMergeRowByRow();
  Scenario ReMerge();
  Scenario Removal();
  Scenario Creation();
  Scenario Opening();
  Scenario Clearing();

  /// Runs the scenario with each fault and checks the outcomes.
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
  void MakeMergedVolumes();
  static Lines ContentAfterDeletion();
  Scenario Finish(Scenario scenario, const Lines& volumes);
  Outcome Try(const Fault& fault, int nth, const Action& action);
  int RunWith(const Scenario& scenario, const Fault& fault);
  void CheckOutcome(const Scenario& scenario, const Fault& fault, const Outcome& outcome);
  void ExpectSuccess(const Action& action, const Lines& content);
};

} // namespace orva::test

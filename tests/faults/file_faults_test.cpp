// The merged database where the file system under it, or under a volume's catalog, fails.

#include "FaultVfs.h"
#include "FileFaults.h"

#include "Database.h"

#include "orvautil/Core.h"

#include <cerrno>
#include <string>

namespace orva::test {
namespace {

const std::string MERGED = "/.zophotos";
const std::string CATALOG = "/shares/Vol/";

class FileFaultTest : public FaultTest {
protected:
  /// A first creation where the database of before is gone, but neither its journal nor what an
  /// earlier creation has left.
  Scenario CreationAmongLeftovers() {
    const Scenario merge = LaterMerge();
    const Fault stop = Stops(MERGED).front();
    const auto run = [&](int nth) {
      int chances = 0;
      OutputOf([&] { chances = stop.run(nth, merge.operation).chances; });
      return chances;
    };
    const int end = run(0);
    RestoreFiles(merge.files);
    run(end);
    Files files = TakeFiles();
    const std::string journal = files->at("zophotos.db-journal");
    (*files)["zophotos.db.new"] = files->at("zophotos.db");
    (*files)["zophotos.db.new-journal"] = journal;
    files->erase("zophotos.db");

    RestoreFiles(std::nullopt);
    Scenario scenario = Creation();
    scenario.name = "a first creation among leftovers";
    scenario.files = files;
    return scenario;
  }

  /// Runs the scenario with a sync that its file system does not support: the last one, or one so
  /// many before it.
  static void FailUnsupported(const Scenario& scenario, int beforeLast) {
    FaultPlan plan{.files = MERGED, .requests = {Request::Sync}, .systemError = EINVAL};
    {
      const FaultVfs counting(plan);
      scenario.operation();
      plan.nth = counting.Seen() - beforeLast;
    }
    RestoreFiles(scenario.files);
    const FaultVfs faults(plan);
    scenario.operation();
  }
};

TEST_F(FileFaultTest, FirstMergeIsAllOrNothing) {
  ExpectToSurvive(FirstMerge(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, FirstMergeWithoutADatabaseIsAllOrNothing) {
  ExpectToSurvive(FirstMergeWithoutADatabase(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, LaterMergeIsAllOrNothing) {
  ExpectToSurvive(LaterMerge(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, ReMergeCanBeRepeatedByTheNextMerge) {
  ExpectToSurvive(ReMerge(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, RemovalLeavesNothingBehindForEver) {
  ExpectToSurvive(Removal(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, NewDatabaseIsCompleteOrNotThere) {
  ExpectToSurvive(Creation(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, NewDatabaseAmongLeftoversIsCompleteOrNotThere) {
  ExpectToSurvive(CreationAmongLeftovers(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, FailedOpeningChangesNothing) {
  ExpectToSurvive(Opening(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, RemovalOfAllVolumesCanBeRepeated) {
  ExpectToSurvive(Clearing(), FileErrors(MERGED, "merged database"));
}

// The last syncs of a creation are those of the new file and of its directory.

TEST_F(FileFaultTest, DirectoryThatCannotBeSyncedIsNoFailure) {
  const Scenario creation = Creation();
  FailUnsupported(creation, 0);
  EXPECT_EQ(creation.after, Content());
}

TEST_F(FileFaultTest, DatabaseThatCannotBeSyncedIsAFailure) {
  const Scenario creation = Creation();
  EXPECT_THROW(FailUnsupported(creation, 1), std::string);
  EXPECT_EQ(creation.before, Content());
}

// The process is stopped, or the appliance loses its power.

using StopTest = FileFaultTest;

TEST_F(StopTest, FirstMergeIsAllOrNothing) {
  ExpectToSurvive(FirstMerge(), Stops(MERGED));
}

TEST_F(StopTest, FirstMergeWithoutADatabaseIsAllOrNothing) {
  ExpectToSurvive(FirstMergeWithoutADatabase(), Stops(MERGED));
}

TEST_F(StopTest, LaterMergeIsAllOrNothing) {
  ExpectToSurvive(LaterMerge(), Stops(MERGED));
}

TEST_F(StopTest, ReMergeIsFinishedByTheNextMerge) {
  ExpectToSurvive(ReMerge(), Stops(MERGED));
}

TEST_F(StopTest, RemovalLeavesNothingBehindForEver) {
  ExpectToSurvive(Removal(), Stops(MERGED));
}

TEST_F(StopTest, NewDatabaseIsCompleteOrNotThere) {
  ExpectToSurvive(Creation(), Stops(MERGED));
}

TEST_F(StopTest, NewDatabaseAmongLeftoversIsCompleteOrNotThere) {
  ExpectToSurvive(CreationAmongLeftovers(), Stops(MERGED));
}

TEST_F(StopTest, NewDatabaseLastsFromTheEndOfItsCreation) {
  const Scenario creation = Creation();
  LosePowerBehind(creation.operation, MERGED);
  EXPECT_EQ(creation.after, Content());
}

TEST_F(StopTest, RemovalOfAllVolumesCanBeRepeated) {
  ExpectToSurvive(Clearing(), Stops(MERGED));
}

// The volume's catalog cannot be read, or only half.

using CatalogFaultTest = FaultTest;

TEST_F(CatalogFaultTest, FirstMergeTakesNoFailureForAnEmptyList) {
  ExpectToSurvive(FirstMerge(), FileErrors(CATALOG, "catalog"));
}

TEST_F(CatalogFaultTest, FirstMergeBesideALogTakesNoFailureForAnEmptyList) {
  Scenario scenario = FirstMerge();
  scenario.name = "a first merge beside a write-ahead log";
  const Database indexer(core::GetCatalogPath(VOLUME));
  indexer.Run("PRAGMA journal_mode = WAL");
  indexer.Run("UPDATE Files SET size = size + 1");
  ExpectToSurvive(scenario, FileErrors(CATALOG, "catalog"));
}

TEST_F(CatalogFaultTest, LaterMergeTakesNoFailureForAnEmptyList) {
  ExpectToSurvive(LaterMerge(), FileErrors(CATALOG, "catalog"));
}

TEST_F(CatalogFaultTest, ReMergeTakesNoFailureForAnEmptyList) {
  ExpectToSurvive(ReMerge(), FileErrors(CATALOG, "catalog"));
}

} // namespace
} // namespace orva::test

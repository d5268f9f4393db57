// Operations on the merged database when requests for its files, or for a catalog, fail.

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
  /// A first creation where the former database is missing, but its journal and the files of an
  /// earlier creation are there.
  Scenario CreationAmongLeftovers() {
    const Scenario merge = LaterMerge();
    const Fault crash = Crashes(MERGED).front();
    const auto run = [&](int nth) {
      int chances = 0;
      OutputOf([&] { chances = crash.run(nth, merge.operation).chances; });
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

  /// Runs the scenario with a sync that the file system does not support: the last one or, with
  /// `beforeLast`, an earlier one.
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

TEST_F(FileFaultTest, LaterMergeRowByRowIsAllOrNothing) {
  ExpectToSurvive(LaterMergeRowByRow(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, ReMergeCanBeRepeatedByTheNextMerge) {
  ExpectToSurvive(ReMerge(), FileErrors(MERGED, "merged database"));
}

TEST_F(FileFaultTest, RemovalIsRepairedByTheNextMerge) {
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

// The process is killed, or the power fails.

using CrashTest = FileFaultTest;

TEST_F(CrashTest, FirstMergeIsAllOrNothing) {
  ExpectToSurvive(FirstMerge(), Crashes(MERGED));
}

TEST_F(CrashTest, FirstMergeWithoutADatabaseIsAllOrNothing) {
  ExpectToSurvive(FirstMergeWithoutADatabase(), Crashes(MERGED));
}

TEST_F(CrashTest, LaterMergeIsAllOrNothing) {
  ExpectToSurvive(LaterMerge(), Crashes(MERGED));
}

TEST_F(CrashTest, LaterMergeRowByRowIsAllOrNothing) {
  ExpectToSurvive(LaterMergeRowByRow(), Crashes(MERGED));
}

TEST_F(CrashTest, ReMergeIsFinishedByTheNextMerge) {
  ExpectToSurvive(ReMerge(), Crashes(MERGED));
}

TEST_F(CrashTest, RemovalIsRepairedByTheNextMerge) {
  ExpectToSurvive(Removal(), Crashes(MERGED));
}

TEST_F(CrashTest, NewDatabaseIsCompleteOrNotThere) {
  ExpectToSurvive(Creation(), Crashes(MERGED));
}

TEST_F(CrashTest, NewDatabaseAmongLeftoversIsCompleteOrNotThere) {
  ExpectToSurvive(CreationAmongLeftovers(), Crashes(MERGED));
}

TEST_F(CrashTest, NewDatabaseSurvivesAPowerLossAfterItsCreation) {
  const Scenario creation = Creation();
  LosePowerAfter(creation.operation, MERGED);
  EXPECT_EQ(creation.after, Content());
}

TEST_F(CrashTest, RemovalOfAllVolumesCanBeRepeated) {
  ExpectToSurvive(Clearing(), Crashes(MERGED));
}

// The volume's catalog cannot be read, or only a part of it.

using CatalogFaultTest = FaultTest;

TEST_F(CatalogFaultTest, FirstMergeDoesNotTakeAFailureForAnEmptyList) {
  ExpectToSurvive(FirstMerge(), FileErrors(CATALOG, "catalog"));
}

TEST_F(CatalogFaultTest, FirstMergeWithALogDoesNotTakeAFailureForAnEmptyList) {
  Scenario scenario = FirstMerge();
  scenario.name = "a first merge beside a write-ahead log";
  const Database indexer(core::GetCatalogPath(VOLUME));
  indexer.Run("PRAGMA journal_mode = WAL");
  indexer.Run("UPDATE Files SET size = size + 1");
  ExpectToSurvive(scenario, FileErrors(CATALOG, "catalog"));
}

TEST_F(CatalogFaultTest, LaterMergeDoesNotTakeAFailureForAnEmptyList) {
  ExpectToSurvive(LaterMerge(), FileErrors(CATALOG, "catalog"));
}

TEST_F(CatalogFaultTest, ReMergeDoesNotTakeAFailureForAnEmptyList) {
  ExpectToSurvive(ReMerge(), FileErrors(CATALOG, "catalog"));
}

} // namespace
} // namespace orva::test

// The merged database where SQLite gets no memory.

#include "FaultAllocator.h"
#include "FaultTest.h"

#include "Database.h"

#include "orvautil/Core.h"

namespace orva::test {
namespace {

Fault FailedAllocation(bool forGood) {
  return {.name = std::string("SQLite's memory: failed allocation") +
                  (forGood ? ", for good" : ", once"),
          .run = [=](int nth, const Action& action) {
            const FaultAllocator faults(nth, forGood);
            action();
            return Fault::Tally{.chances = faults.Seen(), .faults = faults.Failed()};
          }};
}

class AllocationFaultTest : public FaultTest {
protected:
  static void SetUpTestSuite() { FaultAllocator::Install(); }

  const std::vector<Fault> faults = {FailedAllocation(false), FailedAllocation(true)};
};

TEST_F(AllocationFaultTest, FirstMergeIsAllOrNothing) {
  ExpectToSurvive(FirstMerge(), faults);
}

TEST_F(AllocationFaultTest, FirstMergeWithoutADatabaseIsAllOrNothing) {
  ExpectToSurvive(FirstMergeWithoutADatabase(), faults);
}

TEST_F(AllocationFaultTest, LaterMergeIsAllOrNothing) {
  ExpectToSurvive(LaterMerge(), faults);
}

TEST_F(AllocationFaultTest, ReMergeCanBeRepeatedByTheNextMerge) {
  ExpectToSurvive(ReMerge(), faults);
}

TEST_F(AllocationFaultTest, RemovalLeavesNothingBehindForEver) {
  ExpectToSurvive(Removal(), faults);
}

TEST_F(AllocationFaultTest, NewDatabaseIsCompleteOrNotThere) {
  ExpectToSurvive(Creation(), faults);
}

TEST_F(AllocationFaultTest, FailedOpeningChangesNothing) {
  ExpectToSurvive(Opening(), faults);
}

TEST_F(AllocationFaultTest, RemovalOfAllVolumesCanBeRepeated) {
  ExpectToSurvive(Clearing(), faults);
}

// Bytes get an end when they are read as a text, for which there is no room behind 30 of them.
TEST_F(AllocationFaultTest, FirstMergeOfTextsThatNeedMemoryIsAllOrNothing) {
  Scenario scenario = FirstMerge();
  scenario.name = "a first merge of texts stored as bytes";
  Database(core::GetCatalogPath(VOLUME))
      .Run("UPDATE Files SET path = CAST(substr(path || ' and 14 more..', 1, 30) AS BLOB)");
  ExpectToSurvive(scenario, faults);
}

} // namespace
} // namespace orva::test

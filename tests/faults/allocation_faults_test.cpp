// Operations on the merged database when SQLite's allocations fail.

#include "FaultAllocator.h"
#include "FaultTest.h"

#include "Database.h"

#include "orvautil/Core.h"

namespace orva::test {
namespace {

Fault FailedAllocation(bool permanent) {
  return {.name = std::string("SQLite's memory: failed allocation") +
                  (permanent ? ", permanently" : ", once"),
          .run = [=](int nth, const Action& action) {
            const FaultAllocator faults(nth, permanent);
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

TEST_F(AllocationFaultTest, LaterMergeRowByRowIsAllOrNothing) {
  ExpectToSurvive(LaterMergeRowByRow(), faults);
}

TEST_F(AllocationFaultTest, ReMergeCanBeRepeatedByTheNextMerge) {
  ExpectToSurvive(ReMerge(), faults);
}

TEST_F(AllocationFaultTest, RemovalIsRepairedByTheNextMerge) {
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

// SQLite allocates memory to terminate bytes that are read as a text; 30 of them need more.
TEST_F(AllocationFaultTest, FirstMergeOfTextsThatNeedMemoryIsAllOrNothing) {
  Scenario scenario = FirstMerge();
  scenario.name = "a first merge of texts stored as bytes";
  Database(core::GetCatalogPath(VOLUME))
      .Run("UPDATE Files SET path = CAST(substr(path || ' and 14 more..', 1, 30) AS BLOB)");
  ExpectToSurvive(scenario, faults);
}

} // namespace
} // namespace orva::test

#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"
#include "Tracer.h"

#include "support/TestScale.h"

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <functional>
#include <regex>

namespace orva::test {
namespace {

using namespace std::chrono_literals;
using ::testing::AllOf;
using ::testing::AnyOf;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::Gt;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;
using ::testing::StartsWith;

constexpr double PAGE = 4096;

const std::string IGNORED = "Error that we will ignore ";

/// The line with the source files and lines that it names replaced by PLACE.
LogLine MaskPlaces(const LogLine& line) {
  static const std::regex PLACE(R"((\.\./)*src/[A-Za-z/]+\.cpp:\d+)");
  return {line.priority, std::regex_replace(line.text, PLACE, "PLACE")};
}

/// The error lines of a log, with masked places.
Lines Errors(const Log& log) {
  Lines errors;
  for (const LogLine& line : log) {
    if (line.priority == Error("").priority) {
      errors.push_back(MaskPlaces(line).text);
    }
  }
  return errors;
}

/// Lets the daemon handle `message`. Returns the log with masked places.
Log HandleMasked(Appliance& appliance, const std::string& message) {
  Log log;
  for (const LogLine& line : appliance.Handle(message)) {
    log.push_back(MaskPlaces(line));
  }
  return log;
}

/// Lets the daemon handle `message` again and again until it logs no error: at first the volume is
/// full, and each time it gets another page of space. Calls `check` with the log of each failure.
/// Returns the number of failures.
int CountFailuresUntilThereIsSpace(Appliance& appliance, Volume& volume, const std::string& message,
                                   const std::function<void(const Log&)>& check) {
  const double used = volume.Used();
  int pages = 0;
  for (; !::testing::Test::HasFailure(); ++pages) {
    SCOPED_TRACE(std::to_string(pages) + " pages are free");
    EXPECT_LT(pages, 1000);
    volume.Resize(used + pages * PAGE);
    const Log log = HandleMasked(appliance, message);
    if (Errors(log).empty()) {
      break;
    }
    check(log);
  }
  return pages;
}

const std::string INSERT_FOLDERS = "INSERT INTO Folders(parent_folder_id, name, modified_date, "
                                   "volume) SELECT id, name, time, ? FROM temp.input";

/// The text of an SQLite error, as the database layer throws it.
std::string SqliteError(const std::string& reason, const std::string& sql) {
  return "PLACE: " + reason + " in \"" + sql + "\"";
}

/// Volumes A and B are merged into the master A, and B has new photos. Then the master fails.
class MasterOutage : public SystemTest {
protected:
  void SetUp() override {
    appliance.Start();
    Catalog onA(a);
    onA.AddFolder("Pictures/", 500);
    onA.AddPhotos("Pictures/", 100, 1000);
    onB.AddFolder("Pictures/", 600);
    onB.AddPhotos("Pictures/", 100, 1000);
    for (const Volume* volume : {&a, &b}) {
      appliance.Handle(Plugged(volume->Path()));
    }
    appliance.Handle(Scanned(a.Path()));
    for (const Volume* volume : {&a, &b}) {
      appliance.Handle(TranscodedBatch(volume->Path()));
    }
    before = Content();
    onB.AddFolder("New/", 700);
    onB.AddPhotos("New/", 300, 2000);
  }

  Lines Content() const {
    const MergedDatabase merged(a.Path());
    EXPECT_THAT(merged.Faults(), IsEmpty());
    return merged.Content();
  }

  /// The lines before the merge of B.
  Log Announcement() const {
    return BatchLines() +
           Log{Info("MasterVolumeScannedState:: handlePictureTranscoded, doing merge for "
                    "mountPoint /shares/B/ using master volume at /shares/A/")};
  }

  /// The lines of a merge that fails after its first `count` lines.
  static Log BeginOfMerge(std::size_t count, int photos = 300) {
    Log lines = MergeLines("/shares/B/", 3, photos);
    lines.resize(count);
    return lines;
  }

  /// A failed merge logs only the steps that it has completed, and its errors.
  void ExpectBeginOfMerge(Log log, int photos) const {
    std::erase_if(log, [](const LogLine& line) { return line.priority == Error("").priority; });
    ASSERT_GE(log.size(), Announcement().size());
    EXPECT_EQ(Announcement() + BeginOfMerge(log.size() - Announcement().size(), photos), log);
  }

  static std::string Counts(int photos) {
    return "|" + std::to_string(photos) + "|" + std::to_string(photos);
  }

  /// The next merge merges everything, and leaves no other file.
  void ExpectRepairedByTheNextMerge() {
    EXPECT_EQ(Announcement() + MergeLines("/shares/B/", 3, 300),
              appliance.Handle(TranscodedBatch(b.Path())));
    ExpectMerged();
  }

  void ExpectMerged(int photos = 300) const {
    const MergedDatabase merged(a.Path());
    EXPECT_THAT(merged.Faults(), IsEmpty());
    EXPECT_THAT(merged.Files(), SizeIs(200 + photos));
    EXPECT_THAT(merged.Files(), Contains("/shares/B/New/299.jpg|2000|2000|/shares/B/"));
    EXPECT_THAT(merged.Statistics(), Contains("/shares/B/" + Counts(100 + photos) + "|2000"));
    EXPECT_THAT(PathsBelow(a.Path() + "/.zophotos"),
                ElementsAre(a.Path() + "/.zophotos/zophotos.db"));
  }

  Volume a{"A", "150g"};
  Volume b{"B", "1g"};
  Catalog onB{b};
  Lines before; ///< the merged database as it is when the outage begins
};

const std::string FULL = "database or disk is full (extended code 13)";
const std::string LOCKED = "database is locked (extended code 5)";
const std::string READ_ONLY = "attempt to write a readonly database (extended code 8)";

/// The error lines of a merge of B that fails in one of its statements.
Lines FailedIn(const std::string& reason, const std::string& sql) {
  return {IGNORED + SqliteError(reason, sql) + "\n"};
}

/// The error lines when the disk is full, for each statement of a merge that writes, in their
/// order.
std::vector<Lines> FullDiskErrors() {
  const std::string update = "UPDATE Statistics SET photos_xcoded = ?, photos_total = ?, "
                             "last_updated_time = ? where volume = ?";
  return {
      FailedIn(FULL, INSERT_FOLDERS),
      FailedIn(FULL, "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) "
                     "SELECT id, name, time, ?, time FROM temp.input"),
      FailedIn(FULL, "UPDATE Status SET mc_version = ?, mdate = ?, desc = ?, etype = ? WHERE "
                     "id = 1"),
      {"Could not update stats for /shares/B/. Return code 13",
       IGNORED + "PLACE: not committed after a failed step: " + SqliteError(FULL, update) + "\n"},
      FailedIn(FULL, "COMMIT")};
}

TEST_F(MasterOutage, AFullDiskFailsTheMergeUntilThereIsSpace) {
  const int photos = TestScale(300, 5'000);
  onB.AddPhotos("New/", photos - 300, 2000, 300);
  const std::vector<Lines> possible = FullDiskErrors();
  const double used = a.Used();
  std::vector<int> failures(possible.size());
  const auto check = [&](const Log& log) {
    const auto found = std::find(possible.begin(), possible.end(), Errors(log));
    ASSERT_NE(possible.end(), found) << log.back();
    ++failures[static_cast<std::size_t>(found - possible.begin())];
    ExpectBeginOfMerge(log, photos);
    EXPECT_EQ(before, Content());
    EXPECT_EQ(used, a.Used()) << "a failed merge has left something";
  };
  const int pages = CountFailuresUntilThereIsSpace(appliance, a, TranscodedBatch(b.Path()), check);
  ExpectMerged(photos);
  EXPECT_THAT(failures, ElementsAre(Gt(0), Gt(0), ::testing::_, ::testing::_, Gt(0)));
  ReportFigure("merges that failed on a full disk, each with a page more than the last",
               std::to_string(pages));
}

TEST_F(MasterOutage, AFullDiskFailsTheFirstMergeOfAVolume) {
  const Volume c("C", "1g");
  Catalog(c).AddPhoto("c.jpg", 1000, 2000);
  const double used = a.Used();
  a.Resize(used);
  EXPECT_THAT(Errors(appliance.Handle(TranscodedBatch(c.Path()))),
              ElementsAre("Could not insert stats for /shares/C/ ",
                          AllOf(StartsWith(IGNORED), HasSubstr(FULL),
                                HasSubstr("INSERT INTO Statistics"))));
  EXPECT_EQ(before, Content());
  EXPECT_EQ(used, a.Used());

  a.Resize(1e9);
  ExpectRepairedByTheNextMerge();
  EXPECT_THAT(Errors(appliance.Handle(TranscodedBatch(c.Path()))), IsEmpty());
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), Contains("/shares/C/c.jpg|1000|1000|/shares/C/"));
}

/// A removal is not one transaction: if it fails, the time of the volume may already be reset.
TEST_F(MasterOutage, AFullDiskFailsTheRemovalUntilThereIsSpace) {
  const double used = a.Used();
  const auto check = [&](const Log& log) {
    EXPECT_THAT(Errors(log), ElementsAre(AllOf(StartsWith("MessageProcessor:: PLACE: " + FULL),
                                               EndsWith(" WHERE volume = ?\""))));
    const MergedDatabase merged(a.Path());
    EXPECT_THAT(merged.Faults(), IsEmpty());
    EXPECT_THAT(merged.Files(), SizeIs(200));
    EXPECT_THAT(merged.Statistics().at(1), StartsWith("/shares/B/" + Counts(100)));
    EXPECT_EQ(used, a.Used()) << "a failed merge has left something";
  };
  EXPECT_GT(CountFailuresUntilThereIsSpace(appliance, a, Unplugged(b.Path()), check), 1);
  EXPECT_THAT(MergedDatabase(a.Path()).Files(), SizeIs(100));
  a.Resize(1e9);
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(TranscodedBatch(b.Path()));
  ExpectMerged();
}

TEST_F(MasterOutage, AFullDiskFailsTheReMergeUntilThereIsSpace) {
  const double used = a.Used();
  const auto check = [&](const Log& log) {
    // Either its removal has failed, or its merge.
    EXPECT_THAT(Errors(log).back(), AllOf(AnyOf(StartsWith("MessageProcessor:: PLACE: "),
                                                StartsWith(IGNORED + "PLACE: ")),
                                          HasSubstr(FULL)));
    const MergedDatabase merged(a.Path());
    EXPECT_THAT(merged.Faults(), IsEmpty());
    EXPECT_THAT(merged.Files(), AnyOf(SizeIs(200), SizeIs(100)));
    EXPECT_EQ(used, a.Used()) << "a failed merge has left something";
  };
  EXPECT_GT(CountFailuresUntilThereIsSpace(appliance, a, Purged(b.Path()), check), 1);
  ExpectMerged();
}

TEST_F(MasterOutage, AReadOnlyMasterFailsWhatWouldChangeIt) {
  a.MakeReadOnly();
  EXPECT_EQ(Announcement() + BeginOfMerge(3) + Log{Error(FailedIn(READ_ONLY, INSERT_FOLDERS)[0])},
            HandleMasked(appliance, TranscodedBatch(b.Path())));
  for (const std::string& message : {Purged(b.Path()), Unplugged(b.Path())}) {
    EXPECT_THAT(Errors(appliance.Handle(message)),
                ElementsAre(AllOf(StartsWith("MessageProcessor:: PLACE: " + READ_ONLY + " in \""),
                                  EndsWith(" WHERE volume = ?\""))));
  }
  a.MakeWritable();
  ExpectRepairedByTheNextMerge();
}

/// The kernel sends a signal to a program that writes beyond this limit.
TEST_F(MasterOutage, ALimitOnTheSizeOfFilesFailsTheMerge) {
  const rlimit limit{std::filesystem::file_size(a.Path() + "/.zophotos/zophotos.db"),
                     RLIM_INFINITY};
  rlimit unlimited{};
  const pid_t daemon = appliance.Daemon().Pid();
  ASSERT_EQ(0, prlimit(daemon, RLIMIT_FSIZE, &limit, &unlimited));
  EXPECT_THAT(Errors(appliance.Handle(TranscodedBatch(b.Path()))),
              ElementsAre(StartsWith(IGNORED + "PLACE: disk I/O error")));
  EXPECT_EQ(before, Content());
  ASSERT_EQ(0, prlimit(daemon, RLIMIT_FSIZE, &unlimited, nullptr));
  ExpectRepairedByTheNextMerge();
}

/// Another program that uses the merged database while a merge runs.
class MasterLocked : public MasterOutage, public ::testing::WithParamInterface<const char*> {
protected:
  /// Runs a merge of B against the lock, which is released after the merge has waited for half a
  /// second.
  Log HandleLockedForHalfASecond() {
    const MergedDatabase other(a.Path());
    Lock(other);
    {
      Tracer tracer(appliance.Daemon().Pid());
      EXPECT_GE(appliance.HandleUntilSlept(tracer, TranscodedBatch(b.Path()), 500ms), 500ms);
      other.Rows().Run("COMMIT");
    }
    appliance.Barrier();
    return appliance.TakeLog();
  }

  static void Lock(const MergedDatabase& other) {
    other.Rows().Run(GetParam());
    other.Files();
  }

  /// The line of a merge that fails because of the lock.
  static std::string Line() {
    const std::string locked = IGNORED + "PLACE: " + LOCKED + " in \"";
    return locked + (GetParam() == READ_LOCK ? "COMMIT" : "PRAGMA cache_size = -65536") + "\"\n";
  }

public:
  inline static const char* const READ_LOCK = "BEGIN";
  inline static const char* const WRITE_LOCK = "BEGIN EXCLUSIVE";
};

TEST_P(MasterLocked, ForHalfASecondKeepsTheMergeWaiting) {
  EXPECT_EQ(Announcement() + MergeLines("/shares/B/", 3, 300), HandleLockedForHalfASecond());
  ExpectMerged(300);
}

TEST_P(MasterLocked, ForFiveSecondsFailsFiveMerges) {
  {
    const MergedDatabase other(a.Path());
    Lock(other);
    for (int i = 0; i < 5; ++i) {
      EXPECT_THAT(Errors(appliance.Handle(TranscodedBatch(b.Path()))), ElementsAre(Line()));
    }
    other.Rows().Run("COMMIT");
  }
  ExpectRepairedByTheNextMerge();
}

INSTANTIATE_TEST_SUITE_P(By, MasterLocked,
                         ::testing::Values(MasterLocked::READ_LOCK, MasterLocked::WRITE_LOCK),
                         [](const auto& tested) {
                           return tested.param == MasterLocked::READ_LOCK ? "AReader" : "AWriter";
                         });

/// A disk that is full when the daemon creates the database there.
TEST_F(SystemTest, AFullDiskKeepsTheDatabaseFromBeingMadeUntilThereIsSpace) {
  appliance.Start();
  Volume a("A", "150g");
  Catalog(a).AddPhoto("a.jpg", 1000, 2000);
  appliance.Handle(Plugged(a.Path()));
  const auto check = [&](const Log& log) {
    EXPECT_THAT(Errors(log), ElementsAre(StartsWith("MessageProcessor:: ")));
    EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
    EXPECT_FALSE(HasMergedDatabase(a.Path()));
  };
  EXPECT_GT(CountFailuresUntilThereIsSpace(appliance, a, Scanned(a.Path()), check), 5);
  EXPECT_EQ("zophotos_db_path=/shares/A//.zophotos/zophotos.db\n", Appliance::Locator());
  a.Resize(1e9);
  EXPECT_THAT(Errors(appliance.Handle(TranscodedBatch(a.Path()))), IsEmpty());
  const MergedDatabase merged(a.Path());
  EXPECT_THAT(merged.Faults(), IsEmpty());
  EXPECT_THAT(merged.Files(), ElementsAre("/shares/A/a.jpg|1000|1000|/shares/A/"));
  EXPECT_THAT(PathsBelow(a.Path() + "/.zophotos"), ElementsAre("/shares/A/.zophotos/zophotos.db"));
}

} // namespace
} // namespace orva::test

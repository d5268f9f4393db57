#include "FaultTest.h"

#include "Catalog.h"
#include "Database.h"
#include "PhotoDB.h"

#include "support/TestScale.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

namespace orva::test {

using dbmerger::PhotoDB;
using ::testing::Contains;
using ::testing::IsEmpty;

const std::string FaultTest::MASTER = "/shares/Master/";
const std::string FaultTest::VOLUME = "/shares/Vol/";

namespace {

const std::string OTHER = "/shares/Other/";
const std::string DIRECTORY = "/shares/Master/.zophotos";
const std::string DATABASE = DIRECTORY + "/zophotos.db";

const Lines NO_DATABASE = {"no database"};

constexpr int FOLDERS = 6;
constexpr int PHOTOS = 8; ///< in each

std::string FolderPath(int folder) {
  return "2020-" + std::to_string(folder) + "/";
}

std::string PhotoPath(int folder, int photo) {
  return FolderPath(folder) + "IMG_" + std::to_string(photo) + ".jpg";
}

Catalog MakeCatalog(const std::string& volume) {
  std::filesystem::remove_all(volume);
  Catalog catalog(volume);
  // Small pages and a small cache, so that more pages are read.
  catalog.Rows().Run("PRAGMA default_cache_size = 1");
  catalog.Rows().Run("PRAGMA page_size = 512");
  catalog.Rows().Run("VACUUM");
  for (int folder = 1; folder <= FOLDERS; ++folder) {
    catalog.AddFolder(FolderPath(folder), 100 + folder);
    for (int photo = 1; photo <= PHOTOS; ++photo) {
      catalog.AddPhoto(PhotoPath(folder, photo), 1'000 + photo, 10'000 + folder * 100 + photo);
    }
  }
  return catalog;
}

/// Changes of an indexer between two merges: new photos, a new folder, deleted photos and a folder.
void Change(Catalog& catalog) {
  catalog.AddFolder(FolderPath(FOLDERS + 1), 200);
  for (int photo = 1; photo <= PHOTOS; ++photo) {
    catalog.AddPhoto(PhotoPath(FOLDERS + 1, photo), 1'000 + photo, 20'000 + photo);
    catalog.DeletePhoto(PhotoPath(1, photo), 20'100 + photo);
  }
  catalog.AddPhoto(PhotoPath(2, PHOTOS + 1), 1'000 + PHOTOS + 1, 20'200);
  catalog.DeletePhoto(PhotoPath(3, 1), 20'201);
  catalog.DeleteFolder(FolderPath(1));
}

std::string ReadFile(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

/// The lines that only one of two contents has: "- " of the first, "+ " of the second.
Lines Difference(Lines first, Lines second) {
  std::ranges::sort(first);
  std::ranges::sort(second);
  Lines less;
  Lines more;
  std::ranges::set_difference(first, second, std::back_inserter(less));
  std::ranges::set_difference(second, first, std::back_inserter(more));
  Lines difference;
  for (const std::string& line : less) {
    difference.push_back("- " + line);
  }
  for (const std::string& line : more) {
    difference.push_back("+ " + line);
  }
  return difference;
}

Lines Integrity() {
  return std::filesystem::exists(DATABASE) ? Database(DATABASE).Run("PRAGMA integrity_check")
                                           : Lines{"ok"};
}

} // namespace

FaultTest::FaultTest() {
  MakeDirectory(MASTER);
  // The merger's thread must have ended before a test forks.
  merger.Wait();
}

FaultTest::~FaultTest() {
  merger.stopRequested = true;
  merger.Wait();
}

Lines FaultTest::Content() {
  if (!std::filesystem::exists(DATABASE)) {
    return NO_DATABASE;
  }
  const MergedDatabase database(MASTER);
  return database.Rows().Run("SELECT mdate FROM Status") + database.Content();
}

FaultTest::Files FaultTest::TakeFiles() {
  if (!std::filesystem::exists(DIRECTORY)) {
    return std::nullopt;
  }
  std::map<std::string, std::string> files;
  for (const auto& entry : std::filesystem::directory_iterator(DIRECTORY)) {
    files[entry.path().filename()] = ReadFile(entry.path());
  }
  return files;
}

void FaultTest::RestoreFiles(const Files& files) {
  std::filesystem::remove_all(DIRECTORY);
  if (files) {
    MakeDirectory(DIRECTORY);
    for (const auto& [name, content] : *files) {
      std::ofstream(DIRECTORY + "/" + name, std::ios::binary) << content;
    }
  }
}

// The scenarios.

void FaultTest::Merge(const std::string& volume) {
  merger.MergeDB(MASTER, volume);
}

/// Completes the scenario from the files that are there now. `volumes` are those of a complete
/// database after it; none where that is not checked.
FaultTest::Scenario FaultTest::Finish(Scenario scenario, const Lines& volumes) {
  scenario.files = TakeFiles();
  scenario.before = Content();
  OutputOf(scenario.operation);
  scenario.after = Content();
  if (!volumes.empty()) {
    RestoreFiles(std::nullopt);
    for (const std::string& volume : volumes) {
      OutputOf([&] { Merge(volume); });
    }
    scenario.merged = Content();
  }
  RestoreFiles(scenario.files);
  return scenario;
}

FaultTest::Scenario FaultTest::FirstMerge() {
  MakeCatalog(VOLUME);
  PhotoDB(MASTER).Init();
  return Finish({.name = "a first merge", .operation = [this] { Merge(VOLUME); }, .throws = false},
                {VOLUME});
}

FaultTest::Scenario FaultTest::FirstMergeWithoutADatabase() {
  Scenario scenario = FirstMerge();
  scenario.name = "a first merge without a database";
  scenario.between = {scenario.before};
  scenario.files = std::nullopt;
  scenario.before = NO_DATABASE;
  return scenario;
}

/// Merges both volumes and then changes the catalog of VOLUME.
void FaultTest::MakeMergedVolumes() {
  MakeCatalog(OTHER);
  Catalog catalog = MakeCatalog(VOLUME);
  OutputOf([this] { Merge(OTHER); });
  OutputOf([this] { Merge(VOLUME); });
  Change(catalog);
}

FaultTest::Scenario FaultTest::LaterMerge() {
  MakeMergedVolumes();
  return Finish({.name = "a later merge", .operation = [this] { Merge(VOLUME); }, .throws = false},
                {OTHER, VOLUME});
}

/// The same in a database whose rows are changed one by one, because an index is missing.
FaultTest::Scenario FaultTest::LaterMergeRowByRow() {
  MakeMergedVolumes();
  Database(DATABASE).Run("DROP INDEX Files_name");
  Scenario scenario = Finish(
      {.name = "a later merge row by row", .operation = [this] { Merge(VOLUME); }, .throws = false},
      {OTHER, VOLUME});
  std::erase(scenario.merged, "index|Files_name|Files|CREATE INDEX Files_name ON Files(name)");
  return scenario;
}

/// The content between the removal of a volume and its merge.
Lines FaultTest::ContentAfterDeletion() {
  const Files files = TakeFiles();
  for (const char* const sql :
       {"UPDATE Statistics SET last_updated_time = 0 WHERE volume = ?",
        "DELETE FROM Files WHERE volume = ?", "DELETE FROM Folders WHERE volume = ?"}) {
    Database(DATABASE).Run(sql, {VOLUME});
  }
  Lines content = Content();
  RestoreFiles(files);
  return content;
}

FaultTest::Scenario FaultTest::ReMerge() {
  MakeMergedVolumes();
  return Finish({.name = "a re-merge",
                 .operation = [this] { merger.ReMergeDB(MASTER, VOLUME); },
                 .between = {ContentAfterDeletion()}},
                {OTHER, VOLUME});
}

FaultTest::Scenario FaultTest::Removal() {
  MakeMergedVolumes();
  return Finish({.name = "a removal of a volume",
                 .operation = [this] { merger.RemoveVolume(MASTER, VOLUME); }},
                {OTHER, VOLUME});
}

FaultTest::Scenario FaultTest::Creation() {
  MakeCatalog(VOLUME);
  return Finish({.name = "a first creation", .operation = [] { PhotoDB(MASTER).Init(); }},
                {VOLUME});
}

FaultTest::Scenario FaultTest::Opening() {
  MakeMergedVolumes();
  return Finish({.name = "an opening",
                 .operation =
                     [] {
                       PhotoDB photos(MASTER);
                       photos.Init();
                       EXPECT_EQ("2.0", photos.status.mc_version);
                       EXPECT_EQ(1000, photos.status.mdate);
                     }},
                {});
}

FaultTest::Scenario FaultTest::Clearing() {
  MakeMergedVolumes();
  return Finish({.name = "a removal of all volumes",
                 .operation =
                     [] {
                       PhotoDB photos(MASTER);
                       photos.Init();
                       photos.DeleteVolumes();
                     }},
                {});
}

// The runs.

void FaultTest::ExpectToSurvive(const Scenario& scenario, const std::vector<Fault>& faults) {
  ASSERT_THAT(scenario.between, ::testing::Not(Contains(scenario.before)));
  int runs = 0;
  for (const Fault& fault : faults) {
    SCOPED_TRACE(scenario.name + ", " + fault.name);
    const int made = RunWith(scenario, fault);
    if (HasFailure()) {
      return;
    }
    if (made != 0) {
      ReportFigure("faults injected into " + scenario.name + ", " + fault.name,
                   std::to_string(made));
    }
    runs += made;
  }
  EXPECT_NE(0, runs);
}

/// Returns how often the operation was run with the fault.
int FaultTest::RunWith(const Scenario& scenario, const Fault& fault) {
  constexpr int shortRuns = 10;
  RestoreFiles(scenario.files);
  const int chances = Try(fault, 0, scenario.operation).tally.chances;
  EXPECT_EQ(scenario.after, Content());
  const int step = TestScale(std::max(1, chances / shortRuns), 1);
  int runs = 0;
  for (int nth = 1; nth <= chances && !HasFailure(); nth += step) {
    SCOPED_TRACE("at opportunity " + std::to_string(nth) + " of " + std::to_string(chances));
    RestoreFiles(scenario.files);
    const Outcome outcome = Try(fault, nth, scenario.operation);
    EXPECT_NE(0, outcome.tally.faults);
    CheckOutcome(scenario, fault, outcome);
    ++runs;
  }
  return runs;
}

FaultTest::Outcome FaultTest::Try(const Fault& fault, int nth, const Action& action) {
  Outcome outcome;
  const Action catching = [&] {
    try {
      action();
    } catch (const std::string& error) {
      outcome.thrown.push_back(error);
    }
  };
  OutputOf([&] { outcome.tally = fault.run(nth, catching); });
  for (const LogLine& line : Logged()) {
    if (line.text.starts_with("Error that we will ignore ")) {
      outcome.logged.push_back(line.text);
    }
  }
  return outcome;
}

void FaultTest::CheckOutcome(const Scenario& scenario, const Fault& fault, const Outcome& outcome) {
  const Files left = TakeFiles();
  const Lines content = Content();
  EXPECT_EQ(Lines{"ok"}, Integrity());

  std::vector<Lines> possible = scenario.between;
  possible.push_back(scenario.before);
  possible.push_back(scenario.after);
  EXPECT_TRUE(std::ranges::find(possible, content) != possible.end())
      << "from before: " << ::testing::PrintToString(Difference(scenario.before, content))
      << "\nfrom after: " << ::testing::PrintToString(Difference(scenario.after, content));

  if (!fault.endsProcess) {
    Lines complaints = outcome.thrown;
    complaints.insert(complaints.end(), outcome.logged.begin(), outcome.logged.end());
    EXPECT_LE(complaints.size(), 1U) << ::testing::PrintToString(complaints);
    if (content != scenario.after) {
      EXPECT_FALSE(complaints.empty());
    }
    if (!scenario.throws) {
      EXPECT_THAT(outcome.thrown, IsEmpty());
    }
  }

  RestoreFiles(left);
  ExpectSuccess(scenario.operation, scenario.after);
  if (content != scenario.before && !scenario.merged.empty()) {
    RestoreFiles(left);
    ExpectSuccess([this] { Merge(VOLUME); }, scenario.merged);
  }
}

/// Runs an operation without a fault after one with a fault.
void FaultTest::ExpectSuccess(const Action& action, const Lines& content) {
  const Fault none{.name = "none", .run = [](int /*nth*/, const Action& operation) {
                     operation();
                     return Fault::Tally();
                   }};
  const Outcome outcome = Try(none, 0, action);
  EXPECT_THAT(outcome.thrown, IsEmpty());
  EXPECT_THAT(outcome.logged, IsEmpty());
  EXPECT_THAT(Difference(content, Content()), IsEmpty());
  EXPECT_EQ(Lines{"ok"}, Integrity());
  for (const auto& [name, bytes] : TakeFiles().value_or(std::map<std::string, std::string>{})) {
    EXPECT_EQ("zophotos.db", name);
  }
}

} // namespace orva::test

// zophotos while the daemon merges: what a watch prints, and that readers do not block merges.

#include "PeakMemory.h"
#include "ZophotosTest.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;
using ::testing::ContainsRegex;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;

class ZophotosWatch : public ZophotosTest {
protected:
  /// Starts a watch and waits for its first line.
  void Start(const Arguments& options = {"--json"}) {
    Arguments arguments{"watch"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    watch = std::make_unique<Program>(ZophotosCommand(arguments));
    first = watch->ReadLine();
  }

  /// The next line without its time.
  std::string Next() {
    const std::string line = watch->ReadLine();
    const json object = json::parse(line, nullptr, false);
    EXPECT_THAT(object.value("time", ""),
                MatchesRegex("20[0-9]{2}-[0-9]{2}-[0-9]{2}T[0-9]{2}:[0-9]{2}:[0-9]{2}Z"))
        << line;
    const std::size_t event = line.find(R"("event")");
    return event == std::string::npos ? line : line.substr(event);
  }

  /// Reads "changed" lines until these numbers of folders and files were removed. False after any
  /// other line.
  bool AwaitRemoval(int folders, int files) {
    while (folders > 0 || files > 0) {
      const json line = json::parse(watch->ReadLine(), nullptr, false);
      if (line.value("event", "") != "changed" || line.value("files_added", -1) != 0 ||
          line.value("folders_added", -1) != 0) {
        return false;
      }
      folders -= line.value("folders_removed", 0);
      files -= line.value("files_removed", 0);
    }
    return folders == 0 && files == 0;
  }

  std::unique_ptr<Program> watch;
  std::string first;
};

const std::string OPENED_A =
    R"("event":"opened","database":"/shares/A//.zophotos/zophotos.db","folders":8,"files":4})";

TEST_F(ZophotosWatch, PrintsTheDatabaseFirst) {
  Start({});
  EXPECT_THAT(first,
              MatchesRegex("20[0-9-]+ [0-9:]+  watching " + MERGED + ": 8 folders, 4 files"));
  Start();
  EXPECT_THAT(first, EndsWith("Z\"," + OPENED_A));
}

TEST_F(ZophotosWatch, ReportsAMerge) {
  Start();
  onB.AddFolder("New/", 5);
  onB.AddPhoto("New/1.jpg", 7, 3001);
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  Merge(b);
  EXPECT_EQ(
      Next(),
      R"("event":"changed","folders_added":1,"folders_removed":0,"files_added":2,"files_removed":0,"volumes":[{"volume":"/shares/B/","transcoded":3,"total":5,"merged_up_to":"1970-01-01T00:50:02Z"}]})");
}

TEST_F(ZophotosWatch, ReportsAMergeInText) {
  Start({});
  onB.AddFolder("New/", 5);
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  Merge(b);
  EXPECT_THAT(watch->ReadLine(),
              MatchesRegex("20[0-9-]+ [0-9:]+  added 1 folder and 1 file; /shares/B/: 2 of 4 "
                           "photos transcoded"));
  onB.DeletePhoto("Old/4.jpg", 3003);
  onB.DeletePhoto("Old/1.jpg", 3004);
  Merge(b);
  EXPECT_THAT(watch->ReadLine(),
              MatchesRegex(".*  removed 2 files; /shares/B/: 0 of 2 photos transcoded"));
}

TEST_F(ZophotosWatch, ReportsAdditionsAndRemovalsInOneLine) {
  Start();
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  onB.DeletePhoto("Old/1.jpg", 3003);
  Merge(b);
  EXPECT_THAT(Next(), HasSubstr(R"("files_added":1,"files_removed":1,)"));
}

TEST_F(ZophotosWatch, ReportsAWriteWithoutAdditionsOrRemovals) {
  Start({});
  Database(MERGED).Run("UPDATE Status SET mdate = 1001");
  EXPECT_THAT(watch->ReadLine(),
              EndsWith("  the daemon wrote to the database, but added and removed nothing"));
}

TEST_F(ZophotosWatch, ReportsAnUnpluggedVolume) {
  Start();
  appliance.Handle(Unplugged(b.Path()));
  EXPECT_TRUE(AwaitRemoval(2, 1));
}

TEST_F(ZophotosWatch, ReportsThatAVolumeWillBeMergedFromTheBeginning) {
  const Database copy = Copy();
  Start({"--database", COPY});
  copy.Run("UPDATE Statistics SET last_updated_time = 0 WHERE volume = '/shares/B/'");
  EXPECT_THAT(watch->ReadLine(),
              EndsWith("  /shares/B/: unplugged or purged, will be merged from the beginning"));
}

TEST_F(ZophotosWatch, ReportsANewVolumeWithoutRenditions) {
  const Database copy = Copy();
  Start({"--database", COPY});
  copy.Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) "
           "VALUES('/shares/E/', 0, 7, 0)");
  EXPECT_THAT(watch->ReadLine(), EndsWith("  /shares/E/: 0 of 7 photos transcoded"));
}

TEST_F(ZophotosWatch, PrintsNothingWhileNothingChanges) {
  Start();
  MergedDatabase(a.Path()).Files();
  Zophotos({"check"});
  appliance.Barrier();
  const std::string locator = Appliance::Locator();
  std::ofstream(LOCATOR) << locator;
  AwaitLooks(*watch);
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  Merge(b);
  EXPECT_THAT(Next(), HasSubstr(R"("event":"changed","folders_added":0)"));
  AwaitLooks(*watch);
  onB.AddPhoto("Old/5.jpg", 7, 3003);
  Merge(b);
  EXPECT_THAT(
      Next(),
      HasSubstr(
          R"("files_added":1,"files_removed":0,"volumes":[{"volume":"/shares/B/","transcoded":3,)"));
}

TEST_F(ZophotosWatch, FollowsTheDatabaseToAnotherMaster) {
  Start();
  appliance.Handle(Unplugged(a.Path()));
  EXPECT_THAT(
      watch->ReadLineWith("/shares/B"),
      EndsWith(
          R"("event":"opened","database":"/shares/B//.zophotos/zophotos.db","folders":1,"files":0})"));
  Merge(b);
  EXPECT_THAT(Next(), HasSubstr(R"("folders_added":2,"folders_removed":0,"files_added":1,)"));
}

TEST_F(ZophotosWatch, ReportsOnceThatTheDatabaseIsLost) {
  Start();
  const std::string locator = Appliance::Locator();
  std::ofstream(LOCATOR) << "zophotos_db_path=\n";
  EXPECT_EQ(
      Next(),
      R"("event":"lost","reason":"no merged database: /tmp/zophotodbmerger.conf names no database at the moment"})");
  AwaitLooks(*watch);
  std::ofstream(LOCATOR) << locator;
  EXPECT_EQ(Next(), OPENED_A);
}

TEST_F(ZophotosWatch, WaitsForADatabase) {
  const std::string locator = Appliance::Locator();
  fs::remove(LOCATOR);
  Start({});
  EXPECT_THAT(first, EndsWith("  no merged database: /tmp/zophotodbmerger.conf does not exist; "
                              "the daemon creates it when it starts"));
  std::ofstream(LOCATOR) << locator;
  EXPECT_THAT(watch->ReadLine(), EndsWith("8 folders, 4 files"));
}

TEST_F(ZophotosWatch, DetectsAReplacedDatabaseFile) {
  Copy();
  Start({"--json", "--database", COPY});
  fs::rename(COPY, COPY + ".old");
  EXPECT_EQ(Next(),
            R"("event":"lost","reason":"no merged database: )" + COPY + R"( does not exist"})");
  fs::copy_file(MERGED, COPY + ".new");
  Database(COPY + ".new").Run("DELETE FROM Files");
  fs::rename(COPY + ".new", COPY);
  EXPECT_EQ(Next(), R"("event":"opened","database":")" + COPY + R"(","folders":8,"files":0})");
}

TEST_F(ZophotosWatch, PrintsNothingForAShortLock) {
  const Database copy = Copy();
  Start({"--json", "--database", COPY});
  copy.Run("BEGIN EXCLUSIVE");
  copy.Run("DELETE FROM Files WHERE name = '1.jpg'");
  AwaitLooks(*watch);
  copy.Run("COMMIT");
  EXPECT_THAT(Next(), HasSubstr(R"("files_removed":1)"));
}

TEST_F(ZophotosWatch, ReportsALongLockOnce) {
  const Database copy = Copy();
  Start({"--json", "--database", COPY});
  copy.Run("BEGIN EXCLUSIVE");
  EXPECT_EQ(Next(), R"("event":"delayed","reason":")" + COPY +
                        R"( is locked, for example while a large merge commits; try again"})");
  AwaitLooks(*watch);
  copy.Run("DELETE FROM Files WHERE name = '1.jpg'");
  copy.Run("COMMIT");
  EXPECT_THAT(Next(), HasSubstr(R"("files_removed":1)"));
}

TEST_F(ZophotosWatch, CountsAdditionsAndRemovalsBetweenTwoLooks) {
  const Database copy = Copy();
  Start({"--json", "--database", COPY});
  copy.Run("BEGIN");
  copy.Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
           "folder_id, 'new ' || name, 1, volume, 1 FROM Files");
  copy.Run("DELETE FROM Files");
  copy.Run("COMMIT");
  EXPECT_THAT(Next(), HasSubstr(R"("files_added":4,"files_removed":8)"));
}

TEST_F(ZophotosWatch, EndsOnSignals) {
  for (const int signal : {SIGINT, SIGTERM}) {
    Start();
    watch->Signal(signal);
    EXPECT_EQ(128 + signal, watch->WaitForEnd());
  }
}

TEST_F(ZophotosWatch, EndsWhenItsOutputIsClosed) {
  Start();
  watch->CloseOutput();
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  Merge(b);
  EXPECT_EQ(128 + SIGPIPE, watch->WaitForEnd());
}

TEST_F(ZophotosWatch, MakesNoMergeFail) {
  std::vector<std::unique_ptr<Program>> others;
  for (int i = 0; i < 4; ++i) {
    others.push_back(std::make_unique<Program>(ZophotosCommand({"watch"})));
    others.back()->ReadLine();
  }
  Start();
  appliance.TakeLog();
  for (int i = 1; i <= 10; ++i) {
    onB.AddPhotos("Old/", 50, 3000 + i, i * 50 + 100);
    for (const LogLine& line : appliance.Handle(TranscodedBatch(b.Path()))) {
      EXPECT_NE(Error("").priority, line.priority) << line.text;
    }
    // The other watches look at about the same time.
    const std::string transcoded = std::to_string(i * 50 + 1);
    EXPECT_THAT(watch->ReadLineWith("\"transcoded\":" + transcoded + ","),
                HasSubstr(R"("files_added":50,)"));
  }
}

/// A merged database whose listing does not fit into a pipe.
class ZophotosSlowReader : public ZophotosTest {
protected:
  void SetUp() override {
    ZophotosTest::SetUp();
    onB.AddFolder("Many/", 1);
    onB.AddPhotos("Many/", PHOTOS, 3000);
    Merge(b);
  }

  static constexpr int PHOTOS = 4000;
};

TEST_F(ZophotosSlowReader, DoesNotBlockMerges) {
  Program slowCsv(ZophotosCommand({"export", "--csv"}));
  Program slowLines(ZophotosCommand({"export", "--jsonl"}));
  Program slowFind(ZophotosCommand({"find", "*"}));
  Program slowList(ZophotosCommand({"ls", "B/Many", "--json"}));
  const std::vector<Program*> slow{&slowCsv, &slowLines, &slowFind, &slowList};
  for (Program* const program : slow) {
    EXPECT_NE("(end)", program->ReadLine());
  }
  onB.AddPhoto("Old/late.jpg", 7, 4000);
  onB.AddPhoto("Many/late.jpg", 7, 4000);
  Merge(b);
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ::testing::Contains("/shares/B/Old/late.jpg|7|7|/shares/B/"));
  // The full pipe has blocked them all, and they print the state from before the merge.
  for (const auto& [program, rest] :
       std::vector<std::pair<Program*, int>>{{&slowCsv, PHOTOS + 4},
                                             {&slowLines, PHOTOS + 3},
                                             {&slowFind, PHOTOS + 12},
                                             {&slowList, PHOTOS - 1}}) {
    std::string output;
    program->ReadToEnd(output, output);
    EXPECT_EQ(rest, std::ranges::count(output, '\n'));
    EXPECT_EQ(std::string::npos, output.find("late"));
    EXPECT_EQ(0, program->WaitForEnd());
  }
}

TEST_F(ZophotosSlowReader, PutsThePrivateCopyInTheGivenFolder) {
  AddFiles(Copy(), 50'000, "1", "i");
  fs::create_directory("/tmp/space");
  setenv("SQLITE_TMPDIR", "/tmp/space", 1);
  Program program(ZophotosCommand(OnCopyArguments({"export", "--csv"})));
  unsetenv("SQLITE_TMPDIR");
  program.ReadLine();
  std::string links;
  for (const auto& file :
       fs::directory_iterator("/proc/" + std::to_string(program.Pid()) + "/fd")) {
    links += fs::read_symlink(file).string() + '\n';
  }
  EXPECT_THAT(links, ContainsRegex("\n/tmp/space/[^\n]* \\(deleted\\)\n"));
  EXPECT_THAT(links, ::testing::Not(HasSubstr(COPY)));
}

/// The peak memory of an export of `rows` files in KiB, before its last `rest` rows are read.
long PeakOfExport(const Database& copy, int rows, int rest) {
  copy.Run("DELETE FROM Files");
  copy.Run("DELETE FROM Folders WHERE folder_id != 1");
  copy.Run("WITH RECURSIVE n(i) AS (SELECT 2 UNION ALL SELECT i + 1 FROM n WHERE i < 101) INSERT "
           "INTO Folders(folder_id, parent_folder_id, name, modified_date, volume) SELECT i, 1, "
           "'/shares/A/' || i || '/', 1, '/shares/A/' FROM n");
  AddFiles(copy, rows, "2 + i % 100", "hex(i) || '.jpg'");
  Program program(ZophotosCommand(OnCopyArguments({"export", "--csv"})));
  for (int i = 0; i < rows - rest; ++i) {
    program.ReadLine();
  }
  const long peak = PeakOf(program.Pid());
  std::string output;
  program.ReadToEnd(output, output);
  EXPECT_EQ(rest + 1, std::ranges::count(output, '\n'));
  EXPECT_EQ(0, program.WaitForEnd());
  return peak;
}

TEST_F(ZophotosSlowReader, ExportsInConstantMemory) {
  // The address sanitizer keeps freed memory, which would be counted.
  setenv("ASAN_OPTIONS", "quarantine_size_mb=0:thread_local_quarantine_size_kb=0", 1);
  const Database copy = Copy();
  // Both exports fill the caches of SQLite.
  const long some = PeakOfExport(copy, 100'000, 2500);
  const long many = PeakOfExport(copy, 200'000, 2500);
  unsetenv("ASAN_OPTIONS");
  EXPECT_LT(many - some, 1024) << some << " KiB, " << many << " KiB";
}

} // namespace
} // namespace orva::test

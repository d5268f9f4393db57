// zophotos export --changes: what a feed says, and that a reader that applies all feeds has the
// photos of the database, whatever happens to the exporter and its files.

#include "Feeds.h"
#include "Terminal.h"
#include "ZophotosTest.h"

#include "support/TestScale.h"
#include "support/Thrown.h"
#include "system/PeakMemory.h"
#include "system/Tracer.h"

#include <sys/stat.h>

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;
using ::testing::StartsWith;
using Result = FeedReader::Result;

const std::string STATE = "/tmp/state/feed";
const std::string NEXT = STATE + ".next";

std::string Content(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  std::ostringstream text;
  text << file.rdbuf();
  return text.str();
}

void Save(const std::string& path, const std::string& content) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << content;
}

/// Exports the changes of the copy.
Outcome Export(Arguments more = {}) {
  Arguments arguments{"export", "--changes", STATE};
  arguments.insert(arguments.end(), more.begin(), more.end());
  return OnCopy(arguments);
}

/// The feed of an export that succeeds.
ParsedFeed Feed(const Arguments& more = {}) {
  const Outcome outcome = Export(more);
  EXPECT_EQ(0, outcome.status);
  EXPECT_EQ("", outcome.error);
  ParsedFeed feed(outcome.output);
  EXPECT_TRUE(feed.isComplete) << outcome.output;
  return feed;
}

Lines Texts(const ParsedFeed& feed) {
  Lines texts;
  for (const ParsedFeed::Row& row : feed.rows) {
    texts.push_back((row.sign > 0 ? "+" : "-") +
                    row.text.substr(0, row.text.find(",\"/shares/A/\"")));
  }
  return texts;
}

class ZophotosChanges : public ZophotosTest {
protected:
  void SetUp() override {
    ZophotosTest::SetUp();
    fs::remove_all("/tmp/state");
    fs::create_directory("/tmp/state");
    Copy();
  }

  /// Photos of nothing but these names, in one folder.
  static void SetFiles(const Lines& names) {
    const Database copy(COPY);
    copy.Run("DELETE FROM Files");
    for (const std::string& name : names) {
      copy.Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
               "folder_id, ?, 1, volume, 2 FROM Folders WHERE name = '/shares/A/'",
               {name});
    }
  }

  static void ExpectFailure(const Outcome& outcome, int status, const std::string& message) {
    ExpectError(outcome, status, "zophotos: " + message + "\n");
  }
};

TEST_F(ZophotosChanges, FirstFeedIsWhole) {
  SetFiles({"b", "a"});
  EXPECT_THAT(
      Export().output,
      MatchesRegex("feed,1,[0-9a-f]{32},,whole,20[0-9-]*T[0-9:]*Z\n"
                   "sign,path,volume,modified,created\n"
                   "1,\"/shares/A/a\",\"/shares/A/\",1970-01-01T00:00:01Z,1970-01-01T00:00:02Z\n"
                   "1,\"/shares/A/b\",\"/shares/A/\",1970-01-01T00:00:01Z,1970-01-01T00:00:02Z\n"
                   "end,1,[0-9a-f]{32},2,2\n"));
}

TEST_F(ZophotosChanges, FeedsHaveNumbersAndNameTheirPredecessors) {
  const ParsedFeed first = Feed();
  const ParsedFeed second = Feed();
  const ParsedFeed third = Feed();
  EXPECT_EQ(1, first.number);
  EXPECT_EQ(2, second.number);
  EXPECT_EQ(3, third.number);
  EXPECT_EQ("", first.previous);
  EXPECT_EQ(first.id, second.previous);
  EXPECT_EQ(second.id, third.previous);
  EXPECT_TRUE(first.isWhole);
  EXPECT_FALSE(second.isWhole);
  EXPECT_EQ(4, first.rows.size());
  EXPECT_EQ(0, second.rows.size());
  EXPECT_EQ(4, second.photos);
}

TEST_F(ZophotosChanges, NextFeedHasOnlyTheChanges) {
  SetFiles({"a", "b", "c"});
  Feed();
  SetFiles({"b", "c", "d"});
  EXPECT_THAT(Texts(Feed()), ElementsAre("-\"/shares/A/a\"", "+\"/shares/A/d\""));
}

TEST_F(ZophotosChanges, PhotoWithOtherTimesGoesAndComes) {
  SetFiles({"a", "b"});
  Feed();
  for (const char* const change : {"modified_date = 3", "modified_date = -1", "created_date = 0"}) {
    Database(COPY).Run("UPDATE Files SET " + std::string(change) + " WHERE name = 'a'");
    EXPECT_THAT(Texts(Feed()), ElementsAre("-\"/shares/A/a\"", "+\"/shares/A/a\"")) << change;
  }
  Database(COPY).Run("UPDATE Folders SET volume = '/shares/'");
  EXPECT_EQ(4, Feed().rows.size());
}

TEST_F(ZophotosChanges, RowsAreOrderedByPath) {
  SetFiles({"b", "n!", "n~", "z", "B"});
  const Database copy(COPY);
  AddRows(copy, "'/shares/A/n/'", "'x'");
  AddRows(copy, "'/shares/A/n!/'", "'x'");
  AddRows(copy, "'/shares/A/n/b/'", "'x'");
  AddRows(copy, "'/shares/A/n/b/'", "'y'");
  AddRows(copy, "'/shares/A/n/c'", "'x'"); // a folder without a separator
  AddRows(copy, "'/shares/A/n/'", "'b/xx'");
  AddRows(copy, "'/shares/A/n/'", "CAST(x'ff' AS TEXT)");
  const Lines texts = Texts(Feed());
  EXPECT_EQ(12, texts.size());
  EXPECT_TRUE(std::ranges::is_sorted(texts, {}, [](const std::string& text) {
    return text.substr(0, text.size() - 1); // without the quote at the end
  })) << ::testing::PrintToString(texts);
}

TEST_F(ZophotosChanges, JsonLinesHaveTheSameFeed) {
  SetFiles({"a"});
  const Outcome whole = Export({"--jsonl"});
  EXPECT_THAT(whole.output,
              MatchesRegex(R"(\{"feed":"[0-9a-f]{32}","number":1,"previous":null,"whole":true,)"
                           R"("time":"20[0-9-]*T[0-9:]*Z"\}
\{"sign":1,"path":"/shares/A/a","volume":"/shares/A/","modified":"1970-01-01T00:00:01Z",)"
                           R"("created":"1970-01-01T00:00:02Z"\}
\{"end":"[0-9a-f]{32}","number":1,"rows":1,"photos":1\}
)"));
  SetFiles({});
  const ParsedFeed changes = Feed({"--jsonl"});
  EXPECT_EQ(ParsedFeed(whole.output).id, changes.previous);
  ASSERT_EQ(1, changes.rows.size());
  EXPECT_EQ(-1, changes.rows.front().sign);
}

TEST_F(ZophotosChanges, WholeFeedOnRequestContinuesTheNumbers) {
  const ParsedFeed first = Feed();
  const ParsedFeed whole = Feed({"--whole"});
  EXPECT_EQ(2, whole.number);
  EXPECT_TRUE(whole.isWhole);
  EXPECT_EQ("", whole.previous);
  EXPECT_EQ(4, whole.rows.size());
  EXPECT_EQ(whole.id, Feed().previous);
}

TEST_F(ZophotosChanges, LostStateGivesAWholeFeed) {
  const ParsedFeed first = Feed();
  fs::remove(STATE);
  const ParsedFeed second = Feed();
  EXPECT_TRUE(second.isWhole);
  EXPECT_NE(first.id, second.id);
}

TEST_F(ZophotosChanges, AnotherDatabaseGivesAWholeFeed) {
  Feed();
  const auto expectWhole = [](const std::string& what) {
    SCOPED_TRACE(what);
    EXPECT_TRUE(Feed().isWhole);
    EXPECT_FALSE(Feed().isWhole);
  };
  fs::copy_file(COPY, COPY + ".new");
  fs::rename(COPY + ".new", COPY);
  expectWhole("a file that was created again");
  const std::string content = Content(COPY);
  Database(COPY).Run("INSERT INTO Files(file_id, folder_id, name, modified_date, volume, "
                     "created_date) VALUES(1000, 1, 'x', 1, 'y', 2)");
  EXPECT_FALSE(Feed().isWhole);
  Save(COPY, content);
  expectWhole("a file with the same inode, where smaller ids are used again");
  Database(COPY).Run("UPDATE Status SET mdate = mdate + 1");
  expectWhole("the same file, emptied");
  fs::create_directory("/tmp/other");
  fs::rename(COPY, "/tmp/other/zophotos.db");
  const ParsedFeed other(
      Zophotos({"--database", "/tmp/other/zophotos.db", "export", "--changes", STATE}).output);
  EXPECT_TRUE(other.isWhole);
  fs::rename("/tmp/other/zophotos.db", COPY);
  expectWhole("another master");
}

TEST_F(ZophotosChanges, DatabaseUnderAnotherNameIsTheSame) {
  Feed();
  fs::create_symlink("/tmp/copy", "/tmp/link");
  const Outcome outcome =
      Zophotos({"--database", "/tmp/link/./zophotos.db", "export", "--changes", STATE});
  EXPECT_FALSE(ParsedFeed(outcome.output).isWhole);
}

TEST_F(ZophotosChanges, DamagedStateGivesAWholeFeed) {
  Feed();
  const std::string good = Content(STATE);
  for (std::size_t i = 0; i < good.size(); ++i) {
    std::string damaged = good;
    damaged[i] = static_cast<char>(damaged[i] ^ 1);
    Save(STATE, damaged);
    const ParsedFeed feed = Feed();
    ASSERT_TRUE(feed.isWhole) << i;
    ASSERT_EQ(4, feed.rows.size());
    Save(STATE, good.substr(0, i)); // and cut off
    ASSERT_TRUE(Feed().isWhole) << i;
  }
  Save(STATE, good + "x");
  EXPECT_TRUE(Feed().isWhole);
  Save(STATE, std::string(1'000'000, '\0'));
  EXPECT_TRUE(Feed().isWhole);
  Save(STATE, good);
  EXPECT_FALSE(Feed().isWhole);
}

/// Leaves a feed that was not delivered, because its output failed.
void LeavePending(const Arguments& more = {}) {
  Arguments arguments = OnCopyArguments({"export", "--changes", STATE});
  arguments.insert(arguments.end(), more.begin(), more.end());
  ExpectError(Zophotos(arguments, "/dev/full"), 5, "zophotos: cannot write to standard output\n");
  ASSERT_TRUE(fs::exists(NEXT));
}

TEST_F(ZophotosChanges, FeedWithoutReaderIsRepeated) {
  SetFiles({"a", "b"});
  LeavePending();
  EXPECT_FALSE(fs::exists(STATE));
  const std::string pending = Content(NEXT);
  SetFiles({"a", "c"});
  const ParsedFeed whole = Feed(); // as the database was
  EXPECT_TRUE(whole.isWhole);
  EXPECT_THAT(Texts(whole), ElementsAre("+\"/shares/A/a\"", "+\"/shares/A/b\""));
  EXPECT_EQ(pending, Content(STATE));
  EXPECT_FALSE(fs::exists(NEXT));
  LeavePending();
  SetFiles({"d"});
  LeavePending();
  const ParsedFeed changes = Feed();
  EXPECT_EQ(whole.id, changes.previous);
  EXPECT_THAT(Texts(changes), ElementsAre("-\"/shares/A/b\"", "+\"/shares/A/c\""));
  EXPECT_THAT(Texts(Feed()),
              ElementsAre("-\"/shares/A/a\"", "-\"/shares/A/c\"", "+\"/shares/A/d\""));
}

TEST_F(ZophotosChanges, RepeatedFeedIsTheSameInEveryByte) {
  SetFiles({"a", "b"});
  Feed();
  SetFiles({"a", "c"});
  LeavePending();
  const std::string state = Content(STATE);
  const std::string next = Content(NEXT);
  const std::string first = Export().output;
  Save(STATE, state);
  Save(NEXT, next);
  SetFiles({"x"});
  EXPECT_EQ(first, Export().output);
  Save(STATE, state);
  Save(NEXT, next);
  EXPECT_EQ(ParsedFeed(first).id, Feed({"--jsonl"}).id);
}

TEST_F(ZophotosChanges, DamagedPendingFeedIsMadeAgain) {
  SetFiles({"a"});
  const ParsedFeed first = Feed();
  const std::string state = Content(STATE);
  SetFiles({"b"});
  LeavePending();
  const std::string next = Content(NEXT);
  SetFiles({"c"});
  for (std::size_t i = 0; i < next.size(); ++i) {
    std::string damaged = next;
    damaged[i] = static_cast<char>(damaged[i] ^ 0x80);
    for (const std::string& content : {damaged, next.substr(0, i)}) {
      Save(STATE, state);
      Save(NEXT, content);
      const ParsedFeed feed = Feed();
      ASSERT_EQ(first.id, feed.previous) << i;
      ASSERT_THAT(Texts(feed), ElementsAre("-\"/shares/A/a\"", "+\"/shares/A/c\"")) << i;
    }
  }
}

TEST_F(ZophotosChanges, PendingFeedOfAnotherStateIsNotUsed) {
  SetFiles({"a"});
  Feed();
  SetFiles({"b"});
  LeavePending();
  const std::string next = Content(NEXT);
  fs::remove(STATE);
  const ParsedFeed whole = Feed();
  EXPECT_TRUE(whole.isWhole);
  EXPECT_EQ(3, whole.number); // the pending feed may have been printed
  Save(NEXT, next);
  const ParsedFeed changes = Feed();
  EXPECT_EQ(whole.id, changes.previous);
  EXPECT_EQ(0, changes.rows.size());
}

TEST_F(ZophotosChanges, WholeFeedOnRequestReplacesAPendingOne) {
  SetFiles({"a"});
  Feed();
  SetFiles({"b"});
  LeavePending();
  SetFiles({"c"});
  LeavePending({"--whole"});
  SetFiles({"d"});
  const ParsedFeed whole = Feed();
  EXPECT_TRUE(whole.isWhole);
  EXPECT_THAT(Texts(whole), ElementsAre("+\"/shares/A/c\""));
}

/// One random change of the copy.
void ChangeAtRandom(const Database& copy, std::mt19937& random) {
  const std::string number = std::to_string(random() % 40);
  const Lines changes{
      "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT folder_id, "
      "'photo' || " +
          number + ", " + number +
          ", volume, 7 FROM Folders WHERE folder_id % 5 = " + std::to_string(random() % 5),
      "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT folder_id, "
      "CAST(randomblob(" +
          number + ") AS TEXT), random(), volume, random() FROM Folders LIMIT 3",
      "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT folder_id, "
      "name, modified_date, volume, created_date FROM Files WHERE file_id % 41 = " +
          number,
      "DELETE FROM Files WHERE file_id % 7 = " + number + " % 7",
      "DELETE FROM Files WHERE folder_id % 40 = " + number,
      "DELETE FROM Folders WHERE folder_id % 40 = " + number + " AND folder_id > 1",
      "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(1, '/shares/A/' || " +
          number + " || '/', 1, '/shares/' || " + number + " % 3 || '/')",
      "UPDATE Folders SET volume = '/shares/X/' WHERE folder_id % 40 = " + number,
      "UPDATE Files SET modified_date = modified_date + 1 WHERE file_id % 40 = " + number};
  copy.Run(changes[random() % changes.size()]);
}

TEST_F(ZophotosChanges, ReaderOfAllFeedsHasThePhotosOfTheDatabase) {
  std::mt19937 random(16);
  for (const char* const format : {"--csv", "--jsonl"}) {
    const Database copy = Copy();
    fs::remove(STATE);
    FeedReader reader;
    for (int round = 0; round < TestScale(60, 500); ++round) {
      for (std::size_t i = random() % 4; i > 0; --i) {
        ChangeAtRandom(copy, random);
      }
      ASSERT_EQ(Result::Applied, reader.Take(Export({format}).output));
      ASSERT_EQ(PhotosOfExport(OnCopy({"export", format}).output), reader.Photos()) << round;
    }
  }
}

TEST_F(ZophotosChanges, CraftedValuesAreThoseOfAnExport) {
  const Database copy(COPY);
  AddRows(copy, "x'2f62002fff'", "x'6100ff'");
  AddRows(copy, "17", "18");
  AddRows(copy, "1.5", "CAST(x'00' AS TEXT)");
  copy.Run("UPDATE Files SET modified_date = 'abc', created_date = '12' WHERE name = 18");
  copy.Run("UPDATE Files SET modified_date = 1e300, created_date = x'31' WHERE name = 'top.jpg'");
  copy.Run("UPDATE Files SET modified_date = 9223372036854775807, created_date = "
           "-9223372036854775808 WHERE name = 'b.jpg'");
  copy.Run("UPDATE Folders SET volume = 5 WHERE name = 17");
  FeedReader reader;
  for (const char* const change :
       {"UPDATE Status SET desc = ''", "UPDATE Files SET created_date = 0", "DELETE FROM Files"}) {
    copy.Run(change);
    EXPECT_EQ(Result::Applied, reader.Take(Export({"--jsonl"}).output));
    EXPECT_EQ(PhotosOfExport(OnCopy({"export", "--jsonl"}).output), reader.Photos());
  }
}

TEST_F(ZophotosChanges, DamagedDatabaseLeavesTheStateAsItWas) {
  AddFiles(Database(COPY), 3000, "1", "'name' || i");
  const ParsedFeed first = Feed();
  const std::string good = Content(COPY);
  Save(COPY, good.substr(0, good.size() / 2) + std::string(good.size() - good.size() / 2, 'x'));
  EXPECT_EQ(5, Export().status);
  EXPECT_FALSE(fs::exists(NEXT));
  Save(COPY, good);
  EXPECT_EQ(first.id, Feed().previous);
}

/// Exports the changes to /tmp/feed.out and kills the export before the effect of this number.
/// Returns whether it was killed.
bool KillExport(int effect) {
  fs::remove("/tmp/feed.out");
  // A check for leaks at the end runs in another process, which would keep the lock for a while.
  Program program(
      ZophotosCommand(OnCopyArguments({"export", "--changes", STATE})),
      {.output = "/tmp/feed.out", .environment = {"LSAN_OPTIONS=detect_leaks=0"}, .held = true});
  bool isKilled = false;
  {
    Tracer tracer(program.Pid());
    program.Signal(SIGCONT);
    try {
      tracer.RunUntil([&](const SystemCall& call) { return IsEffect(call) && effect-- == 0; });
      isKilled = true;
      program.Signal(SIGKILL);
    } catch (const std::runtime_error&) { // it has ended
      isKilled = false;
    }
  }
  EXPECT_EQ(isKilled ? 128 + SIGKILL : 0, program.WaitForEnd());
  return isKilled;
}

TEST_F(ZophotosChanges, KillAtAnyEffectLosesNothing) {
  std::mt19937 random(17);
  const Database copy(COPY);
  FeedReader reader;
  reader.Take(Export().output);
  int kills = 0;
  for (bool isKilled = true; isKilled; ++kills) {
    for (int i = 0; i < 3; ++i) {
      ChangeAtRandom(copy, random);
    }
    isKilled = KillExport(kills);
    const std::string output = Content("/tmp/feed.out");
    const Result result = output.empty() ? Result::Incomplete : reader.Take(output);
    ASSERT_TRUE(result == Result::Applied || (isKilled && result == Result::Incomplete)) << kills;
    ChangeAtRandom(copy, random);
    // The first one may be a repeat.
    const Result next = reader.Take(Export().output);
    ASSERT_TRUE(next == Result::Applied || (next == Result::Repeated && result == Result::Applied))
        << kills;
    ASSERT_EQ(Result::Applied, reader.Take(Export().output)) << kills;
    ASSERT_EQ(PhotosOfExport(OnCopy({"export"}).output), reader.Photos()) << kills;
  }
  EXPECT_GT(kills, 10);
}

TEST_F(ZophotosChanges, KillAtAnyEffectOfTheFirstFeedLosesNothing) {
  std::mt19937 random(18);
  const Database copy(COPY);
  for (int kills = 0;; ++kills) {
    fs::remove_all("/tmp/state");
    fs::create_directory("/tmp/state");
    FeedReader reader;
    const bool isKilled = KillExport(kills);
    const std::string output = Content("/tmp/feed.out");
    if (!output.empty()) {
      reader.Take(output);
    }
    ChangeAtRandom(copy, random);
    const Result next = reader.Take(Export().output);
    ASSERT_TRUE(next == Result::Applied || next == Result::Repeated) << kills;
    ASSERT_EQ(Result::Applied, reader.Take(Export().output)) << kills;
    ASSERT_EQ(PhotosOfExport(OnCopy({"export"}).output), reader.Photos()) << kills;
    if (!isKilled) {
      break;
    }
  }
}

TEST_F(ZophotosChanges, KillAtAnyEffectWithoutSpaceInTheStateLosesNothing) {
  const Database copy(COPY);
  AddFiles(copy, 20, "1", "hex(randomblob(300))");
  FeedReader reader;
  reader.Take(Export().output);
  for (int kills = 0;; ++kills) {
    copy.Run("UPDATE Files SET modified_date = modified_date + 1");
    const bool isKilled = KillExport(kills);
    const std::string output = Content("/tmp/feed.out");
    if (!output.empty()) {
      reader.Take(output);
    }
    copy.Run("UPDATE Files SET modified_date = modified_date + 1");
    const Result next = reader.Take(Export().output);
    ASSERT_TRUE(next == Result::Applied || next == Result::Repeated) << kills;
    ASSERT_EQ(Result::Applied, reader.Take(Export().output)) << kills;
    ASSERT_EQ(PhotosOfExport(OnCopy({"export"}).output), reader.Photos()) << kills;
    ASSERT_LE(fs::file_size(STATE), 4096) << kills;
    if (!isKilled) {
      break;
    }
  }
}

TEST_F(ZophotosChanges, ReaderThatEndsEarlyGetsTheFeedAgain) {
  AddFiles(Database(COPY), 20'000, "1", "'name' || i");
  Program program(ZophotosCommand(OnCopyArguments({"export", "--changes", STATE})));
  const std::string line = program.ReadLine();
  program.CloseOutput();
  EXPECT_EQ(128 + SIGPIPE, program.WaitForEnd());
  EXPECT_THAT(line, HasSubstr(Feed().id));
}

TEST_F(ZophotosChanges, FeedIsNotWrittenIntoItsFilesIfTheOutputIsClosed) {
  Arguments command{"sh", "-c", "exec \"$@\" <&- >&-", "sh"};
  for (const std::string& argument :
       ZophotosCommand(OnCopyArguments({"export", "--changes", STATE}))) {
    command.push_back(argument);
  }
  ExpectFailure(test::Run(command), 5, "cannot write to standard output");
  EXPECT_FALSE(fs::exists(STATE));
}

TEST_F(ZophotosChanges, SecondExportWithTheSameStateIsRefused) {
  AddFiles(Database(COPY), 20'000, "1", "'name' || i");
  Program first(ZophotosCommand(OnCopyArguments({"export", "--changes", STATE})));
  std::string output = first.ReadLine() + "\n"; // a full pipe blocks it
  ExpectFailure(Export(), 4, "another export uses " + STATE + "; try again");
  ExpectFailure(OnCopy({"export", "--changes", "/tmp/state/../state/feed", "--whole"}), 4,
                "another export uses /tmp/state/../state/feed; try again");
  std::string rest;
  first.ReadToEnd(rest, rest);
  EXPECT_EQ(0, first.WaitForEnd());
  const ParsedFeed feed(output + rest);
  EXPECT_TRUE(feed.isComplete);
  EXPECT_EQ(feed.id, Feed().previous);
}

TEST_F(ZophotosChanges, FullDiskLeavesTheStateAsItWas) {
  const Volume disk("Disk", "64k");
  const std::string state = disk.Path() + "/feed";
  const Arguments command = OnCopyArguments({"export", "--changes", state});
  SetFiles({"a"});
  const ParsedFeed first(Zophotos(command).output);
  AddFiles(Database(COPY), 3000, "2", "hex(randomblob(30))");
  ExpectFailure(Zophotos(command), 5, "cannot write " + state + ".next: No space left on device");
  EXPECT_FALSE(fs::exists(state + ".next"));
  SetFiles({"b"});
  const ParsedFeed second(Zophotos(command).output);
  EXPECT_EQ(first.id, second.previous);
  EXPECT_THAT(Texts(second), ElementsAre("-\"/shares/A/a\"", "+\"/shares/A/b\""));
}

TEST_F(ZophotosChanges, StateThatIsNoRegularFileIsLeftAlone) {
  for (const std::string suffix : {"", ".next", ".lock"}) {
    const std::string file = STATE + suffix;
    SCOPED_TRACE(file);
    fs::remove(file); // the lock stays
    fs::create_symlink("/tmp/elsewhere", file);
    ExpectFailure(Export(), 5, "cannot open " + file + ": it is a symbolic link");
    EXPECT_TRUE(fs::is_symlink(file));
    fs::remove(file);
    ASSERT_EQ(0, mkfifo(file.c_str(), 0666));
    ExpectFailure(Export(), 5, file + " is not a regular file");
    fs::remove(file);
    fs::create_directory(file);
    EXPECT_EQ(5, Export().status);
    EXPECT_TRUE(fs::is_directory(file));
    fs::remove(file);
  }
  EXPECT_FALSE(fs::exists("/tmp/elsewhere"));
  ExpectFailure(OnCopy({"export", "--changes", "/tmp/state/"}), 5, "/tmp/state/ is a directory");
  ExpectFailure(OnCopy({"export", "--changes", "/tmp/state/."}), 5,
                "/tmp/state/. is not a regular file");
  ExpectFailure(OnCopy({"export", "--changes", "/dev/null"}), 5, "/dev/null is not a regular file");
}

TEST_F(ZophotosChanges, UnusableDirectoryIsReported) {
  ExpectFailure(OnCopy({"export", "--changes", "/tmp/none/feed"}), 5,
                "cannot open the directory of /tmp/none/feed: No such file or directory");
  Volume disk("Disk", "64k");
  disk.MakeReadOnly();
  ExpectFailure(OnCopy({"export", "--changes", disk.Path() + "/feed"}), 5,
                "cannot open " + disk.Path() + "/feed.lock: Read-only file system");
  ExpectFailure(OnCopy({"export", "--changes", "/tmp/state/" + std::string(252, 'x')}), 5,
                "cannot open /tmp/state/" + std::string(252, 'x') + ".lock: File name too long");
}

TEST_F(ZophotosChanges, StateMayBeRelativeToTheWorkingDirectory) {
  Program program(ZophotosCommand(OnCopyArguments({"export", "--changes", "feed"})),
                  {.directory = "/tmp/state"});
  std::string output;
  program.ReadToEnd(output, output);
  EXPECT_EQ(0, program.WaitForEnd());
  EXPECT_EQ(ParsedFeed(output).id, Feed().previous);
}

TEST_F(ZophotosChanges, StateIsForItsOwnerOnly) {
  Feed();
  struct stat status {};
  ASSERT_EQ(0, stat(STATE.c_str(), &status));
  EXPECT_EQ(0600, status.st_mode & 0777);
}

TEST_F(ZophotosChanges, NeedsADatabaseAndAState) {
  fs::remove(COPY);
  ExpectFailure(Export(), 3, "no merged database: " + COPY + " does not exist");
  EXPECT_FALSE(fs::exists(NEXT));
  for (const auto& [arguments, message] :
       {std::pair(Arguments{"export", "--whole"}, "--whole needs --changes"),
        std::pair(Arguments{"export", "--changes", ""}, "--changes")}) {
    const Outcome outcome = OnCopy(arguments);
    EXPECT_EQ(2, outcome.status);
    EXPECT_THAT(outcome.error, HasSubstr(message));
  }
}

TEST_F(ZophotosChanges, StateTakesAtMostFortyBytesPerPhoto) {
  constexpr int photos = 3000;
  const auto replaceFiles = [](const std::string& name) {
    const Database copy(COPY);
    copy.Run("DELETE FROM Files");
    AddFiles(copy, photos, "1", name);
    copy.Run("UPDATE Files SET modified_date = abs(random()) % 500000000");
    copy.Run("UPDATE Files SET created_date = modified_date"); // as the daemon does
  };
  // Names as cameras, people and synchronization programs make them, and SHA-256 hashes.
  for (const char* const name :
       {"'IMG_' || i || '.JPG'", "'Summer holiday in the mountains with friends, ' || i || '.jpg'",
        "lower(hex(randomblob(4)) || '-' || hex(randomblob(2)) || '-' || hex(randomblob(2)) || '-' "
        "|| hex(randomblob(2)) || '-' || hex(randomblob(6))) || '.jpg'",
        "lower(hex(randomblob(32))) || '.jpg'"}) {
    replaceFiles(name);
    Feed();
    EXPECT_LE(fs::file_size(STATE), 40 * photos) << name;
    EXPECT_FALSE(Feed().isWhole) << name;
  }
  // No compression makes these small enough.
  for (const char* const name : {"hex(randomblob(100))", "hex(randomblob(2000))"}) {
    replaceFiles(name);
    FeedReader reader;
    EXPECT_EQ(Result::Applied, reader.Take(Export({"--whole"}).output));
    EXPECT_LE(fs::file_size(STATE), 40 * photos) << name;
    EXPECT_FALSE(fs::exists(NEXT));
    Database(COPY).Run("DELETE FROM Files WHERE file_id % 2 = 0");
    const Outcome next = Export();
    EXPECT_TRUE(ParsedFeed(next.output).isWhole);
    EXPECT_EQ(Result::Applied, reader.Take(next.output));
    EXPECT_EQ(PhotosOfExport(OnCopy({"export"}).output), reader.Photos());
  }
  // Once it is small enough, there are changes again.
  replaceFiles("i");
  EXPECT_TRUE(Feed().isWhole);
  EXPECT_FALSE(Feed().isWhole);
}

TEST_F(ZophotosChanges, FewPhotosMayHaveLongNames) {
  SetFiles({std::string(200, 'a'), std::string(255, 'b')});
  Feed();
  SetFiles({std::string(200, 'a')});
  EXPECT_EQ(1, Feed().rows.size());
}

TEST_F(ZophotosChanges, FeedOfFewChangesIsSmall) {
  AddFiles(Database(COPY), 50'000, "2", "'IMG_' || i || '.JPG'");
  Feed();
  Database(COPY).Run("DELETE FROM Files WHERE name LIKE 'IMG\\_12_4_.JPG' ESCAPE '\\'");
  const Outcome outcome = Export();
  EXPECT_EQ(100, ParsedFeed(outcome.output).rows.size());
  EXPECT_LT(outcome.output.size(), 16'384);
}

/// The peak memory of the second of two exports of `rows` photos in KiB, before its last line.
long PeakOfChanges(int rows) {
  const Database copy(COPY);
  copy.Run("DELETE FROM Files");
  fs::remove(STATE);
  AddFiles(copy, rows, "1", "printf('%0120d.jpg', i)");
  Feed();
  copy.Run("UPDATE Files SET modified_date = 2 WHERE file_id % 4 = 0");
  Program program(ZophotosCommand(OnCopyArguments({"export", "--changes", STATE})));
  for (int i = 0; i < rows / 2 - 2500; ++i) {
    program.ReadLine();
  }
  const long peak = PeakOf(program.Pid());
  std::string output;
  program.ReadToEnd(output, output);
  EXPECT_EQ(0, program.WaitForEnd());
  return peak;
}

TEST_F(ZophotosChanges, ComparesInConstantMemory) {
  // The address sanitizer keeps freed memory, which would be counted.
  setenv("ASAN_OPTIONS", "quarantine_size_mb=0:thread_local_quarantine_size_kb=0", 1);
  // Both exports fill the caches of SQLite.
  const long some = PeakOfChanges(100'000);
  const long many = PeakOfChanges(200'000);
  unsetenv("ASAN_OPTIONS");
  EXPECT_LT(many - some, 1024) << some << " KiB, " << many << " KiB";
}

TEST_F(ZophotosChanges, SlowReaderDoesNotBlockMerges) {
  onB.AddFolder("Many/", 1);
  onB.AddPhotos("Many/", 4000, 3000);
  Merge(b);
  Program slow(ZophotosCommand({"export", "--changes", STATE}));
  std::string output = slow.ReadLine() + "\n";
  onB.AddPhoto("Many/late.jpg", 7, 4000);
  Merge(b);
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ::testing::Contains("/shares/B/Many/late.jpg|7|7|/shares/B/"));
  std::string rest;
  slow.ReadToEnd(rest, rest);
  EXPECT_EQ(0, slow.WaitForEnd());
  FeedReader reader;
  EXPECT_EQ(Result::Applied, reader.Take(output + rest));
  EXPECT_EQ(Result::Applied, reader.Take(Zophotos({"export", "--changes", STATE}).output));
  EXPECT_EQ(PhotosOfExport(Zophotos({"export"}).output), reader.Photos());
}

TEST_F(ZophotosChanges, NamesAreEscapedOnATerminal) {
  SetFiles({"x\x1b[31m"});
  const Lines lines = Terminal(200).Run(OnCopyArguments({"export", "--changes", STATE}));
  EXPECT_THAT(lines, ::testing::Contains(StartsWith(R"(1,"/shares/A/x\x1b[31m",)")));
}

} // namespace
} // namespace orva::test

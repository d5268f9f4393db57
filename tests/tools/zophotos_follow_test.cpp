// What `zophotos status -f` prints while the database and the services change.

#include "ServiceFiles.h"
#include "Terminal.h"
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
using ::testing::AllOf;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::MatchesRegex;
using ::testing::Not;
using ::testing::StartsWith;

const std::string TIME = "20[0-9][0-9]-[0-9][0-9]-[0-9][0-9] [0-9][0-9]:[0-9][0-9]:[0-9][0-9]";

class ZophotosFollow : public ZophotosTest {
protected:
  void Start(const Arguments& options = {}) {
    Arguments arguments{"status", "-f"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    follow = std::make_unique<Program>(ZophotosCommand(arguments));
  }

  /// Expects that the next lines are a report with this heading after its time, and these lines.
  void ExpectReport(const std::string& heading, const std::string& lines) const {
    EXPECT_THAT(follow->ReadLine(), MatchesRegex(TIME + "  " + heading));
    std::string found;
    for (auto i = std::ranges::count(lines, '\n'); i > 0; --i) {
      found += follow->ReadLine() + '\n';
    }
    EXPECT_EQ(lines, found);
  }

  /// The volumes of the next report in JSON.
  json NextVolumes() const {
    return json::parse(follow->ReadLine(), nullptr, false).value("volumes", json());
  }

  std::unique_ptr<Program> follow;
};

const std::string FIRST_TABLE = "VOLUME               TRANSCODED        PHOTOS\n"
                                "/shares/A/ (master)  ██████████ 100 %     3/3\n"
                                "/shares/B/           ███░░░░░░░  33 %     1/3\n"
                                "/shares/C/           -                    0/0\n"
                                "/shares/D/           ░░░░░░░░░░   0 %     0/1\n"
                                "TOTAL                █████░░░░░  57 %     4/7\n";

TEST_F(ZophotosFollow, PrintsAReportAfterEachMerge) {
  Start();
  ExpectReport(MERGED, FIRST_TABLE);
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  Merge(b);
  EXPECT_EQ("", follow->ReadLine());
  ExpectReport(MERGED, "VOLUME               TRANSCODED        PHOTOS\n"
                       "/shares/A/ (master)  ██████████ 100 %     3/3\n"
                       "/shares/B/           █████░░░░░  50 %     2/4\n"
                       "/shares/C/           -                    0/0\n"
                       "/shares/D/           ░░░░░░░░░░   0 %     0/1\n"
                       "TOTAL                ██████░░░░  62 %     5/8\n");
}

TEST_F(ZophotosFollow, PrintsAReportWhenAServiceStartsWorksAndEnds) {
  Start();
  ExpectReport(MERGED, FIRST_TABLE);
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", "2") + "," +
                                   IndexerVolume("/shares/E\\u001b/", "walking", "0"));
  EXPECT_EQ("", follow->ReadLine());
  const std::string rest =
      "/shares/B/           ███░░░░░░░  33 %     1/3        -       -  -\n"
      "/shares/C/           -                    0/0        -       -  -\n"
      "/shares/D/           ░░░░░░░░░░   0 %     0/1        -       -  -\n"
      "/shares/E\\x1b/       -                      -        -       -  being indexed\n";
  const std::string headings =
      "VOLUME               TRANSCODED        PHOTOS  WAITING  FAILED  ACTIVITY\n";
  ExpectReport(MERGED, headings +
                           "/shares/A/ (master)  ██████████ 100 %     3/3        -       -  being "
                           "indexed, 2 folders waiting\n" +
                           rest +
                           "TOTAL                █████░░░░░  57 %     4/7        -       -\n");
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "watching", "0") + "," +
                                   IndexerVolume("/shares/E\\u001b/", "walking", "0"));
  EXPECT_EQ("", follow->ReadLine());
  const std::string watched =
      headings + "/shares/A/ (master)  ██████████ 100 %     3/3        -       -  watched\n" +
      rest + "TOTAL                █████░░░░░  57 %     4/7        -       -\n";
  ExpectReport(MERGED, watched);
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A/", "5", "1", "true") + "," +
                                      TranscoderVolume("/shares/B/", "7", "2", "false"));
  EXPECT_EQ("", follow->ReadLine());
  ExpectReport(
      MERGED,
      headings +
          "/shares/A/ (master)  ██████████ 100 %     3/3        5       1  watched; rendering\n"
          "/shares/B/           ███░░░░░░░  33 %     1/3        7       2  -\n" +
          rest.substr(rest.find('\n') + 1) +
          "TOTAL                █████░░░░░  57 %     4/7       12       3\n");
  fs::remove_all(TRANSCODER_FOLDER);
  EXPECT_EQ("", follow->ReadLine());
  ExpectReport(MERGED, watched);
  fs::remove(INDEXER_FOLDER + "/status.json");
  EXPECT_EQ("", follow->ReadLine());
  ExpectReport(MERGED, FIRST_TABLE);
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A/", "5", "1", "true"));
  EXPECT_THAT(follow->ReadLineWith("(master)"), EndsWith("  rendering"));
}

TEST_F(ZophotosFollow, PrintsOneObjectPerReportInJson) {
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A/", "5", "1", "true"));
  Start({"--json"});
  const std::string line = follow->ReadLine();
  EXPECT_THAT(
      line,
      MatchesRegex(
          R"re(\{"time":"[0-9TZ:-]+","database":")re" + MERGED +
          R"re(","reason":null,"volumes":\[\{"volume":"/shares/A/","transcoded":3,"total":3,)re"
          R"re("merged_up_to":"1970-01-01T00:33:22Z","waiting":5,"failed":1,"rendering":true\},.*)re"));
  EXPECT_EQ(4U, json::parse(line)["volumes"].size());
  fs::remove(LOCATOR);
  EXPECT_THAT(follow->ReadLine(),
              HasSubstr(R"("database":null,"reason":"no merged database: )" + LOCATOR +
                        R"( does not exist; the daemon creates it when it starts","volumes":[)"
                        R"({"volume":"/shares/A/","transcoded":0,"total":0,"merged_up_to":null,)"
                        R"("waiting":5,"failed":1,"rendering":true}]})"));
}

TEST_F(ZophotosFollow, PrintsNoMoreThanOneReportASecond) {
  Start({"--json"});
  std::string last = json::parse(follow->ReadLine(), nullptr, false).value("time", "");
  for (int i = 0; i < 3; ++i) {
    WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", std::to_string(i)));
    const std::string time = json::parse(follow->ReadLine(), nullptr, false).value("time", "");
    EXPECT_LT(last, time);
    last = time;
  }
}

TEST_F(ZophotosFollow, PrintsNothingWhileNothingChanges) {
  const std::string same = IndexerVolume("/shares/A/", "watching", "0");
  WriteVolumes(INDEXER_FOLDER, same);
  Start({"--json"});
  follow->ReadLine();
  for (int i = 0; i < 3; ++i) {
    WriteVolumes(INDEXER_FOLDER, same);
    std::ofstream(INDEXER_FOLDER + "/other") << i;
    AwaitLooks(*follow);
  }
  Zophotos({"check"});
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  Merge(b);
  EXPECT_EQ(2, NextVolumes()[1]["transcoded"]);
}

TEST_F(ZophotosFollow, FollowsTheDatabaseToAnotherMaster) {
  Start();
  ExpectReport(MERGED, FIRST_TABLE);
  appliance.Handle(Unplugged(a.Path()));
  EXPECT_THAT(follow->ReadLineWith("zophotos.db"),
              MatchesRegex(TIME + "  /shares/B//.zophotos/zophotos.db"));
}

TEST_F(ZophotosFollow, WaitsForADatabase) {
  const std::string locator = Appliance::Locator();
  std::ofstream(LOCATOR) << "zophotos_db_path=\n";
  Start();
  const std::string reason = "no merged database: " + LOCATOR + " names no database at the moment";
  EXPECT_THAT(follow->ReadLine(), EndsWith("  " + reason));
  AwaitLooks(*follow);
  std::ofstream(LOCATOR) << locator;
  EXPECT_EQ("", follow->ReadLine());
  ExpectReport(MERGED, FIRST_TABLE);
  std::ofstream(LOCATOR) << "zophotos_db_path=\n";
  EXPECT_EQ("", follow->ReadLine());
  EXPECT_THAT(follow->ReadLine(), EndsWith("  " + reason));
}

TEST_F(ZophotosFollow, ShowsAnUnpluggedVolumeAsGone) {
  appliance.Handle(Unplugged(b.Path()));
  Start();
  EXPECT_THAT(follow->ReadLineWith("/shares/B/"), EndsWith("  gone                   -"));
  EXPECT_THAT(follow->ReadLineWith("TOTAL"), EndsWith(" 75 %     3/4"));
}

TEST_F(ZophotosFollow, SaysThatNoVolumeHasBeenMerged) {
  Copy().Run("DELETE FROM Statistics");
  Start({"--database", COPY});
  ExpectReport(COPY, "No volume has been merged yet.\n");
}

TEST_F(ZophotosFollow, ShowsNoServicesForAnotherDatabase) {
  const Database copy = Copy();
  Start({"--database", COPY});
  EXPECT_THAT(follow->ReadLineWith("VOLUME"), EndsWith("PHOTOS"));
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", "2"));
  AwaitLooks(*follow);
  copy.Run("UPDATE Statistics SET photos_total = 9 WHERE volume = '/shares/B/'");
  EXPECT_THAT(follow->ReadLineWith("VOLUME"), EndsWith("PHOTOS"));
}

TEST_F(ZophotosFollow, ReportsALongLockAndKeepsTheProgress) {
  const Database copy = Copy();
  Start({"--json", "--database", COPY});
  follow->ReadLine();
  copy.Run("BEGIN EXCLUSIVE");
  const json locked = json::parse(follow->ReadLine(), nullptr, false);
  EXPECT_EQ(COPY, locked["database"]);
  EXPECT_EQ(COPY + " is locked, for example while a large merge commits; try again",
            locked["reason"]);
  EXPECT_EQ(4U, locked["volumes"].size());
  copy.Run("UPDATE Statistics SET photos_total = 9 WHERE volume = '/shares/B/'");
  copy.Run("COMMIT");
  EXPECT_EQ(9, NextVolumes()[1]["total"]);
}

TEST_F(ZophotosFollow, EndsOnSignals) {
  for (const int signal : {SIGINT, SIGTERM}) {
    Start();
    follow->ReadLine();
    follow->Signal(signal);
    EXPECT_EQ(128 + signal, follow->WaitForEnd());
  }
}

TEST_F(ZophotosFollow, EndsWhenItsOutputIsClosed) {
  Start();
  follow->ReadLineWith("TOTAL");
  follow->CloseOutput();
  onB.AddPhoto("Old/4.jpg", 7, 3002);
  Merge(b);
  EXPECT_EQ(128 + SIGPIPE, follow->WaitForEnd());
}

class ZophotosFollowTerminal : public ZophotosFollow {
protected:
  void SetUp() override {
    ZophotosFollow::SetUp();
    setenv("TERM", "xterm", 1);
  }

  /// What the follower writes for one report: up to the end of the TOTAL row and what follows it.
  static std::string ReadReport(Terminal& terminal, const std::string& end = "\x1b[J") {
    const std::string begin = terminal.ReadTo("TOTAL");
    return begin + terminal.ReadTo(end);
  }
};

TEST_F(ZophotosFollowTerminal, ReplacesTheReportInItsPlace) {
  Terminal terminal(80);
  const auto program = terminal.Start({"status", "-f"});
  const std::string first = ReadReport(terminal);
  EXPECT_THAT(first, MatchesRegex(TIME + "  " + MERGED +
                                  "\x1b\\[K\n(.*\n)*TOTAL.*\x1b\\[K\n"
                                  "\x1b\\[J"));
  EXPECT_EQ(7, std::ranges::count(first, '\n'));
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/E/", "walking", "2"));
  const std::string second = ReadReport(terminal);
  EXPECT_THAT(second, AllOf(StartsWith("\x1b[7A20"), HasSubstr("\n/shares/E/ ")));
  EXPECT_EQ(8, std::ranges::count(second, '\n'));
  fs::remove_all(INDEXER_FOLDER);
  const std::string third = ReadReport(terminal);
  EXPECT_THAT(third, StartsWith("\x1b[8A20"));
  EXPECT_EQ(7, std::ranges::count(third, '\n'));
}

TEST_F(ZophotosFollowTerminal, ReportsFitTheTerminal) {
  WriteVolumes(INDEXER_FOLDER,
               IndexerVolume("/shares/" + std::string(100, 'l') + "/", "walking", "123456789"));
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A/", "123456", "789", "true"));
  for (const int columns : {20, 40, 60, 80, 120, 200}) {
    Terminal terminal(columns, 100);
    const auto program = terminal.Start({"status", "-f"});
    const Lines lines = SplitLines(ReadReport(terminal));
    ASSERT_EQ(9U, lines.size());
    for (const std::string& line : lines) {
      // Counts characters. All of them take one column.
      const auto width =
          std::ranges::count_if(line, [](char byte) { return (byte & 0xC0) != 0x80; }) -
          static_cast<long>(std::string("\x1b[K").size());
      EXPECT_GE(columns, width) << line;
    }
    EXPECT_EQ(columns >= 80, lines[2].find("  123456     789  ") != std::string::npos) << lines[2];
    EXPECT_EQ(columns >= 120, lines[2].find("█") != std::string::npos) << lines[2];
  }
}

TEST_F(ZophotosFollowTerminal, ALongReportLosesLinesAboveItsTotal) {
  Terminal terminal(80, 6);
  const auto program = terminal.Start({"status", "-f"});
  const Lines lines = SplitLines(ReadReport(terminal));
  ASSERT_EQ(6U, lines.size()); // and the cursor is in the sixth
  EXPECT_THAT(lines[2], StartsWith("/shares/A/"));
  EXPECT_EQ("…\x1b[K", lines[3]);
  EXPECT_THAT(lines[4], StartsWith("TOTAL"));
  EXPECT_EQ("\x1b[J", lines[5]);
}

TEST_F(ZophotosFollowTerminal, ReportsAreNotReplacedOnATerminalWithoutACursor) {
  setenv("TERM", "dumb", 1);
  Terminal terminal(80);
  const auto program = terminal.Start({"status", "-f"});
  EXPECT_THAT(ReadReport(terminal, "\n"), Not(HasSubstr("\x1b")));
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/E/", "walking", "2"));
  EXPECT_THAT(ReadReport(terminal, "\n"), AllOf(StartsWith("\n20"), Not(HasSubstr("\x1b"))));
}

} // namespace
} // namespace orva::test

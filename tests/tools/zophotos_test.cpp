// What zophotos prints of a sound database.

#include "Terminal.h"
#include "ZophotosTest.h"

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

using ::testing::AllOf;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

/// A file name with a control character and a byte that is not UTF-8, in SQL and as bytes.
const std::string ODD_NAME_SQL = "CAST(x'780a1b5bff5c2e6a7067' AS TEXT)";
const std::string ODD_NAME = "x\n\x1b[\xff\\.jpg";

const std::string STATUS_LEGEND =
    "PHOTOS: transcoded / all of a volume, without hidden ones, at its last merge.\n"
    "FILES: in the merged database: all transcoded files in visible folders.\n";

class ZophotosStatus : public ZophotosTest {};
class ZophotosList : public ZophotosTest {};
class ZophotosTree : public ZophotosTest {};
class ZophotosFind : public ZophotosTest {};
class ZophotosExport : public ZophotosTest {};

TEST_F(ZophotosStatus, ShowsTheProgressOfEachVolume) {
  ExpectOutput(
      Zophotos({"status"}),
      "Database  /shares/A//.zophotos/zophotos.db\n"
      "Master    /shares/A/\n"
      "Version   2.0\n"
      "Emptied   -\n"
      "\n"
      "VOLUME               TRANSCODED        PHOTOS  FOLDERS  FILES  MERGED UP TO\n"
      "/shares/A/ (master)  ██████████ 100 %     3/3        3      3  1970-01-01 00:33:22\n"
      "/shares/B/           ███░░░░░░░  33 %     1/3        2      1  1970-01-01 00:33:23\n"
      "/shares/C/           -                    0/0        1      0  -\n"
      "/shares/D/           ░░░░░░░░░░   0 %     0/1        1      0  -\n"
      "TOTAL                █████░░░░░  57 %     4/7        7      4  -\n"
      "\n" +
          STATUS_LEGEND);
}

TEST_F(ZophotosStatus, PrintsOneObjectInJson) {
  ExpectOutput(
      Zophotos({"status", "--json"}),
      R"({"database":"/shares/A//.zophotos/zophotos.db","master":"/shares/A/","version":"2.0",)"
      R"("stamped":null,"volumes":[)"
      R"({"volume":"/shares/A/","transcoded":3,"total":3,"folders":3,"files":3,"merged_up_to":"1970-01-01T00:33:22Z","gone":false},)"
      R"({"volume":"/shares/B/","transcoded":1,"total":3,"folders":2,"files":1,"merged_up_to":"1970-01-01T00:33:23Z","gone":false},)"
      R"({"volume":"/shares/C/","transcoded":0,"total":0,"folders":1,"files":0,"merged_up_to":null,"gone":false},)"
      R"({"volume":"/shares/D/","transcoded":0,"total":1,"folders":1,"files":0,"merged_up_to":null,"gone":false}]})"
      "\n");
}

TEST_F(ZophotosStatus, IsShownWithoutACommand) {
  ExpectOutput(Zophotos({}), Zophotos({"status"}).output);
  ExpectOutput(Zophotos({"--json"}), Zophotos({"status", "--json"}).output);
  Copy();
  ExpectOutput(OnCopy({}), OnCopy({"status"}).output);
}

TEST_F(ZophotosStatus, SaysWhenNoVolumeHasBeenMerged) {
  const Database copy = Copy();
  copy.Run("DELETE FROM Statistics");
  copy.Run("DELETE FROM Files");
  copy.Run("DELETE FROM Folders WHERE folder_id != 1");
  ExpectOutput(OnCopy({"status"}), "Database  " + COPY +
                                       "\nMaster    -\nVersion   2.0\nEmptied   -\n\n"
                                       "No volume has been merged yet.\n");
  EXPECT_THAT(OnCopy({"--json", "status"}).output, HasSubstr(R"("volumes":[])"));
}

TEST_F(ZophotosStatus, RoundsPercentagesDown) {
  const Database copy = Copy();
  for (const auto& [transcoded, total, percent] :
       std::vector<std::tuple<std::string, std::string, std::string>>{
           {"29", "100", "██░░░░░░░░  29 %"},
           {"57", "100", "█████░░░░░  57 %"},
           {"7", "10", "███████░░░  70 %"},
           {"9999999", "10000000", "█████████░  99 %"},
           {"1", "10000000", "░░░░░░░░░░   0 %"},
           {"12", "10", "██████████ 100 %"}}) {
    copy.Run("UPDATE Statistics SET photos_xcoded = ?, photos_total = ?", {transcoded, total});
    EXPECT_THAT(OnCopy({"status"}).output, HasSubstr("/shares/A/  " + percent + "  "))
        << transcoded << " of " << total;
  }
}

TEST_F(ZophotosStatus, ShowsAnUnpluggedVolumeAsGone) {
  appliance.Handle(Unplugged(b.Path()));
  EXPECT_THAT(Zophotos({"status"}).output,
              AllOf(HasSubstr("/shares/B/           gone                   -        0      0  -\n"),
                    HasSubstr("TOTAL                ███████░░░  75 %     3/4        5      3  -\n"),
                    EndsWith("\ngone: unplugged, or purged and not merged again yet.\n")));
  EXPECT_THAT(
      Zophotos({"status", "--json"}).output,
      HasSubstr(
          R"({"volume":"/shares/B/","transcoded":1,"total":3,"folders":0,"files":0,"merged_up_to":null,"gone":true},)"));
}

TEST_F(ZophotosStatus, SaysThatThereIsNoMasterYet) {
  // The daemon keeps the database there until the first scan.
  std::filesystem::create_directories("/shares/.zophotos");
  std::filesystem::copy_file(MERGED, "/shares//.zophotos/zophotos.db",
                             std::filesystem::copy_options::overwrite_existing);
  EXPECT_THAT(Zophotos({"--database", "/shares//.zophotos/zophotos.db"}).output,
              AllOf(HasSubstr("\nMaster    none yet\n"), Not(HasSubstr("(master)"))));
  EXPECT_THAT(Zophotos({"--database", "/shares/.zophotos/zophotos.db"}).output,
              HasSubstr("\nMaster    /shares\n"));
  EXPECT_THAT(Zophotos({"--json", "--database", "/shares//.zophotos/zophotos.db"}).output,
              HasSubstr(R"("master":null,)"));
  EXPECT_THAT(Zophotos({"--json", "--database", "/shares/.zophotos/zophotos.db"}).output,
              HasSubstr(R"("master":"/shares",)"));
  Copy();
  EXPECT_THAT(OnCopy({"--json"}).output, HasSubstr(R"("master":null,)"));
}

TEST_F(ZophotosStatus, PrintsLocalTimesInText) {
  Copy().Run("UPDATE Status SET mdate = 1001");
  setenv("TZ", "UTC-9", 1);
  EXPECT_THAT(OnCopy({"status"}).output, HasSubstr("Emptied   1970-01-01 09:16:41\n"));
  EXPECT_THAT(OnCopy({"status", "--json"}).output,
              HasSubstr(R"("stamped":"1970-01-01T00:16:41Z")"));
}

TEST_F(ZophotosStatus, AcceptsAMissingStatusRow) {
  Copy().Run("DELETE FROM Status");
  EXPECT_THAT(OnCopy({"status"}).output, HasSubstr("\nVersion   -\nEmptied   -\n\nVOLUME"));
  EXPECT_THAT(OnCopy({"status", "--json"}).output, HasSubstr(R"("version":null,"stamped":null,)"));
}

TEST_F(ZophotosStatus, PrintsTimesOutsideTheCalendarAsNumbers) {
  const Database copy = Copy();
  for (const auto& [seconds, text] :
       {std::pair("-62135596800", "1-01-01 00:00:00"), std::pair("-62135596801", "-62135596801"),
        std::pair("253402300799", "9999-12-31 23:59:59"), std::pair("253402300800", "253402300800"),
        std::pair("67767976233532800", "67767976233532800")}) {
    copy.Run("UPDATE Status SET mdate = ?", {seconds});
    EXPECT_THAT(OnCopy({"status"}).output, HasSubstr("\nEmptied   " + std::string(text) + "\n"));
  }
}

TEST_F(ZophotosStatus, ReadsTheDatabaseGivenAsAnOption) {
  const Database copy = Copy();
  copy.Run("UPDATE Status SET mc_version = '7.5'");
  std::filesystem::remove(LOCATOR);
  for (const Arguments& arguments :
       {Arguments{"--database", COPY, "status"}, Arguments{"status", "--database=" + COPY}}) {
    const Outcome outcome = Zophotos(arguments);
    EXPECT_EQ(0, outcome.status);
    EXPECT_THAT(outcome.output, StartsWith("Database  " + COPY + "\nMaster    -\nVersion   7.5\n"));
  }
  std::ofstream(LOCATOR) << "zophotos_db_path=" << MERGED << '\n';
}

TEST_F(ZophotosList, ListsTheSharesRootByDefault) {
  ExpectOutput(Zophotos({"ls"}), "A/\nB/\nC/\nD/\n");
}

TEST_F(ZophotosList, ListsFoldersBeforeFiles) {
  ExpectOutput(Zophotos({"ls", "A"}), "Pictures/\ntop.jpg\n");
}

TEST_F(ZophotosList, AcceptsAbsoluteAndRelativeFolders) {
  for (const char* const folder :
       {"A/Pictures", "A/Pictures/", "/shares/A/Pictures", "/shares/A/Pictures/"}) {
    ExpectOutput(Zophotos({"ls", folder}), "Summer/\nb.jpg\n");
  }
}

TEST_F(ZophotosList, NormalizesPaths) {
  for (const char* const folder :
       {"A//Pictures", "//shares//A/./Pictures//", "A/Pictures/Summer/..", "../shares/A/Pictures",
        "B/../A/Pictures/."}) {
    ExpectOutput(Zophotos({"ls", folder}), "Summer/\nb.jpg\n");
    ExpectOutput(Zophotos({"tree", folder}), Zophotos({"tree", "A/Pictures"}).output);
  }
  ExpectOutput(Zophotos({"ls", ".."}), "shares/\n");
}

TEST_F(ZophotosList, PrefersThePathAsItIsWritten) {
  AddRows(Copy(), "'/shares/A//Pictures/'", "'other.jpg'");
  ExpectOutput(OnCopy({"ls", "A//Pictures"}), "other.jpg\n");
}

TEST_F(ZophotosList, ShowsAFile) {
  for (const char* const file :
       {"A/Pictures/b.jpg", "/shares/A/Pictures/b.jpg", "A//Pictures/./b.jpg"}) {
    ExpectOutput(Zophotos({"ls", file}), "/shares/A/Pictures/b.jpg\n");
  }
  ExpectOutput(Zophotos({"ls", "-l", "A/Pictures/b.jpg"}),
               "MODIFIED             FILES  VOLUME      NAME\n"
               "1970-01-01 00:16:41         /shares/A/  /shares/A/Pictures/b.jpg\n");
  ExpectOutput(
      Zophotos({"ls", "--json", "A/Pictures/b.jpg"}),
      R"({"type":"file","path":"/shares/A/Pictures/b.jpg","volume":"/shares/A/","modified":"1970-01-01T00:16:41Z"})"
      "\n");
  EXPECT_EQ(1, Zophotos({"ls", "A/Pictures/b.jpg/"}).status);
  EXPECT_EQ(1, Zophotos({"ls", "A/b.jpg"}).status);
}

TEST_F(ZophotosList, AcceptsNamesAsTheyArePrinted) {
  const Database copy = Copy();
  AddRows(copy, "'/shares/A/' || CAST(x'0a' AS TEXT) || '\\/'", ODD_NAME_SQL);
  AddRows(copy, R"('/shares/A/\x41\xzz/')", R"('\x')");
  for (const char* const folder : {R"(A/\x0a\\)", "A/\n\\"}) {
    ExpectOutput(OnCopy({"ls", "--escape", folder}), R"(x\x0a\x1b[\xff\\.jpg)"
                                                     "\n");
    EXPECT_EQ(0, OnCopy({"tree", folder}).status);
  }
  for (const std::string& file : {std::string(R"(x\x0a\x1b[\xff\\.jpg)"), ODD_NAME}) {
    ExpectOutput(OnCopy({"ls", "--escape", "A/\n\\/" + file}),
                 R"(/shares/A/\x0a\\/x\x0a\x1b[\xff\\.jpg)"
                 "\n");
  }
  for (const char* const folder : {R"(A/\x41\xzz)", R"(A/\\x41\\xzz)"}) {
    ExpectOutput(OnCopy({"ls", "--escape", folder}), "\\\\x\n");
  }
}

TEST_F(ZophotosList, PrintsOneNamePerLineOnRequest) {
  ExpectOutput(Zophotos({"ls", "-1", "A"}), Zophotos({"ls", "A"}).output);
  ExpectOutput(Zophotos({"ls", "-l1", "A"}), Zophotos({"ls", "-l", "A"}).output);
}

TEST_F(ZophotosList, AddsTimesNumbersAndVolumesInLongForm) {
  ExpectOutput(Zophotos({"ls", "-l", "A/Pictures"}),
               "MODIFIED             FILES  VOLUME      NAME\n"
               "1970-01-01 00:10:00      1  /shares/A/  Summer/\n"
               "1970-01-01 00:16:41         /shares/A/  b.jpg\n");
  EXPECT_THAT(Zophotos({"ls", "--long"}).output, HasSubstr("\n-             1  /shares/B/  B/\n"));
}

TEST_F(ZophotosList, CountsTheFilesBelowFolders) {
  EXPECT_THAT(Zophotos({"ls", "-l"}).output,
              AllOf(HasSubstr("\n-             3  /shares/A/  A/\n"),
                    HasSubstr("\n-             1  /shares/B/  B/\n")));
  EXPECT_THAT(Zophotos({"ls", "--json"}).output,
              HasSubstr(R"("files":0,"stored":true,"files_below":1})"));
}

TEST_F(ZophotosList, PrintsOneObjectPerLineInJson) {
  const std::string lines =
      R"({"type":"folder","path":"/shares/A/Pictures/Summer/","volume":"/shares/A/","modified":"1970-01-01T00:10:00Z","files":1,"stored":true,"files_below":1})"
      "\n"
      R"({"type":"file","path":"/shares/A/Pictures/b.jpg","volume":"/shares/A/","modified":"1970-01-01T00:16:41Z"})"
      "\n";
  ExpectOutput(Zophotos({"ls", "A/Pictures", "--json"}), lines);
  ExpectOutput(Zophotos({"ls", "-l", "A/Pictures", "--json"}), lines);
}

TEST_F(ZophotosList, ReportsAMissingFolder) {
  ExpectError(Zophotos({"ls", "A/Pict"}), 1,
              "zophotos: there is no folder or file /shares/A/Pict\n");
  ExpectError(Zophotos({"ls", "/elsewhere"}), 1,
              "zophotos: there is no folder or file /elsewhere\n");
}

TEST_F(ZophotosList, SaysThatAVolumeIsGone) {
  appliance.Handle(Unplugged(b.Path()));
  const std::string error = "zophotos: the volume /shares/B/ is gone: it was unplugged, or purged "
                            "and not merged again yet\n";
  for (const char* const path : {"B", "/shares/B/", "B/Old/1.jpg"}) {
    ExpectError(Zophotos({"ls", path}), 1, error);
    ExpectError(Zophotos({"tree", path}), 1, error);
  }
  ExpectError(Zophotos({"ls", "BB"}), 1, "zophotos: there is no folder or file /shares/BB\n");
}

TEST_F(ZophotosList, PrintsNothingForAnEmptyFolder) {
  ExpectOutput(Zophotos({"ls", "C"}), "");
  ExpectOutput(Zophotos({"ls", "C", "--json"}), "");
}

/// The daemon removes a folder whose subfolder stays.
class ZophotosRemovedFolder : public ZophotosTest {
protected:
  void SetUp() override {
    ZophotosTest::SetUp();
    onA.DeletePhoto("Pictures/b.jpg", 2005);
    onA.DeleteFolder("Pictures/");
    Merge(a);
  }
};

TEST_F(ZophotosRemovedFolder, IsListedAsNotStored) {
  ExpectOutput(
      Zophotos({"ls", "A", "--json"}),
      R"({"type":"folder","path":"/shares/A/Pictures/","volume":null,"modified":null,"files":0,"stored":false,"files_below":1})"
      "\n"
      R"({"type":"file","path":"/shares/A/top.jpg","volume":"/shares/A/","modified":"1970-01-01T00:16:40Z"})"
      "\n");
  EXPECT_THAT(Zophotos({"ls", "-l", "A"}).output,
              HasSubstr("-                        1              Pictures/\n"));
}

TEST_F(ZophotosRemovedFolder, CanBeListed) {
  ExpectOutput(Zophotos({"ls", "A/Pictures"}), "Summer/\n");
}

TEST_F(ZophotosRemovedFolder, IsShownInTheTree) {
  ExpectOutput(Zophotos({"tree", "A"}), "/shares/A/  2 files\n"
                                        "└── Pictures/  1 file (not stored)\n"
                                        "    └── Summer/  1 file\n");
  ExpectOutput(Zophotos({"tree", "A/Pictures"}), "/shares/A/Pictures/  1 file (not stored)\n"
                                                 "└── Summer/  1 file\n");
}

TEST_F(ZophotosRemovedFolder, IsNotDamage) {
  ExpectOutput(Zophotos({"check"}), MERGED + " is sound\n"
                                             "Expected leftovers (not damage):\n"
                                             "  folders whose parent folder was removed: 1\n"
                                             "    /shares/A/Pictures/Summer/\n");
}

TEST_F(ZophotosTree, ShowsAllFoldersWithTheNumbersOfFilesBelowThem) {
  ExpectOutput(Zophotos({"tree"}), "/shares/  4 files\n"
                                   "├── A/  3 files\n"
                                   "│   └── Pictures/  2 files\n"
                                   "│       └── Summer/  1 file\n"
                                   "├── B/  1 file\n"
                                   "│   └── Old/  1 file\n"
                                   "├── C/  0 files\n"
                                   "└── D/  0 files\n");
}

TEST_F(ZophotosTree, ShowsSomeLevelsOnRequest) {
  ExpectOutput(Zophotos({"tree", "-L", "1"}), "/shares/  4 files\n"
                                              "├── A/  3 files\n"
                                              "├── B/  1 file\n"
                                              "├── C/  0 files\n"
                                              "└── D/  0 files\n");
  ExpectOutput(Zophotos({"tree", "--level=1", "A"}), "/shares/A/  3 files\n"
                                                     "└── Pictures/  2 files\n");
  ExpectOutput(Zophotos({"tree", "-L2", "A"}), Zophotos({"tree", "A"}).output);
}

TEST_F(ZophotosTree, PrintsOneObjectPerLineInJson) {
  const std::string lines =
      R"({"path":"/shares/A/","depth":0,"files":1,"stored":true,"files_below":3})"
      "\n"
      R"({"path":"/shares/A/Pictures/","depth":1,"files":1,"stored":true,"files_below":2})"
      "\n";
  ExpectOutput(
      Zophotos({"--json", "tree", "/shares/A"}),
      lines +
          R"({"path":"/shares/A/Pictures/Summer/","depth":2,"files":1,"stored":true,"files_below":1})"
          "\n");
  ExpectOutput(Zophotos({"--json", "tree", "/shares/A", "-L", "1"}), lines);
}

TEST_F(ZophotosTree, PrintsSubfoldersDirectlyBelowTheirFolder) {
  onA.AddFolder("a/", 1);
  onA.AddFolder("a b/", 1);
  onA.AddFolder("a b/y/", 1);
  onA.AddFolder("a/x/", 1);
  onA.AddFolder("a!/", 1);
  Merge(a);
  ExpectOutput(Zophotos({"tree", "A"}), "/shares/A/  3 files\n"
                                        "├── Pictures/  2 files\n"
                                        "│   └── Summer/  1 file\n"
                                        "├── a/  0 files\n"
                                        "│   └── x/  0 files\n"
                                        "├── a b/  0 files\n"
                                        "│   └── y/  0 files\n"
                                        "└── a!/  0 files\n");
}

TEST_F(ZophotosTree, UsesPathsInsteadOfParentIds) {
  Copy().Run("UPDATE Folders SET parent_folder_id = 999 - folder_id");
  EXPECT_EQ(Zophotos({"tree"}).output, OnCopy({"tree"}).output);
  EXPECT_EQ(Zophotos({"ls", "A"}).output, OnCopy({"ls", "A"}).output);
}

TEST_F(ZophotosTree, ReportsAMissingFolder) {
  ExpectError(Zophotos({"tree", "A/Pict"}), 1, "zophotos: there is no folder /shares/A/Pict/\n");
}

TEST_F(ZophotosTree, RefusesAFile) {
  for (const char* const file : {"A/Pictures/b.jpg", "A//Pictures/./b.jpg"}) {
    ExpectError(Zophotos({"tree", file}), 1,
                "zophotos: /shares/A/Pictures/b.jpg is a file, not a folder\n");
  }
}

TEST_F(ZophotosFind, FindsTextWithoutWildcardsAnywhereInNames) {
  ExpectOutput(Zophotos({"find", "umm"}), "/shares/A/Pictures/Summer/\n");
  ExpectOutput(Zophotos({"find", ".jpg"}), "/shares/A/top.jpg\n"
                                           "/shares/A/Pictures/b.jpg\n"
                                           "/shares/A/Pictures/Summer/a.jpg\n"
                                           "/shares/B/Old/1.jpg\n");
}

TEST_F(ZophotosFind, MatchesWildcardsWithTheWholeName) {
  ExpectOutput(Zophotos({"find", "[a-c].jp?"}), "/shares/A/Pictures/b.jpg\n"
                                                "/shares/A/Pictures/Summer/a.jpg\n");
  ExpectOutput(Zophotos({"find", "S*r"}), "/shares/A/Pictures/Summer/\n");
}

TEST_F(ZophotosFind, MatchesAPatternWithASeparatorWithTheWholePath) {
  ExpectOutput(Zophotos({"find", "/shares/*/Old/*"}), "/shares/B/Old/1.jpg\n");
  ExpectOutput(Zophotos({"find", "Pictures/S"}), "/shares/A/Pictures/Summer/\n"
                                                 "/shares/A/Pictures/Summer/a.jpg\n");
  EXPECT_EQ(1, Zophotos({"find", "Old/*"}).status);
}

TEST_F(ZophotosFind, MatchesAPatternWithASeparatorRelativeToTheSharesRoot) {
  ExpectOutput(Zophotos({"find", "B/*"}), "/shares/B/Old/\n/shares/B/Old/1.jpg\n");
  ExpectOutput(Zophotos({"find", "B//Old/[0-9].jpg"}), "/shares/B/Old/1.jpg\n");
  ExpectOutput(Zophotos({"find", "*/Old"}), "/shares/B/Old/\n");
  EXPECT_EQ(1, Zophotos({"find", "/B/*"}).status);
}

TEST_F(ZophotosFind, MatchesRepeatedSeparatorsAsTheyAreWritten) {
  AddRows(Copy(), "'/shares/A//Pictures/'", "'b.jpg'");
  ExpectOutput(OnCopy({"find", "A//P*/b.jpg"}), "/shares/A//Pictures/b.jpg\n"
                                                "/shares/A/Pictures/b.jpg\n");
}

TEST_F(ZophotosFind, AcceptsNamesAsTheyArePrinted) {
  const Database copy = Copy();
  AddRows(copy, "'/shares/A/odd/'", ODD_NAME_SQL);
  AddRows(copy, "'/shares/A/odd[1]/'");
  const std::string odd = R"(x\x0a\x1b[\xff\\.jpg)";
  for (const std::string& pattern : {odd, ODD_NAME, "/shares/A/odd/" + odd, "A/odd/" + ODD_NAME}) {
    ExpectOutput(OnCopy({"find", "-0", pattern}), "/shares/A/odd/" + ODD_NAME + '\0');
  }
  for (const char* const pattern : {"odd[1]", "/shares/A/odd[1]/", "A//odd[1]/"}) {
    ExpectOutput(OnCopy({"find", pattern}), "/shares/A/odd[1]/\n");
  }
  EXPECT_THAT(OnCopy({"find", "/shares/A/Pictures/"}).output,
              StartsWith("/shares/A/Pictures/\n/shares/A/Pictures/b.jpg\n"));
}

TEST_F(ZophotosFind, FindsOnlyFilesOrFoldersOnRequest) {
  ExpectOutput(Zophotos({"find", "--type", "f", "A/Pictures/"}),
               "/shares/A/Pictures/b.jpg\n/shares/A/Pictures/Summer/a.jpg\n");
  ExpectOutput(Zophotos({"find", "--type=d", "A/Pictures/"}),
               "/shares/A/Pictures/\n/shares/A/Pictures/Summer/\n");
  ExpectError(Zophotos({"find", "--type", "d", "top.jpg"}), 1, "");
}

TEST_F(ZophotosFind, IgnoresCaseOnlyOnRequest) {
  AddRows(Copy(), "'/shares/A/ÄÖ/'");
  EXPECT_EQ(1, OnCopy({"find", "TOP*"}).status);
  ExpectOutput(OnCopy({"find", "-i", "TOP*"}), "/shares/A/top.jpg\n");
  ExpectOutput(OnCopy({"find", "--ignore-case", "äö"}), "/shares/A/ÄÖ/\n");
}

TEST_F(ZophotosFind, MatchesAQuestionMarkWithOneCharacter) {
  AddRows(Copy(), "'/shares/A/ÄÖ/'");
  ExpectOutput(OnCopy({"find", "?Ö"}), "/shares/A/ÄÖ/\n");
  ExpectOutput(OnCopy({"find", "[Ä]?"}), "/shares/A/ÄÖ/\n");
}

TEST_F(ZophotosFind, AcceptsAPatternThatBeginsWithADash) {
  AddRows(Copy(), "'/shares/A/-x/'");
  ExpectOutput(OnCopy({"find", "--", "-x"}), "/shares/A/-x/\n");
}

TEST_F(ZophotosFind, PrintsNothingIfNothingMatches) {
  ExpectError(Zophotos({"find", "absent"}), 1, "");
  ExpectError(Zophotos({"find", "--json", "absent"}), 1, "");
  ExpectError(Zophotos({"find", "-0", "absent"}), 1, "");
}

TEST_F(ZophotosFind, NamesTheOptionForCaseOnATerminalIfItHelps) {
  const Terminal terminal(80);
  const Lines hint{"zophotos: nothing matches; with -i, which ignores case, something does"};
  EXPECT_EQ(hint, terminal.Run({"find", "TOP*"}));
  EXPECT_EQ(hint, terminal.Run({"find", "--json", "PICTURES"}));
  EXPECT_EQ(Lines(), terminal.Run({"find", "absent"}));
  EXPECT_EQ(Lines(), terminal.Run({"find", "-i", "absent"}));
  EXPECT_EQ(Lines(), terminal.Run({"find", "--type", "f", "PICTURES"}));
  EXPECT_EQ(Lines{"/shares/A/top.jpg"}, terminal.Run({"find", "top"}));
  ExpectError(Zophotos({"find", "TOP*"}), 1, "");
}

TEST_F(ZophotosFind, PrintsOneObjectPerLineInJson) {
  ExpectOutput(
      Zophotos({"find", "--json", "*r*"}),
      R"({"type":"folder","path":"/shares/","volume":"<DUMMY>","modified":"1970-01-01T00:00:00Z"})"
      "\n"
      R"({"type":"folder","path":"/shares/A/Pictures/","volume":"/shares/A/","modified":"1970-01-01T00:08:20Z"})"
      "\n"
      R"({"type":"folder","path":"/shares/A/Pictures/Summer/","volume":"/shares/A/","modified":"1970-01-01T00:10:00Z"})"
      "\n");
  EXPECT_THAT(
      Zophotos({"find", "--json", "1.jpg"}).output,
      R"({"type":"file","path":"/shares/B/Old/1.jpg","volume":"/shares/B/","modified":"1970-01-02T00:00:00Z"})"
      "\n");
}

TEST_F(ZophotosFind, EscapesControlCharactersAndInvalidUtf8) {
  AddRows(Copy(), "'/shares/A/odd/'", ODD_NAME_SQL);
  ExpectOutput(OnCopy({"--escape", "find", "x*"}), R"(/shares/A/odd/x\x0a\x1b[\xff\\.jpg)"
                                                   "\n");
}

TEST_F(ZophotosFind, PrintsUnescapedPathsIntoAPipe) {
  AddRows(Copy(), "'/shares/A/odd/'", ODD_NAME_SQL);
  ExpectOutput(OnCopy({"find", "x*"}), "/shares/A/odd/" + ODD_NAME + '\n');
  ExpectOutput(OnCopy({"ls", "A/odd"}), ODD_NAME + '\n');
  ExpectOutput(OnCopy({"ls", "A/odd/" + ODD_NAME}), "/shares/A/odd/" + ODD_NAME + '\n');
  // Other text has more in a line than a name.
  for (const Arguments& arguments : {Arguments{"ls", "-l", "A/odd"}, Arguments{"ls", "-l", "A"}}) {
    EXPECT_THAT(OnCopy(arguments).output, Not(HasSubstr("\x1b")));
  }
}

TEST_F(ZophotosFind, EscapesInvisibleCharacters) {
  const Database copy = Copy();
  const std::vector<std::pair<std::string, std::string>> names = {
      {"\u00AD", R"(\xc2\xad)"},
      {"\u034F", R"(\xcd\x8f)"},
      {"\u115F", R"(\xe1\x85\x9f)"},
      {"\u200B", R"(\xe2\x80\x8b)"},
      {"\u3164", R"(\xe3\x85\xa4)"},
      {"\uFFA0", R"(\xef\xbe\xa0)"},
      {"\U0001D173", R"(\xf0\x9d\x85\xb3)"},
      {"\U000E0041", R"(\xf3\xa0\x81\x81)"}};
  for (const auto& [name, escaped] : names) {
    copy.Run("UPDATE Files SET name = ?1 WHERE name = 'top.jpg' OR name LIKE '%.x'", {name + ".x"});
    ExpectOutput(OnCopy({"find", "--escape", "*.x"}), "/shares/A/" + escaped + ".x\n");
  }
  // A joiner in an emoji, and variation selectors of an emoji and of a Chinese character.
  for (const char* const name : {"👩‍👧.x", "❤️.x", "葛\U000E0100.x", "ü.x"}) {
    copy.Run("UPDATE Files SET name = ? WHERE name LIKE '%.x'", {name});
    ExpectOutput(OnCopy({"find", "--escape", "*.x"}), "/shares/A/" + std::string(name) + "\n");
  }
}

TEST_F(ZophotosFind, PrintsUnescapedPathsEndedByNul) {
  AddRows(Copy(), "'/shares/A/odd/'", ODD_NAME_SQL);
  ExpectOutput(OnCopy({"find", "-0", "x*"}), "/shares/A/odd/" + ODD_NAME + '\0');
  ExpectOutput(OnCopy({"find", "--null", "odd"}), std::string("/shares/A/odd/") + '\0');
}

TEST_F(ZophotosFind, OrdersResultsByPath) {
  const Database copy = Copy();
  AddRows(copy, "'/shares/A/z/'", "'2'");
  AddRows(copy, "'/shares/A/m/'", "'3'");
  copy.Run("UPDATE Files SET name = '1' WHERE name = 'b.jpg'");
  ExpectOutput(OnCopy({"find", "[0-9]"}), "/shares/A/Pictures/1\n/shares/A/m/3\n/shares/A/z/2\n");
}

TEST_F(ZophotosExport, WritesCsvWithAHeading) {
  ExpectOutput(
      Zophotos({"export", "--csv"}),
      "path,volume,modified,created\n"
      R"("/shares/A/top.jpg","/shares/A/",1970-01-01T00:16:40Z,1970-01-01T00:16:40Z)"
      "\n"
      R"("/shares/A/Pictures/b.jpg","/shares/A/",1970-01-01T00:16:41Z,1970-01-01T00:16:41Z)"
      "\n"
      R"("/shares/A/Pictures/Summer/a.jpg","/shares/A/",1970-01-01T00:16:42Z,1970-01-01T00:16:42Z)"
      "\n"
      R"("/shares/B/Old/1.jpg","/shares/B/",1970-01-02T00:00:00Z,1970-01-02T00:00:00Z)"
      "\n");
}

TEST_F(ZophotosExport, WritesCsvByDefault) {
  ExpectOutput(Zophotos({"export"}), Zophotos({"export", "--csv"}).output);
}

TEST_F(ZophotosExport, WritesOneJsonObjectPerLine) {
  const Outcome outcome = Zophotos({"export", "--jsonl"});
  EXPECT_EQ(0, outcome.status);
  EXPECT_THAT(
      outcome.output,
      AllOf(
          StartsWith(
              R"({"path":"/shares/A/top.jpg","volume":"/shares/A/","modified":"1970-01-01T00:16:40Z","created":"1970-01-01T00:16:40Z"})"
              "\n"),
          Not(HasSubstr("Summer/\""))));
  EXPECT_EQ(outcome.output, Zophotos({"export", "--json"}).output);
}

TEST_F(ZophotosExport, QuotesSpecialCharactersInCsv) {
  const Database copy = Copy();
  copy.Run("DELETE FROM Files");
  AddRows(copy, "'/shares/A/1,\"/'", "'say \"hi\", you'");
  AddRows(copy, "'/shares/A/2/'", R"('\.')");
  AddRows(copy, "'/shares/A/3/'", ODD_NAME_SQL);
  AddRows(copy, "'/shares/A/4/'", "CAST(x'6e000d6c' AS TEXT)");
  const std::string rest = "\",\"/shares/A/\",1970-01-01T00:00:05Z,1970-01-01T00:00:06Z\n";
  ExpectOutput(OnCopy({"export", "--csv"}), "path,volume,modified,created\n"
                                            "\"/shares/A/1,\"\"/say \"\"hi\"\", you" +
                                                rest + "\"/shares/A/2/\\." + rest +
                                                "\"/shares/A/3/x\n\x1b[\uFFFD\\.jpg" + rest +
                                                "\"/shares/A/4/n\uFFFD\rl" + rest);
}

TEST_F(ZophotosExport, EscapesCsvOnATerminalAndOnRequest) {
  const Database copy = Copy();
  copy.Run("DELETE FROM Files");
  AddRows(copy, "'/shares/A/3\"/'", ODD_NAME_SQL);
  const Lines lines{
      "path,volume,modified,created",
      R"("/shares/A/3""/x\x0a\x1b[\xff\\.jpg","/shares/A/",1970-01-01T00:00:05Z,1970-01-01T00:00:06Z)"};
  EXPECT_EQ(lines, Terminal(200).Run(OnCopyArguments({"export"})));
  EXPECT_EQ(lines, SplitLines(OnCopy({"--escape", "export"}).output));
  EXPECT_EQ(OnCopy({"export"}).output, OnCopy({"--color", "always", "export"}).output);
}

TEST_F(ZophotosExport, EscapesSpecialCharactersInJson) {
  const Database copy = Copy();
  copy.Run("DELETE FROM Files");
  AddRows(copy, "'/shares/A/1/'", ODD_NAME_SQL);
  AddRows(copy, "'/shares/A/2/'", "CAST(x'6e00226cf09f9880' AS TEXT)");
  const std::string rest = R"(","volume":"/shares/A/","modified":"1970-01-01T00:00:05Z",)"
                           R"("created":"1970-01-01T00:00:06Z"})"
                           "\n";
  ExpectOutput(OnCopy({"export", "--jsonl"}), R"({"path":"/shares/A/1/x\n\u001b[)"
                                              "\uFFFD"
                                              R"(\\.jpg)" +
                                                  rest + R"({"path":"/shares/A/2/n)" + "\uFFFD" +
                                                  R"(\"l😀)" + rest);
}

TEST_F(ZophotosExport, LeavesOutTimesOutsideTheCalendar) {
  const Database copy = Copy();
  copy.Run("UPDATE Files SET modified_date = -62135596800, created_date = 253402300799 WHERE name "
           "= 'top.jpg'");
  copy.Run("UPDATE Files SET modified_date = -62135596801, created_date = 253402300800 WHERE name "
           "= 'b.jpg'");
  copy.Run("DELETE FROM Files WHERE name NOT IN ('top.jpg', 'b.jpg')");
  ExpectOutput(OnCopy({"export", "--csv"}),
               "path,volume,modified,created\n"
               "\"/shares/A/top.jpg\",\"/shares/A/\",0001-01-01T00:00:00Z,9999-12-31T23:59:59Z\n"
               "\"/shares/A/Pictures/b.jpg\",\"/shares/A/\",,\n");
  EXPECT_THAT(OnCopy({"export", "--jsonl"}).output,
              HasSubstr(R"("modified":null,"created":null})"));
}

} // namespace
} // namespace orva::test

// What zophotos reports as damage of a database, and what it does not.

#include "ZophotosTest.h"

#include <nlohmann/json.hpp>

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

using ::testing::AllOf;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

class ZophotosCheck : public ZophotosTest {
protected:
  /// Runs the statements on a new copy and expects that a check of it finds this damage: lines of
  /// text below the heading, and a finding in JSON.
  static void ExpectDamage(const std::vector<std::string>& statements, const std::string& text,
                           const std::string& json) {
    SCOPED_TRACE(statements[0]);
    const Database copy = Copy();
    for (const std::string& sql : statements) {
      copy.Run(sql);
    }
    ExpectOutput(OnCopy({"check"}), COPY + " is damaged\nDamage:\n" + text, 1);
    ExpectOutput(OnCopy({"check", "--json"}),
                 R"({"database":")" + COPY + R"(","sound":false,"damage":[)" + json +
                     R"(],"leftovers":[]})" + "\n",
                 1);
  }

  /// Overwrites the copy at an offset.
  static void Overwrite(std::size_t offset, const std::string& bytes) {
    std::fstream file(COPY, std::ios::in | std::ios::out | std::ios::binary);
    file.seekp(static_cast<std::streamoff>(offset));
    file << bytes;
  }

  /// The offset of the first page of a table or index in the copy, which is new.
  static std::size_t RootOffset(const std::string& table) {
    const Database copy = Copy();
    const auto number = [&](const std::string& sql) { return std::stoul(copy.Run(sql).at(0)); };
    return (number("SELECT rootpage FROM sqlite_master WHERE name = '" + table + "'") - 1) *
           number("PRAGMA page_size");
  }
};

TEST_F(ZophotosCheck, FindsTheDaemonsDatabaseSound) {
  ExpectOutput(Zophotos({"check"}), MERGED + " is sound\n");
  ExpectOutput(
      Zophotos({"check", "--json"}),
      R"({"database":"/shares/A//.zophotos/zophotos.db","sound":true,"damage":[],"leftovers":[]})"
      "\n");
}

TEST_F(ZophotosCheck, FindsAMissingStatusRow) {
  ExpectDamage({"DELETE FROM Status"}, "  status row missing: 1\n    Status\n",
               R"({"kind":"no_status","count":1,"examples":["Status"]})");
}

TEST_F(ZophotosCheck, FindsAMissingRootFolder) {
  const std::string text = "  root folder missing: 1\n    Folders\n";
  const std::string json = R"({"kind":"no_root","count":1,"examples":["Folders"]})";
  ExpectDamage({"UPDATE Folders SET name = '/share/' WHERE folder_id = 1"}, text, json);
  ExpectDamage(
      {"UPDATE Folders SET parent_folder_id = -1", "DELETE FROM Folders WHERE folder_id = 1"}, text,
      json);
}

TEST_F(ZophotosCheck, FindsFilesWithoutAFolder) {
  ExpectDamage(
      {"UPDATE Files SET folder_id = 999, file_id = 77 WHERE name = 'top.jpg'"},
      "  files without a folder: 1\n    file 77, top.jpg, of /shares/A/: no folder 999\n",
      R"({"kind":"file_without_folder","count":1,"examples":["file 77, top.jpg, of /shares/A/: no folder 999"]})");
}

TEST_F(ZophotosCheck, FindsFilesWithAnotherVolumeThanTheirFolder) {
  ExpectDamage(
      {"UPDATE Files SET volume = '/shares/B/' WHERE name = 'top.jpg'"},
      "  files with another volume than their folder: 1\n"
      "    /shares/A/top.jpg, of /shares/B/ in a folder of /shares/A/\n",
      R"({"kind":"file_of_other_volume","count":1,"examples":["/shares/A/top.jpg, of /shares/B/ in a folder of /shares/A/"]})");
}

TEST_F(ZophotosCheck, FindsDuplicateFolders) {
  ExpectDamage({"INSERT INTO Folders(parent_folder_id, name, modified_date, volume) SELECT "
                "parent_folder_id, name, 7, volume FROM Folders WHERE name = '/shares/B/Old/'"},
               "  duplicate folders: 1\n    /shares/B/Old/, 2 times\n",
               R"({"kind":"duplicate_folder","count":1,"examples":["/shares/B/Old/, 2 times"]})");
}

TEST_F(ZophotosCheck, FindsDuplicateFiles) {
  const std::string insert =
      "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT folder_id, "
      "name, 7, volume, 8 FROM Files WHERE name = '1.jpg' LIMIT 1";
  ExpectDamage(
      {insert, insert}, "  duplicate files: 1\n    /shares/B/Old/1.jpg, 3 times\n",
      R"({"kind":"duplicate_file","count":1,"examples":["/shares/B/Old/1.jpg, 3 times"]})");
}

TEST_F(ZophotosCheck, FindsDuplicateStatistics) {
  ExpectDamage({"INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) "
                "VALUES('/shares/B/', 0, 0, 0)"},
               "  volumes with more than one row of statistics: 1\n    /shares/B/, 2 times\n",
               R"({"kind":"duplicate_statistics","count":1,"examples":["/shares/B/, 2 times"]})");
}

TEST_F(ZophotosCheck, ReportsEachKindOfDamage) {
  const Database copy = Copy();
  copy.Run("DELETE FROM Status");
  copy.Run("UPDATE Files SET folder_id = 999 WHERE name = 'top.jpg'");
  const Outcome outcome = OnCopy({"check"});
  EXPECT_EQ(1, outcome.status);
  EXPECT_THAT(outcome.output, AllOf(HasSubstr("  status row missing: 1\n"),
                                    HasSubstr("  files without a folder: 1\n")));
}

TEST_F(ZophotosCheck, ListsTwentyExamplesAndCountsTheRest) {
  const Database copy = Copy();
  copy.Run("DELETE FROM Files");
  AddFiles(copy, 25, "99", "(i + 9) || '.jpg'");
  const Outcome inText = OnCopy({"check"});
  EXPECT_THAT(inText.output, HasSubstr("  files without a folder: 25\n"));
  EXPECT_THAT(inText.output, HasSubstr(", 29.jpg, of /shares/A/: no folder 99\n    and 5 more\n"));
  EXPECT_THAT(inText.output, Not(HasSubstr("30.jpg")));
  const Outcome inJson = OnCopy({"check", "--json"});
  EXPECT_THAT(inJson.output, HasSubstr(R"("kind":"file_without_folder","count":25,"examples":[)"));
  EXPECT_EQ(20U, nlohmann::json::parse(inJson.output).at("damage").at(0).at("examples").size());
}

TEST_F(ZophotosCheck, AcceptsTheStatisticsOfAnUnpluggedVolume) {
  appliance.Handle(Unplugged(b.Path()));
  ExpectOutput(Zophotos({"check"}), MERGED + " is sound\n"
                                             "Expected leftovers (not damage):\n"
                                             "  statistics of volumes without merged content: 1\n"
                                             "    /shares/B/\n");
  const Outcome inJson = Zophotos({"check", "--json"});
  EXPECT_EQ(0, inJson.status);
  EXPECT_THAT(
      inJson.output,
      HasSubstr(
          R"("sound":true,"damage":[],"leftovers":[{"kind":"statistics_without_content","count":1,"examples":["/shares/B/"]}])"));
}

TEST_F(ZophotosCheck, EscapesNamesInExamples) {
  Copy().Run("UPDATE Files SET folder_id = 999, name = CAST(x'1b5bff' AS TEXT) WHERE name = "
             "'top.jpg'");
  EXPECT_THAT(OnCopy({"check"}).output, HasSubstr(R"(, \x1b[\xff, of)"));
  EXPECT_THAT(OnCopy({"check", "--json"}).output, HasSubstr("\\u001b[\uFFFD, of"));
}

TEST_F(ZophotosCheck, FindsOverwrittenPages) {
  for (const char* const table : {"Files", "Folders", "Statistics", "Folders_path", "Files_name"}) {
    Overwrite(RootOffset(table), std::string(2000, '\x5a'));
    const Outcome outcome = OnCopy({"check"});
    EXPECT_EQ(1, outcome.status) << table;
    EXPECT_THAT(outcome.output, StartsWith(COPY + " is damaged\nDamage:\n")) << table;
    EXPECT_THAT(outcome.output, HasSubstr("\n  errors in the file: ")) << table;
    EXPECT_EQ("", outcome.error) << table;
    EXPECT_THAT(OnCopy({"check", "--json"}).output, HasSubstr(R"({"kind":"integrity","count":)"));
  }
}

TEST_F(ZophotosCheck, FindsAnOverwrittenSchema) {
  Copy();
  Overwrite(100, std::string(2000, '\x5a'));
  EXPECT_EQ(1, OnCopy({"check"}).status);
}

TEST_F(ZophotosCheck, FindsATruncatedFile) {
  Copy();
  std::filesystem::resize_file(COPY, std::filesystem::file_size(COPY) - 5000);
  const Outcome outcome = OnCopy({"check"});
  EXPECT_EQ(1, outcome.status);
  EXPECT_THAT(outcome.output, HasSubstr("\n  errors in the file: "));
}

TEST_F(ZophotosCheck, ReportsUnreadablePagesOnlyAsErrorsInTheFile) {
  Copy();
  const std::string page(4096, '\x5a');
  for (std::size_t at = 4096; at < std::filesystem::file_size(COPY); at += 4096) {
    Overwrite(at, page);
  }
  const Outcome outcome = OnCopy({"check"});
  EXPECT_EQ(1, outcome.status);
  EXPECT_THAT(outcome.output, AllOf(HasSubstr("\n  errors in the file: "),
                                    HasSubstr(", while looking for files without"),
                                    Not(HasSubstr("files without a folder:"))));
}

TEST_F(ZophotosCheck, FindsAFileThatIsNotADatabase) {
  Copy();
  Overwrite(0, "This is a letter and no data");
  ExpectOutput(OnCopy({"check"}),
               COPY + " is damaged\nDamage:\n  errors in the file: 1\n    file is not a database\n",
               1);
}

TEST_F(ZophotosCheck, FindsUnusedPages) {
  {
    const Database copy = Copy();
    copy.Run("PRAGMA writable_schema = ON");
    copy.Run("DELETE FROM sqlite_master WHERE name = 'Files_name'");
  }
  const Outcome outcome = OnCopy({"check"});
  EXPECT_EQ(1, outcome.status);
  EXPECT_THAT(outcome.output, HasSubstr("\n  errors in the file: "));
}

} // namespace
} // namespace orva::test

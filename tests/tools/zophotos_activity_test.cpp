// What zophotos shows of the services that index and render.

#include "ServiceFiles.h"
#include "ZophotosTest.h"

#include <nlohmann/json.hpp>

#include <sys/stat.h>

#include <filesystem>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;
using ::testing::HasSubstr;
using ::testing::Not;

class ZophotosActivity : public ZophotosTest {
protected:
  /// The output of status after what it prints without the services.
  std::string Added() const {
    const Outcome outcome = Zophotos({"status"});
    EXPECT_EQ(0, outcome.status);
    EXPECT_EQ("", outcome.error);
    EXPECT_EQ(plain, outcome.output.substr(0, plain.size()));
    return outcome.output.substr(std::min(plain.size(), outcome.output.size()));
  }

  /// The volume in the JSON of status.
  static json VolumeInJson(const std::string& name) {
    const json status = json::parse(Zophotos({"status", "--json"}).output);
    for (const json& volume : status["volumes"]) {
      if (volume["volume"] == name) {
        return volume;
      }
    }
    return {};
  }

  void SetUp() override {
    ZophotosTest::SetUp();
    plain = Zophotos({"status"}).output;
    plainJson = Zophotos({"status", "--json"}).output;
  }

  std::string plain;
  std::string plainJson;
};

TEST_F(ZophotosActivity, IsShownForEachVolumeOfTheServices) {
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", "12") + "," +
                                   IndexerVolume("/shares/B/", "watching", "0") + "," +
                                   IndexerVolume("/shares/C/", "timed", "1") + "," +
                                   IndexerVolume("/shares/D/", "read-only", "0") + "," +
                                   IndexerVolume("/shares/E/", "walking", "0") + "," +
                                   IndexerVolume("/shares/F/", "unusable", "0") + "," +
                                   IndexerVolume("/shares/G/", "re\\u001bst", "0"));
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A/", "1200", "0", "true") + "," +
                                      TranscoderVolume("/shares/B/", "0", "0", "false") + "," +
                                      TranscoderVolume("/shares/H/", "3", "0", "true"));
  EXPECT_EQ("\n"
            "VOLUME      WAITING  FAILED  ACTIVITY\n"
            "/shares/A/     1200       0  being indexed, 12 folders waiting; rendering\n"
            "/shares/B/        0       0  watched\n"
            "/shares/C/        -       -  indexed at intervals, 1 folder waiting\n"
            "/shares/D/        -       -  read-only, not indexed\n"
            "/shares/E/        -       -  being indexed\n"
            "/shares/F/        -       -  cannot be indexed\n"
            "/shares/G/        -       -  re\\x1bst\n"
            "/shares/H/        3       0  rendering\n",
            Added());
}

TEST_F(ZophotosActivity, NamesTheCommandThatListsFailedPhotos) {
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A/", "0", "2", "false"));
  EXPECT_EQ("\n"
            "VOLUME      WAITING  FAILED  ACTIVITY\n"
            "/shares/A/        0       2  -\n"
            "\n"
            "'zophotos failed' lists the failed photos with the reasons.\n"
            "\n"
            "orva-indexer does not run.\n",
            Added());
}

TEST_F(ZophotosActivity, NamesTheServicesThatDoNotRun) {
  WriteVolumes(INDEXER_FOLDER, "");
  EXPECT_EQ("\norva-transcoder does not run.\n", Added());
  WriteVolumes(TRANSCODER_FOLDER, "");
  EXPECT_EQ("", Added());
  fs::remove_all(INDEXER_FOLDER);
  EXPECT_EQ("\norva-indexer does not run.\n", Added());
  fs::remove_all(TRANSCODER_FOLDER);
  EXPECT_EQ("", Added());
  fs::create_directories("/var/lib/zophotodbmerger-standalone");
  EXPECT_EQ("\norva-indexer and orva-transcoder do not run.\n", Added());
  EXPECT_EQ(plainJson, Zophotos({"status", "--json"}).output);
  Copy();
  EXPECT_THAT(OnCopy({"status"}).output, Not(HasSubstr("not run")));
}

TEST_F(ZophotosActivity, IsInTheJsonOfEachVolume) {
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", "12") + "," +
                                   IndexerVolume("/shares/E", "walking", "1"));
  EXPECT_EQ(
      R"({"files":3,"folders":3,"folders_waiting":12,"gone":false,"merged_up_to":"1970-01-01T00:33:22Z","state":"walking","total":3,"transcoded":3,"volume":"/shares/A/"})",
      VolumeInJson("/shares/A/").dump());
  EXPECT_EQ(
      R"({"files":0,"folders":1,"folders_waiting":null,"gone":false,"merged_up_to":null,"state":null,"total":0,"transcoded":0,"volume":"/shares/C/"})",
      VolumeInJson("/shares/C/").dump());
  EXPECT_EQ(
      R"({"files":0,"folders":0,"folders_waiting":1,"gone":false,"merged_up_to":null,"state":"walking","total":0,"transcoded":0,"volume":"/shares/E/"})",
      VolumeInJson("/shares/E/").dump());
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/E/", "5", "2", "true"));
  EXPECT_THAT(
      Zophotos({"status", "--json"}).output,
      HasSubstr(
          R"("merged_up_to":null,"gone":false,"state":"walking","folders_waiting":1,"waiting":5,)"
          R"("failed":2,"rendering":true}]})"));
  EXPECT_THAT(VolumeInJson("/shares/A/").dump(), HasSubstr(R"("failed":null,)"));
}

TEST_F(ZophotosActivity, IsNotShownForAnotherDatabase) {
  Copy();
  const Outcome before = OnCopy({"status"});
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", "12"));
  ExpectOutput(OnCopy({"status"}), before.output);
}

TEST_F(ZophotosActivity, IsMatchedToAVolumeWhoseNameIsNotUtf8) {
  Database(MERGED).Run("UPDATE Statistics SET volume = CAST(x'2f7368617265732fff2f' AS TEXT) "
                       "WHERE volume = '/shares/D/'");
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/\uFFFD/", "walking", "12"));
  const json status = json::parse(Zophotos({"status", "--json"}).output);
  EXPECT_EQ(5U, status["volumes"].size());
  EXPECT_EQ(12, VolumeInJson("/shares/\uFFFD/")["folders_waiting"]);
  EXPECT_EQ(1, VolumeInJson("/shares/\uFFFD/")["total"]);
}

TEST_F(ZophotosActivity, IsShownBeforeTheFirstMerge) {
  const Database database(MERGED);
  database.Run("DELETE FROM Statistics");
  database.Run("DELETE FROM Files");
  database.Run("DELETE FROM Folders WHERE folder_id != 1");
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", "12"));
  EXPECT_THAT(Zophotos({"status"}).output,
              HasSubstr("\nNo volume has been merged yet.\n\n"
                        "VOLUME      WAITING  FAILED  ACTIVITY\n"
                        "/shares/A/        -       -  being indexed, 12 folders waiting\n"));
}

TEST_F(ZophotosActivity, MalformedFilesAreIgnored) {
  const std::string good = IndexerVolume("/shares/A/", "walking", "1");
  for (const std::string& text : std::vector<std::string>{
           "", "{", "null", "[]", "17", R"({"volumes":{}})", R"({"volumes":[17]})",
           R"({"volumes":[)" + good + ",{}]}", R"({"volumes":[)" + good + "]",
           R"({"volumes":[)" + IndexerVolume("/shares/A/", "walking", "-1") + "]}",
           R"({"volumes":[)" + IndexerVolume("/shares/A/", "walking", "1.5") + "]}",
           R"({"volumes":[)" + IndexerVolume("/shares/A/", "walking", "\"1\"") + "]}",
           R"({"volumes":[)" + IndexerVolume("/shares/A/", "walking", "true") + "]}",
           R"({"volumes":[)" + IndexerVolume("/shares/\xff/", "walking", "1") + "]}",
           R"({"volumes":[{"mountPoint":7,"state":"walking","foldersWaiting":1}]})",
           R"({"volumes":[{"mountPoint":"/shares/A/","state":[],"foldersWaiting":1}]})",
           std::string(500'000, '['),
           R"({"volumes":[)" + good + "]}" + std::string(1 << 20, ' ')}) {
    WriteStatus(INDEXER_FOLDER, text);
    EXPECT_EQ("", Added()) << text.substr(0, 100);
    EXPECT_EQ(plainJson, Zophotos({"status", "--json"}).output) << text.substr(0, 100);
  }
  for (const auto& [waiting, failed, rendering] :
       {std::tuple("-1", "0", "true"), std::tuple("0", "null", "true"),
        std::tuple("0", "0", "1")}) {
    WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A/", waiting, failed, rendering));
    EXPECT_EQ("", Added()) << waiting << failed << rendering;
  }
  WriteVolumes(INDEXER_FOLDER, good);
  EXPECT_THAT(Added(), HasSubstr("being indexed, 1 folder waiting\n"));
}

TEST_F(ZophotosActivity, FilesThatAreNotRegularAreIgnored) {
  WriteVolumes(INDEXER_FOLDER, IndexerVolume("/shares/A/", "walking", "1"));
  const std::string file = INDEXER_FOLDER + "/status.json";
  fs::rename(file, "/run/elsewhere.json");
  EXPECT_EQ("", Added());
  fs::create_symlink("/run/elsewhere.json", file);
  EXPECT_EQ("", Added());
  fs::remove(file);
  ASSERT_EQ(0, mkfifo(file.c_str(), 0666));
  EXPECT_EQ("", Added());
  fs::remove(file);
  fs::create_directory(file);
  EXPECT_EQ("", Added());
}

TEST_F(ZophotosActivity, LargestNumbersDoNoHarm) {
  WriteVolumes(
      TRANSCODER_FOLDER,
      TranscoderVolume("/shares/A/", "18446744073709551615", "1", "false") + "," +
          TranscoderVolume("/shares/B/", "9223372036854775807", "9223372036854775807", "false"));
  EXPECT_THAT(Added(), HasSubstr("\n/shares/A/  9223372036854775807                    1  -\n"));
  EXPECT_EQ(9223372036854775807, VolumeInJson("/shares/B/")["failed"]);
}

} // namespace
} // namespace orva::test

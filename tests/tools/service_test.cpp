#include "service/Log.h"
#include "service/StatusFile.h"
#include "service/Turns.h"

#include "system/Syslog.h"

#include <nlohmann/json.hpp>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <string>

namespace {

using namespace orva::test;
using orva::service::LONGEST_PRINTABLE;
using orva::service::Printable;
using orva::service::StatusFile;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
namespace fs = std::filesystem;

// --- Turns -------------------------------------------------------------------------------------

TEST(Turns, EachElementForWhichTheConditionHoldsIsNextOnce) {
  const std::map<std::string, bool> elements = {
      {"a", true}, {"b", false}, {"c", true}, {"d", true}};
  std::string order;
  std::string last = "b"; // may be absent
  for (int turn = 0; turn < 5; ++turn) {
    last = orva::service::NextInTurn(elements, last, [](const auto& element) {
             return element.second;
           })->first;
    order += last;
  }
  EXPECT_EQ(order, "cdacd");
}

TEST(Turns, NothingIsNextIfTheConditionHoldsForNoElement) {
  const std::map<std::string, int> elements = {{"a", 1}, {"b", 2}};
  for (const char* const last : {"", "a", "b", "c"}) {
    EXPECT_EQ(orva::service::NextInTurn(elements, last, [](const auto&) { return false; }),
              elements.end());
  }
}

// --- Printable ---------------------------------------------------------------------------------

TEST(Printable, EscapesWhatIsNotPrintable) {
  EXPECT_EQ(Printable("/shares/a b~.jpg"), "/shares/a b~.jpg");
  EXPECT_EQ(Printable("\n\x1b[1m\x7f\\\xC3\xA4"), "\\x0a\\x1b[1m\\x7f\\x5c\\xc3\\xa4");
  EXPECT_EQ(Printable(std::string_view("\0", 1)), "\\x00");
  EXPECT_EQ(Printable(""), "");
}

TEST(Printable, ShortensALongText) {
  EXPECT_EQ(Printable(std::string(LONGEST_PRINTABLE, 'x')), std::string(LONGEST_PRINTABLE, 'x'));
  EXPECT_EQ(Printable(std::string(LONGEST_PRINTABLE + 1, 'x')),
            std::string(LONGEST_PRINTABLE - 3, 'x') + "...");
}

TEST(Printable, CutsNoEscape) {
  for (std::size_t shift = 0; shift < 8; ++shift) {
    const std::string text =
        Printable(std::string(shift, 'x') + std::string(LONGEST_PRINTABLE, '\n'));
    EXPECT_LE(text.size(), LONGEST_PRINTABLE);
    EXPECT_GT(text.size(), LONGEST_PRINTABLE - 8);
    EXPECT_THAT(text, EndsWith("\\x0a...")) << shift;
  }
}

// --- The status file ---------------------------------------------------------------------------

class StatusFileTest : public testing::Test {
protected:
  using Json = nlohmann::ordered_json;

  StatusFileTest() { fs::create_directories(DIRECTORY); }

  static Json Volume(const std::string& mountPoint, int files) {
    return {{"mountPoint", mountPoint}, {"files", files}};
  }

  static std::string Content() {
    std::ifstream file(std::string(DIRECTORY) + "/status.json");
    return {std::istreambuf_iterator<char>(file), {}};
  }

  static constexpr char DIRECTORY[] = "/tmp/runtime";
  StatusFile file_{DIRECTORY};
};

TEST_F(StatusFileTest, NamesTheVolumes) {
  EXPECT_FALSE(file_.Update(Json::array(), false));
  EXPECT_EQ(Content(), "{\"volumes\":[]}\n");
  EXPECT_FALSE(file_.Update(Json{Volume("/shares/A/", 7), Volume("/shares/\xFF/", 0)}, false));
  EXPECT_EQ(Content(), "{\"volumes\":[{\"mountPoint\":\"/shares/A/\",\"files\":7},"
                       "{\"mountPoint\":\"/shares/\xEF\xBF\xBD/\",\"files\":0}]}\n");
}

TEST_F(StatusFileTest, IsReplacedOnlyWhenItChanges) {
  const auto inode = [] {
    struct stat status {};
    EXPECT_EQ(stat("/tmp/runtime/status.json", &status), 0);
    return status.st_ino;
  };
  file_.Update(Json{Volume("/shares/A/", 1)}, false);
  const auto first = inode();
  const std::ifstream open("/tmp/runtime/status.json"); // so that its inode is not used again
  file_.Update(Json{Volume("/shares/A/", 1)}, false);
  EXPECT_EQ(inode(), first);
  file_.Update(Json{Volume("/shares/A/", 2)}, false);
  EXPECT_NE(inode(), first);
}

TEST_F(StatusFileTest, IsWrittenAtMostOnceASecondDuringWork) {
  using std::chrono::milliseconds;
  const StatusFile::Clock::time_point begin(std::chrono::hours(1));
  EXPECT_FALSE(file_.Update(Json{Volume("/shares/A/", 1)}, true, begin));
  EXPECT_EQ(file_.Update(Json{Volume("/shares/A/", 2)}, true, begin + milliseconds(999)),
            begin + milliseconds(1000));
  EXPECT_THAT(Content(), HasSubstr("\"files\":1"));
  EXPECT_FALSE(file_.Update(Json{Volume("/shares/A/", 2)}, true, begin + milliseconds(1000)));
  EXPECT_THAT(Content(), HasSubstr("\"files\":2"));
  // The end of the work is written at once.
  EXPECT_FALSE(file_.Update(Json{Volume("/shares/A/", 3)}, false, begin + milliseconds(1001)));
  EXPECT_THAT(Content(), HasSubstr("\"files\":3"));
}

TEST_F(StatusFileTest, AFailureIsLoggedOnceAndTheFileWrittenLater) {
  const Syslog log;
  fs::remove(DIRECTORY);
  file_.Update(Json::array(), false);
  file_.Update(Json::array(), false);
  EXPECT_THAT(log.Lines(), ElementsAre(Error("Cannot write /tmp/runtime/status.json: "
                                             "No such file or directory")));
  fs::create_directory(DIRECTORY);
  file_.Update(Json::array(), false);
  EXPECT_EQ(Content(), "{\"volumes\":[]}\n");
  fs::remove_all(DIRECTORY);
  file_.Update(Json{Volume("/shares/A/", 1)}, false);
  EXPECT_EQ(log.Lines().size(), 2U);
}

} // namespace

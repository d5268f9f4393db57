// Names and numbers of an untrusted database harm neither zophotos nor the terminal.

#include "Terminal.h"
#include "ZophotosTest.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <clocale>
#include <cstdlib>
#include <cwchar>

namespace orva::test {
namespace {

using nlohmann::json;
using ::testing::AllOf;
using ::testing::Each;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Le;
using ::testing::Not;

/// The number of columns of a text; -1 if it has a character that is not printable.
int Columns(const std::string& text) {
  std::wstring wide(text.size() + 1, L'\0');
  const std::size_t length = std::mbstowcs(wide.data(), text.c_str(), wide.size());
  return length == std::string::npos ? -1 : wcswidth(wide.c_str(), length);
}

class ZophotosTerminal : public ZophotosTest {
protected:
  void SetUp() override {
    ZophotosTest::SetUp();
    ASSERT_NE(nullptr, std::setlocale(LC_CTYPE, "C.UTF-8"));
    setenv("TERM", "xterm", 1);
    unsetenv("NO_COLOR");
    const Database copy = Copy();
    const auto add = [&copy](const std::string& name) {
      copy.Run("INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(2, "
               "'/shares/A/' || ? || '/', 1, '/shares/' || ? || '/')",
               {name, name});
      copy.Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) "
               "VALUES('/shares/' || ? || '/', 12345, 99999, 1700000000)",
               {name});
    };
    std::string combining;
    std::string wide;
    for (int i = 0; i < 60; ++i) {
      combining += "e\u0301";
      wide += "写";
    }
    for (const std::string& name :
         {combining, wide, wide + "x", "a" + combining + "b" + wide, std::string(100, 'l')}) {
      add(name);
    }
  }

  /// Runs zophotos on the copy, on a terminal, and removes the sequences that set and reset the
  /// colour of folders.
  static Lines OnTerminal(int columns, const Arguments& arguments) {
    Lines lines = Terminal(columns).Run(OnCopyArguments(arguments));
    for (std::string& line : lines) {
      for (const std::string sequence : {COLOR, RESET}) {
        if (const std::size_t begin = line.find(sequence); begin != std::string::npos) {
          line.erase(begin, sequence.size());
        }
      }
    }
    return lines;
  }

  static constexpr const char* COLOR = "\x1b[1;34m";
  static constexpr const char* RESET = "\x1b[0m";

  /// The widths of the lines.
  static std::vector<int> Widths(const Lines& lines) {
    std::vector<int> widths(lines.size());
    std::ranges::transform(lines, widths.begin(), Columns);
    return widths;
  }
};

TEST_F(ZophotosTerminal, TablesFitTheTerminal) {
  for (const int columns : {20, 40, 60, 80, 120, 200}) {
    SCOPED_TRACE(columns);
    const Lines list = OnTerminal(columns, {"ls", "-l", "A"});
    EXPECT_EQ(8U, list.size());
    EXPECT_THAT(Widths(list), Each(AllOf(Le(columns), testing::Gt(0))));
    Lines status = OnTerminal(columns, {"status"});
    EXPECT_EQ(columns < 80 ? 16U : 19U, status.size());
    EXPECT_EQ(columns >= 80, status.back().starts_with("FILES: "));
    status.erase(status.begin(), status.begin() + 5);
    std::erase(status, ""); // above the legend
    EXPECT_THAT(Widths(status), Each(AllOf(Le(columns), testing::Gt(0))));
  }
}

TEST_F(ZophotosTerminal, NamesAreShortenedBeforeNumbersAreCut) {
  const Lines status = OnTerminal(80, {"status"});
  ASSERT_EQ(19U, status.size());
  EXPECT_THAT(status[5], AllOf(HasSubstr("VOLUME"), HasSubstr("MERGED UP TO")));
  EXPECT_THAT(status[14],
              AllOf(HasSubstr("…"), HasSubstr("12345/99999"), HasSubstr("2023-11-14 22:13:20")));
  EXPECT_THAT(status[6], HasSubstr("/shares/A/ "));
}

TEST_F(ZophotosTerminal, BarsAreShownOnlyIfTheyFit) {
  EXPECT_THAT(OnTerminal(120, {"status"}).at(6), HasSubstr("██████████ 100 %"));
  EXPECT_THAT(OnTerminal(70, {"status"}).at(6), AllOf(Not(HasSubstr("█")), HasSubstr("100 %")));
}

TEST_F(ZophotosTerminal, TablesAreNotShortenedWithoutATerminal) {
  EXPECT_THAT(OnCopy({"ls", "-l", "A"}).output,
              AllOf(HasSubstr("  " + std::string(100, 'l') + "/\n"), Not(HasSubstr("…"))));
}

TEST_F(ZophotosTerminal, ColumnsAreAligned) {
  const Lines list = OnTerminal(80, {"ls", "-l", "A"});
  const auto name = Columns(list.at(0).substr(0, list[0].find("NAME")));
  for (const std::string& line : {list.at(1), list.at(2), list.at(3), list.at(6)}) {
    // The name is the last column, after two spaces.
    const std::size_t begin = line.rfind("  ") + 2;
    EXPECT_EQ(name, Columns(line.substr(0, begin))) << line;
  }
}

TEST_F(ZophotosTerminal, NamesWriteNoControlCharacters) {
  const Database copy(COPY);
  // Escape sequences of 7 and 8 bits, line ends, delete, invisible characters and half a character.
  for (const char* const bytes : {"1b5d303b781b5c", "c29b326a", "0d0a0908", "7f", "e280a8",
                                  "e280ae", "d89c", "efbbbf", "f3a08181", "e58699c3"}) {
    copy.Run("INSERT INTO Folders(parent_folder_id, name, modified_date, volume) SELECT 2, "
             "'/shares/A/' || CAST(x'" +
             std::string(bytes) + "' AS TEXT) || '/', 1, CAST(x'" + bytes + "' AS TEXT)");
    copy.Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
             "999, CAST(x'" +
             std::string(bytes) + "' AS TEXT), 1, CAST(x'" + bytes + "' AS TEXT), 1");
    copy.Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) "
             "VALUES(CAST(x'" +
             std::string(bytes) + "' AS TEXT), 1, 1, 1)");
    copy.Run("UPDATE Status SET mc_version = CAST(x'" + std::string(bytes) + "' AS TEXT)");
  }
  for (const Arguments& arguments :
       {Arguments{"status"}, Arguments{"ls", "A"}, Arguments{"ls", "-l", "A"}, Arguments{"tree"},
        Arguments{"find", "*"}, Arguments{"check"}, Arguments{}, Arguments{"ls", "\x1b[2J\xff"},
        Arguments{"tree", "\u009b2J"}}) {
    const Lines lines = OnTerminal(200, arguments);
    EXPECT_THAT(lines, Not(IsEmpty()));
    for (const std::string& line : lines) {
      EXPECT_NE(-1, Columns(line)) << ::testing::PrintToString(arguments) << line;
      const std::vector<std::string> unseen{
          {'\xe2', '\x80', '\xae'}, {'\xd8', '\x9c'}, {'\xef', '\xbb', '\xbf'}};
      for (const std::string& invisible : unseen) {
        EXPECT_THAT(line, Not(HasSubstr(invisible)));
      }
    }
  }
}

TEST_F(ZophotosTerminal, FoldersHaveAColor) {
  Copy();
  const std::string pictures = std::string(COLOR) + "Pictures/" + RESET;
  const auto run = [](const Arguments& arguments) {
    return Terminal(80).Run(OnCopyArguments(arguments));
  };
  EXPECT_EQ((Lines{pictures, "top.jpg"}), run({"ls", "A"}));
  EXPECT_THAT(run({"ls", "-l", "A"}).at(1), testing::EndsWith("  " + pictures));
  EXPECT_THAT(run({"ls", "-l", "A"}).at(2), testing::EndsWith("  top.jpg"));
  EXPECT_EQ("└── " + pictures + "  2 files", run({"tree", "-L", "1", "A"}).at(1));
  EXPECT_EQ((Lines{std::string(COLOR) + "/shares/A/Pictures/" + RESET}), run({"find", "Pict*"}));
  EXPECT_EQ(pictures + "\ntop.jpg\n", OnCopy({"--color", "always", "ls", "A"}).output);
}

TEST_F(ZophotosTerminal, ColorsAreOnlyForTerminalsThatShowThem) {
  Copy();
  const Lines plain{"Pictures/", "top.jpg"};
  const auto run = [](const Arguments& arguments) {
    return Terminal(80).Run(OnCopyArguments(arguments));
  };
  EXPECT_EQ(plain, run({"ls", "A", "--color", "never"}));
  EXPECT_EQ("Pictures/\ntop.jpg\n", OnCopy({"ls", "A"}).output);
  setenv("NO_COLOR", "1", 1);
  EXPECT_EQ(plain, run({"ls", "A"}));
  unsetenv("NO_COLOR");
  setenv("TERM", "dumb", 1);
  EXPECT_EQ(plain, run({"ls", "A"}));
  unsetenv("TERM");
  EXPECT_EQ(plain, run({"ls", "A"}));
}

TEST_F(ZophotosTerminal, ColorsEscapeNamesAlsoInAPipe) {
  AddRows(Copy(), "'/shares/A/' || CAST(x'1b' AS TEXT) || '/'");
  EXPECT_THAT(OnCopy({"find", "--color", "always", "*"}).output, HasSubstr("/shares/A/\\x1b/"));
}

class ZophotosHostile : public ZophotosTest {
protected:
  static void AddFolder(const std::string& path, const std::string& file) {
    const Database copy(COPY);
    copy.Run("INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(-1, ?, 1, "
             "'/shares/A/')",
             {path});
    copy.Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
             "max(folder_id), ?, 1, '/shares/A/', 1 FROM Folders",
             {file});
  }

  /// Every command ends with status 0 or 1 and without a message, and all JSON is valid.
  static void ExpectNoHarm() {
    for (const Arguments& arguments :
         {Arguments{"status"}, Arguments{"ls"}, Arguments{"ls", "-l"}, Arguments{"ls", "A"},
          Arguments{"ls", "/"}, Arguments{"tree"}, Arguments{"tree", "/"}, Arguments{"find", "*"},
          Arguments{"find", "-i", "*/*a*"}, Arguments{"find", "-0", "a"}, Arguments{"check"},
          Arguments{"export", "--csv"}}) {
      const Outcome outcome = OnCopy(arguments);
      EXPECT_THAT(outcome.status, testing::AnyOf(0, 1)) << ::testing::PrintToString(arguments);
      EXPECT_EQ("", outcome.error) << ::testing::PrintToString(arguments);
      if (arguments[0] != "find" || arguments[1] != "-0") {
        EXPECT_NE("", outcome.output) << ::testing::PrintToString(arguments);
      }
    }
    for (const Arguments& arguments :
         {Arguments{"status"}, Arguments{"ls", "A"}, Arguments{"tree"}, Arguments{"find", "*"},
          Arguments{"check"}, Arguments{"export"}}) {
      Arguments inJson{"--json"};
      inJson.insert(inJson.end(), arguments.begin(), arguments.end());
      const Lines lines = SplitLines(OnCopy(inJson).output);
      EXPECT_THAT(lines, Not(IsEmpty())) << arguments[0];
      for (const std::string& line : lines) {
        ASSERT_TRUE(json::accept(line)) << arguments[0];
      }
    }
    Program watch(ZophotosCommand(OnCopyArguments({"watch", "--json"})));
    EXPECT_THAT(watch.ReadLine(), HasSubstr(R"("event":"opened")"));
  }
};

TEST_F(ZophotosHostile, PathsWithoutATrailingSeparatorDoNoHarm) {
  Copy();
  for (const char* const path : {"", "/", "//", "x", "/shares", "/shares/A", "/shares/A/Pictures",
                                 "/shares/A//", "/shares/A//x", "/shares/A/Pictures/Summerhouse"}) {
    AddFolder(path, "a");
  }
  AddFolder("/shares/A/empty/", "");
  ExpectNoHarm();
}

TEST_F(ZophotosHostile, APathOfAMillionBytesDoesNoHarm) {
  Copy();
  AddFolder("/shares/A/" + std::string(1'000'000, 'a') + "/", std::string(1'000'000, 'b'));
  AddFolder("/shares/A/" + std::string(1'000'000, '\xff') + "/", std::string(1'000'000, '*'));
  ExpectNoHarm();
}

TEST_F(ZophotosHostile, APathOfThousandsOfFoldersDoesNoHarm) {
  Copy();
  std::string path = "/shares/A/";
  for (int i = 0; i < 3000; ++i) {
    path += "a/";
  }
  AddFolder(path, "a");
  ExpectNoHarm();
  const std::string tree = OnCopy({"tree", "--json"}).output;
  EXPECT_EQ(3008, std::ranges::count(tree, '\n'));
}

TEST_F(ZophotosHostile, NumbersOutOfRangeDoNoHarm) {
  for (const char* const number :
       {"9223372036854775807", "-9223372036854775808", "-1", "253402300800", "-62135596801",
        "67768036191676800", "1e300", "x"}) {
    SCOPED_TRACE(number);
    const Database copy = Copy();
    for (const char* const sql :
         {"UPDATE Files SET modified_date = ?1, created_date = ?1",
          "UPDATE Folders SET modified_date = ?1", "UPDATE Status SET mdate = ?1, etype = ?1",
          "UPDATE Statistics SET photos_xcoded = ?1, photos_total = ?1, last_updated_time = ?1"}) {
      copy.Run(sql, {number});
    }
    ExpectNoHarm();
    copy.Run("UPDATE Statistics SET photos_xcoded = 1, photos_total = ?", {number});
    ExpectNoHarm();
    copy.Run("UPDATE Statistics SET photos_xcoded = ?, photos_total = 1", {number});
    ExpectNoHarm();
  }
}

TEST_F(ZophotosHostile, LargestAndSmallestIdsDoNoHarm) {
  const Database copy = Copy();
  copy.Run("UPDATE Files SET folder_id = 9223372036854775807, file_id = 9223372036854775807 WHERE "
           "name = 'top.jpg'");
  copy.Run("UPDATE Folders SET folder_id = -9223372036854775808 WHERE name = '/shares/B/'");
  ExpectNoHarm();
}

TEST_F(ZophotosHostile, DecreasingIdsAddNothing) {
  const Database copy = Copy();
  Program watch(ZophotosCommand(OnCopyArguments({"watch"})));
  EXPECT_THAT(watch.ReadLine(), HasSubstr("watching"));
  copy.Run("UPDATE sqlite_sequence SET seq = 0");
  EXPECT_THAT(watch.ReadLine(),
              HasSubstr("  the daemon wrote to the database, but added and removed nothing"));
}

TEST_F(ZophotosHostile, BlobsAsNamesDoNoHarm) {
  const Database copy = Copy();
  copy.Run("UPDATE Folders SET name = zeroblob(100), volume = x'ff00' WHERE name = '/shares/B/'");
  copy.Run("UPDATE Files SET name = zeroblob(3), volume = x'' WHERE name = 'top.jpg'");
  copy.Run("UPDATE Statistics SET volume = zeroblob(5) WHERE volume = '/shares/B/'");
  ExpectNoHarm();
}

} // namespace
} // namespace orva::test

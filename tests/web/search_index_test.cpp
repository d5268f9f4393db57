// The words of names, and the expressions that search for them.

#include "zophotos-web/SearchIndex.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <set>

namespace orva::test {
namespace {

using ::testing::IsEmpty;
using ::testing::Optional;
using web::AppendWords;
using web::FrequentPrefixes;

std::string Words(const std::string& text) {
  std::string words;
  AppendWords(text, words);
  return words;
}

std::string Marks(const FrequentPrefixes& frequent, const std::string& words) {
  std::string marks;
  frequent.AppendMarks(words, marks);
  return marks;
}

/// The expression for `words`, if the index has these ones.
std::optional<std::string> Expression(const std::string& words, const std::set<std::string>& index,
                                      const FrequentPrefixes& frequent = {}) {
  return web::MatchExpression({.words = words, .volume = std::nullopt, .folder = std::nullopt}, {},
                              frequent, [&](const std::string& from) {
                                const auto found = index.lower_bound(from);
                                return found == index.end() ? std::nullopt : std::optional(*found);
                              });
}

TEST(SearchIndex, LettersAndDigitsAreSeparateWordsInLowerCase) {
  EXPECT_EQ(Words("IMG_20260102.JPG"), "img 20260102 jpg ");
  EXPECT_EQ(Words("Summer 2019/DSC0001.jpeg"), "summer 2019 dsc 0001 jpeg ");
  EXPECT_EQ(Words("--- ... ___"), "");
  EXPECT_EQ(Words(""), "");
}

TEST(SearchIndex, AccentsAndCaseDoNotCountInAnyForm) {
  EXPECT_EQ(Words("Été"), "ete ");
  EXPECT_EQ(Words("E\u0301te\u0301"), "ete ");
  EXPECT_EQ(Words("STRASSE Straße"), "strasse strasse ");
  EXPECT_EQ(Words("ΑΘΗΝΑ αθήνα"), "αθηνα αθηνα ");
  EXPECT_EQ(Words("\uFF11\uFF12"), "12 ");
}

TEST(SearchIndex, EachIdeographIsAWord) {
  EXPECT_EQ(Words("東京2019"), "東 京 2019 ");
}

TEST(SearchIndex, BytesThatAreNotUtf8SeparateWords) {
  EXPECT_EQ(Words("a\xFF"
                  "b\xC3(é\x80"),
            "a b e ");
}

TEST(SearchIndex, ControlCharactersAndMarksSeparateWords) {
  EXPECT_EQ(Words("a\nb\x01"
                  "c!d#e@f\"g"),
            "a b c d e f g ");
  EXPECT_EQ(Words("a\u202Eb\u202C\u200Bc"),
            "abc "); // invisible characters are no part of a word
}

TEST(SearchIndex, TheEndOfALongWordIsCutOffBetweenCharacters) {
  EXPECT_EQ(Words(std::string(100, 'a')), std::string(64, 'a') + ' ');
  std::string greek;
  for (int i = 0; i < 50; ++i) {
    greek += "α";
  }
  EXPECT_EQ(Words("x" + greek), "x" + greek.substr(0, 62) + ' ');
}

TEST(SearchIndex, WordsHaveTheMarksOfTheirFrequentPrefixes) {
  const FrequentPrefixes frequent({"0", "001", "im"});
  EXPECT_EQ(Marks(frequent, "img 0012 jpg 0 1 "), "!im !0 !001 !0 ");
  EXPECT_EQ(Marks({}, "img 0012 "), "");
}

TEST(SearchIndex, AWordWithoutMatchesFindsNothing) {
  EXPECT_EQ(Expression("zzz", {"img", "jpg"}), std::nullopt);
  EXPECT_EQ(Expression("img zzz", {"img", "jpg"}), std::nullopt);
}

TEST(SearchIndex, FewWordsWithAPrefixAreNamed) {
  EXPECT_THAT(Expression("i", {"image", "img", "jpg"}),
              Optional(std::string("(\"image\" OR \"img\")")));
}

TEST(SearchIndex, ManyWordsWithAPrefixAreLeftToTheIndex) {
  std::set<std::string> index;
  for (int i = 0; i < 100; ++i) {
    index.insert("2" + std::to_string(i));
  }
  EXPECT_THAT(Expression("2", index), Optional(std::string("(\"2\" *)")));
}

TEST(SearchIndex, AFrequentPrefixIsSearchedForByItsMark) {
  std::set<std::string> index{"002"};
  for (int i = 1000; i < 2000; ++i) {
    index.insert("0" + std::to_string(i));
  }
  const FrequentPrefixes frequent({"0", "01"});
  EXPECT_THAT(Expression("0", index, frequent), Optional(std::string("(\"!0\")")));
  const FrequentPrefixes longer({"01"});
  EXPECT_THAT(Expression("0", index, longer), Optional(std::string("(\"002\" OR \"!01\")")));
}

TEST(SearchIndex, ATextIsNeverSyntax) {
  const std::set<std::string> index{"a", "and", "b", "near", "not", "or", "words"};
  EXPECT_THAT(Expression("\"a\" OR b*", index),
              Optional(std::string("(\"a\" OR \"and\") AND (\"b\") AND (\"or\")")));
  EXPECT_THAT(
      Expression("NOT {words}:near(b, 3", {"3", "b", "near", "not", "words"}),
      Optional(std::string("(\"3\") AND (\"b\") AND (\"near\") AND (\"not\") AND (\"words\")")));
  EXPECT_THAT(Expression("#1 @2 !3", {"1", "2", "3"}),
              Optional(std::string("(\"1\") AND (\"2\") AND (\"3\")")));
}

TEST(SearchIndex, ATextWithoutWordsFindsNothing) {
  EXPECT_EQ(Expression(" - \"*\" ", {"a"}), std::nullopt);
  EXPECT_EQ(Expression("\xF0\x9F\x98\x80", {"a"}), std::nullopt);
  EXPECT_THAT(Expression("", {"a"}), Optional(std::string()));
  EXPECT_THAT(Expression(" \t ", {"a"}), Optional(std::string()));
}

TEST(SearchIndex, AWordThatAnotherBeginsWithAddsNothing) {
  EXPECT_THAT(Expression("im img i", {"img"}), Optional(std::string("(\"img\")")));
}

TEST(SearchIndex, AllWordsOfALongTextCount) {
  std::string text;
  std::set<std::string> index;
  for (char c = 'a'; c <= 'z'; ++c) {
    text += std::string(1, c) + ' ';
    index.insert(std::string(1, c));
  }
  const auto expression = Expression(text + text, index);
  ASSERT_TRUE(expression);
  EXPECT_NE(expression->find("\"i\""), std::string::npos);
  EXPECT_EQ(expression->find("\"z\""), expression->rfind("\"z\""));
  EXPECT_EQ(Expression(std::string(2000, ' ') + "a", {}), std::nullopt);
}

TEST(SearchIndex, ASampleFindsThePrefixesThatManyPhotosHave) {
  constexpr int photos = 40'000;
  web::PrefixSample sample(photos);
  for (int i = 0; i < photos; ++i) {
    if (sample.Next()) {
      sample.Add("img " + std::to_string(1'000'000 + i) +
                 (i % 100 == 0 ? " x" + std::to_string(i) : "") + " #1 @" +
                 std::to_string(i % 1000) + " ");
    }
  }
  // All begin with 10; four million and so on are no numbers here. "img" is a single word.
  EXPECT_THAT(sample.Frequent(), ::testing::Contains("10"));
  for (const std::string& prefix : sample.Frequent()) {
    EXPECT_TRUE(prefix.starts_with("10")) << prefix;
  }
}

TEST(SearchIndex, ASampleFindsPrefixesThatReturnInAPeriod) {
  constexpr int photos = 1'000'000;
  web::PrefixSample sample(photos);
  for (int i = 0; i < photos; ++i) {
    if (sample.Next()) {
      sample.Add(std::to_string(1000 + i % 1000)); // as cameras number photos, folder by folder
    }
  }
  EXPECT_THAT(sample.Frequent(), ::testing::IsSupersetOf({"10", "102", "155", "199"}));
}

TEST(SearchIndex, FewPhotosHaveNoFrequentPrefixes) {
  web::PrefixSample sample(1000);
  for (int i = 0; i < 1000; ++i) {
    EXPECT_TRUE(sample.Next());
    sample.Add(std::to_string(i));
  }
  EXPECT_THAT(sample.Frequent(), IsEmpty());
}

} // namespace
} // namespace orva::test

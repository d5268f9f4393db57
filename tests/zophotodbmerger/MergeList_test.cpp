#include "MergeList.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <string>
#include <vector>

namespace orva::test {
namespace {

using namespace std::string_literals;
using dbmerger::MergeItem;
using dbmerger::MergeList;
using ::testing::ElementsAre;

std::vector<std::string> Paths(const MergeList& list) {
  std::vector<std::string> paths;
  for (const MergeItem& item : list.Items()) {
    paths.emplace_back(item.Path());
  }
  return paths;
}

TEST(MergeListTest, JoinsTheBaseAndThePathAndKeepsTheName) {
  MergeList list;
  list.Add("/shares/A/", "b/c.jpg", "c.jpg");
  list.Add("/shares/A/", "b/c.jpg", "other");
  list.Add("/shares/A/", "c", "A/c");
  list.Add("", "", "");
  list.Add("", "", "name");
  list.Add("/", "\0\xff"s, "\0\xff"s);
  std::vector<std::string> names;
  for (const MergeItem& item : list.Items()) {
    names.emplace_back(item.Name());
  }
  EXPECT_THAT(Paths(list), ElementsAre("/shares/A/b/c.jpg", "/shares/A/b/c.jpg", "/shares/A/c", "",
                                       "", "/\0\xff"s));
  EXPECT_THAT(names, ElementsAre("c.jpg", "other", "A/c", "", "name", "\0\xff"s));
  EXPECT_EQ(6U, list.Size());
}

TEST(MergeListTest, TextsDoNotChangeWhenTheirSourcesDo) {
  MergeList list;
  for (int number = 0; number < 100'000; ++number) {
    const std::string name = std::to_string(number);
    list.Add("/shares/A/", name, name);
  }
  const MergeList moved = std::move(list);
  ASSERT_EQ(100'000U, moved.Size());
  for (int number = 0; number < 100'000; ++number) {
    ASSERT_EQ("/shares/A/" + std::to_string(number),
              moved.Items()[static_cast<std::size_t>(number)].Path());
  }
}

TEST(MergeListTest, PathsAreSortedAsUnsignedBytes) {
  MergeList list;
  for (const std::string& path : {"\xff"s, "b"s, "a/b"s, "a\0"s, ""s, "a"s, "a/"s, "\x7f"s, "B"s}) {
    list.Add("", path, "");
  }
  list.Sort();
  EXPECT_THAT(Paths(list), ElementsAre("", "B", "a", "a\0"s, "a/", "a/b", "b", "\x7f", "\xff"));
}

/// Sorts rows of random paths, in runs of random length, and compares with a stable sort.
void CompareWithStableSort(unsigned seed) {
  std::mt19937 random(seed);
  const auto below = [&](unsigned bound) {
    return std::uniform_int_distribution<unsigned>(0, bound - 1)(random);
  };
  const unsigned paths = 1 + below(50);
  std::vector<std::pair<std::string, int>> expected;
  MergeList list;
  std::vector<std::string> run;
  for (unsigned runs = below(12); runs > 0; --runs) {
    run.clear();
    for (unsigned size = below(10); size > 0; --size) {
      run.push_back("f" + std::to_string(below(paths)) + (below(2) == 0 ? "/" : "/x"));
    }
    if (below(4) != 0) {
      std::ranges::sort(run);
    }
    for (const std::string& path : run) {
      const int number = static_cast<int>(expected.size());
      list.Add("/", path, "").status = number;
      expected.emplace_back("/" + path, number);
    }
  }
  std::ranges::stable_sort(expected, {}, &std::pair<std::string, int>::first);
  std::vector<std::pair<std::string, int>> sorted;
  for (int time = 0; time < 2; ++time) { // sorting again changes nothing
    list.Sort();
    sorted.clear();
    for (const MergeItem& item : list.Items()) {
      sorted.emplace_back(item.Path(), item.status);
    }
    ASSERT_EQ(expected, sorted) << "seed " << seed;
  }
}

TEST(MergeListTest, SortIsStableForAnyRuns) {
  for (unsigned seed = 1; seed <= 3'000 && !testing::Test::HasFailure(); ++seed) {
    CompareWithStableSort(seed);
  }
}

} // namespace
} // namespace orva::test

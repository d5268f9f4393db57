#include "Element.h"

#include "orvautil/OwnerList.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <vector>

namespace orva::util {
namespace {

using test::Element;
using test::Named;
using test::Throwing;
using testing::ElementsAre;
using testing::IsEmpty;

static_assert(!std::is_copy_constructible_v<OwnerList<Element>>);
static_assert(!std::is_copy_assignable_v<OwnerList<Element>>);

TEST(OwnerList, DeletesItsElementsFirstToLastThroughTheirBase) {
  std::vector<std::string> deleted;
  {
    OwnerList<Element> owner;
    owner.push_back(std::make_unique<Named>(deleted, "first"));
    owner.push_back(std::make_unique<Named>(deleted, "second"));
    owner.push_back(std::make_unique<Named>(deleted, "third"));
    EXPECT_EQ(owner.size(), 3U);
    EXPECT_THAT(deleted, IsEmpty());
  }
  EXPECT_THAT(deleted, ElementsAre("first", "second", "third"));
}

TEST(OwnerList, NullElementsArePassedOver) {
  std::vector<std::string> deleted;
  {
    OwnerList<Element> owner;
    owner.push_back(nullptr);
    owner.push_back(std::make_unique<Named>(deleted, "only"));
    owner.push_back(nullptr);
    EXPECT_EQ(owner.size(), 3U);
    EXPECT_EQ(owner.front(), nullptr);
  }
  EXPECT_THAT(deleted, ElementsAre("only"));
}

TEST(OwnerList, AThrowingElementDoesNotKeepTheOthersAndTheFirstExceptionContinues) {
  std::vector<std::string> deleted;
  const auto useOwner = [&deleted] {
    OwnerList<Element> owner;
    owner.push_back(std::make_unique<Named>(deleted, "a"));
    owner.push_back(std::make_unique<Throwing>(deleted, "b"));
    owner.push_back(std::make_unique<Throwing>(deleted, "c"));
    owner.push_back(std::make_unique<Named>(deleted, "d"));
  };
  try {
    useOwner();
    FAIL() << "the exception was swallowed";
  } catch (const std::runtime_error& exception) {
    EXPECT_STREQ(exception.what(), "b");
  }
  EXPECT_THAT(deleted, ElementsAre("a", "b", "c", "d"));
}

TEST(OwnerList, AnEmptyOneIsHarmless) {
  const OwnerList<Element> owner;
  EXPECT_TRUE(owner.empty());
  EXPECT_EQ(owner.begin(), owner.end());
}
} // namespace
} // namespace orva::util

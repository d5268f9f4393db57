#include "Element.h"

#include "orvautil/OwnerList.h"
#include "orvautil/OwnerVector.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

namespace orva::util {
namespace {

using test::Element;
using test::Named;
using test::Throwing;
using testing::ElementsAre;
using testing::IsEmpty;

/// What both containers of owned pointers do.
template <typename Container>
class OwnerContainerTest : public testing::Test {
  static_assert(!std::is_copy_constructible_v<Container>);
  static_assert(!std::is_copy_assignable_v<Container>);
};

struct ContainerName {
  template <typename Container>
  static std::string GetName(int /*index*/) {
    return std::is_same_v<Container, OwnerList<Element>> ? "OwnerList" : "OwnerVector";
  }
};

using Containers = testing::Types<OwnerList<Element>, OwnerVector<Element>>;
TYPED_TEST_SUITE(OwnerContainerTest, Containers, ContainerName);

TYPED_TEST(OwnerContainerTest, DeletesItsElementsFirstToLastThroughTheirBase) {
  std::vector<std::string> deleted;
  {
    TypeParam owner;
    owner.push_back(std::make_unique<Named>(deleted, "first"));
    owner.push_back(std::make_unique<Named>(deleted, "second"));
    owner.push_back(std::make_unique<Named>(deleted, "third"));
    EXPECT_EQ(owner.size(), 3U);
    EXPECT_THAT(deleted, IsEmpty());
  }
  EXPECT_THAT(deleted, ElementsAre("first", "second", "third"));
}

TYPED_TEST(OwnerContainerTest, NullElementsAreAllowed) {
  std::vector<std::string> deleted;
  {
    TypeParam owner;
    owner.push_back(nullptr);
    owner.push_back(std::make_unique<Named>(deleted, "only"));
    owner.push_back(nullptr);
    EXPECT_EQ(owner.size(), 3U);
    EXPECT_EQ(owner.front(), nullptr);
  }
  EXPECT_THAT(deleted, ElementsAre("only"));
}

TYPED_TEST(OwnerContainerTest, AThrowingElementDoesNotKeepTheOthersAndTheFirstExceptionIsThrown) {
  std::vector<std::string> deleted;
  const auto useOwner = [&deleted] {
    TypeParam owner;
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

TYPED_TEST(OwnerContainerTest, MayBeEmpty) {
  const TypeParam owner;
  EXPECT_TRUE(owner.empty());
  EXPECT_EQ(owner.begin(), owner.end());
}

/// Takes the elements out of an owner that stays with the caller.
OwnerVector<Element> TakeFrom(OwnerVector<Element>& source) {
  return {std::move(source)};
}

TEST(OwnerVector, MovingTransfersTheElements) {
  std::vector<std::string> deleted;
  OwnerVector<Element> source;
  source.push_back(std::make_unique<Named>(deleted, "only"));
  Element* const element = source.front();
  {
    const OwnerVector<Element> target = TakeFrom(source);
    EXPECT_THAT(target.Elements(), ElementsAre(element));
    EXPECT_TRUE(source.empty());
    EXPECT_THAT(deleted, IsEmpty());
  }
  EXPECT_THAT(deleted, ElementsAre("only"));
}

TEST(OwnerVector, ElementsMayBeReorderedInPlace) {
  std::vector<std::string> deleted;
  {
    OwnerVector<Named> owner;
    owner.push_back(std::make_unique<Named>(deleted, "b"));
    owner.push_back(std::make_unique<Named>(deleted, "c"));
    owner.push_back(std::make_unique<Named>(deleted, "a"));
    std::sort(owner.begin(), owner.end(),
              [](const Named* left, const Named* right) { return left->name < right->name; });
  }
  EXPECT_THAT(deleted, ElementsAre("a", "b", "c"));
}

} // namespace
} // namespace orva::util

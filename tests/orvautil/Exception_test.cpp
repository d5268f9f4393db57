#include "orvautil/Exception.h"

#include <gtest/gtest.h>

namespace orva::util {
namespace {

TEST(Exception, IsCaughtAsAStandardExceptionWithItsMessage) {
  try {
    throw Exception("the message", "Place.cpp", 42);
  } catch (const std::exception& caught) {
    EXPECT_STREQ(caught.what(), "the message");
  }
}

TEST(Exception, NamesTheSourceLineThatThrew) {
  const Exception exception("the message", "Place.cpp", 42);
  EXPECT_STREQ(exception.File(), "Place.cpp");
  EXPECT_EQ(exception.Line(), 42U);
}

TEST(Exception, NamesItsOwnSourceLineByDefault) {
  const Exception exception("the message");
  EXPECT_STREQ(exception.File(), __FILE__);
  EXPECT_EQ(exception.Line(), __LINE__ - 2U);
}

} // namespace
} // namespace orva::util

#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <gtest/gtest.h>

#include <cwchar>
#include <string>

namespace orva::util {
namespace {

TEST(FormatString, WritesWhatPrintfWrites) {
  EXPECT_EQ(FormatString("%s:%d: %5.1f %lld%%", "name", -7, 2.25, 1LL << 40),
            "name:-7:   2.2 1099511627776%");
}

TEST(FormatString, TheTextMayBeEmpty) {
  EXPECT_EQ(FormatString("%s", ""), "");
}

TEST(FormatString, TheTextMayBeLong) {
  const std::string text(1'000'000, 'x');
  EXPECT_EQ(FormatString("<%s>", text.c_str()), '<' + text + '>');
}

TEST(FormatString, ZeroBytesOfCharactersAreKept) {
  EXPECT_EQ(FormatString("a%cb", '\0'), std::string("a\0b", 3));
}

TEST(FormatString, AnArgumentThatCannotBeWrittenIsAnException) {
  // No such character in the C locale.
  EXPECT_THROW(FormatString("%lc", static_cast<std::wint_t>(0x20ac)), Exception);
}

} // namespace
} // namespace orva::util

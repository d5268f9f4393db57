#include "orvautil/Decodestring.h"

#include <gtest/gtest.h>

namespace orva::util {
namespace {

TEST(Decodestring, PlainTextIsKept) {
  EXPECT_EQ(Decodestring(""), "");
  EXPECT_EQ(Decodestring("/shares/Photos/"), "/shares/Photos/");
}

TEST(Decodestring, EscapesOfEitherCaseAreDecoded) {
  EXPECT_EQ(Decodestring("/shares/My%20Photos"), "/shares/My Photos");
  EXPECT_EQ(Decodestring("%2f%2F%c3%A9"), "//\xc3\xa9");
  EXPECT_EQ(Decodestring("%01%fF"), "\x01\xff");
}

TEST(Decodestring, AnEscapeIsDecodedOnce) {
  EXPECT_EQ(Decodestring("%2541"), "%41");
  EXPECT_EQ(Decodestring("100%25"), "100%");
}

TEST(Decodestring, PlusIsAnOrdinaryCharacter) {
  EXPECT_EQ(Decodestring("a+b%2Bc"), "a+b+c");
}

TEST(Decodestring, MalformedEscapesAreKept) {
  for (const std::string text : {"%", "%4", "a%", "a%4", "%zz", "%4g", "%g4", "% 1", "%+1", "%-1",
                                 "%0x", "%%", "%\xc3\xa9"}) {
    EXPECT_EQ(Decodestring(text), text);
  }
}

TEST(Decodestring, WhatFollowsAMalformedEscapeIsStillDecoded) {
  EXPECT_EQ(Decodestring("%%41%4%42"), "%A%4B");
}

TEST(Decodestring, TheEscapeOfTheZeroByteIsMalformed) {
  EXPECT_EQ(Decodestring("a%00b"), "a%00b");
}

TEST(Decodestring, BytesOutsideAsciiAreKept) {
  EXPECT_EQ(Decodestring("\xc3\xa9\xff"), "\xc3\xa9\xff");
}

} // namespace
} // namespace orva::util

// What the server reads from requests, and which hosts it serves.

#include "zophotos-web/AllowedHosts.h"
#include "zophotos-web/FileName.h"
#include "zophotos-web/Query.h"
#include "zophotos-web/Request.h"
#include "zophotos-web/SocketAddress.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <ctime>
#include <string>

namespace orva::web {
namespace {

using ::testing::ElementsAre;
using ::testing::Pair;

TEST(WebTarget, HasAPathAndDecodedParameters) {
  const auto target = ParseTarget("/search?words=a+b%2Fc%c3%A9&volume=&x");
  ASSERT_TRUE(target);
  EXPECT_EQ("/search", target->path);
  EXPECT_THAT(target->parameters,
              ElementsAre(Pair("words", "a b/c\xc3\xa9"), Pair("volume", ""), Pair("x", "")));
  EXPECT_EQ("a b/c\xc3\xa9", *target->Find("words"));
  EXPECT_EQ(nullptr, target->Find("missing"));
}

TEST(WebTarget, KeepsEscapesInThePath) {
  EXPECT_EQ("/photos/%2e%2e/1", ParseTarget("/photos/%2e%2e/1")->path);
}

TEST(WebTarget, IsRefusedIfMalformed) {
  for (const char* const text : {"", "x", "*", "http://localhost/", "/a b", "/a\tb", "/a\x7f",
                                 "/\xc3\xa9", "/?a=%", "/?a=%4", "/?a=%zz", "/?%=a", "/?a=1&a=2",
                                 "/?a=1&b=2&%61=3", "/?a&b&c&d&e&f&g&h&i&j&k&l&m&n&o&p&q"}) {
    EXPECT_FALSE(ParseTarget(text)) << text;
  }
}

TEST(WebNumber, IsReadOnlyAsItIsPrinted) {
  EXPECT_EQ(0, ParseNumber("0"));
  EXPECT_EQ(-12, ParseNumber("-12"));
  EXPECT_EQ(9223372036854775807, ParseNumber("9223372036854775807"));
  for (const char* const text : {"", "-", "+1", "01", "-0", "1 ", " 1", "0x1", "1/", "1.0",
                                 "9223372036854775808", "..", "99999999999999999999999"}) {
    EXPECT_FALSE(ParseNumber(text)) << text;
  }
}

TEST(WebRange, IsOnePartOfTheFile) {
  const auto expect = [](const char* text, std::uint64_t first, std::uint64_t count) {
    const auto range = ParseRange(text, 100);
    ASSERT_TRUE(range) << text;
    EXPECT_EQ(count, range->count) << text;
    EXPECT_EQ(first, range->first) << text;
  };
  expect("bytes=0-9", 0, 10);
  expect("bytes=90-", 90, 10);
  expect("bytes=90-1000", 90, 10);
  expect("bytes=-10", 90, 10);
  expect("bytes=-1000", 0, 100);
  expect("bytes=100-", 0, 0);
  expect("bytes=100-200", 0, 0);
  expect("bytes=-0", 100, 0);
  for (const char* const text :
       {"", "0-9", "bytes=", "bytes=-", "bytes=9-0", "bytes=0-1,3-4", "bytes=a-b", "bytes=0-9x",
        "bytes= 0-9", "items=0-9", "bytes=-1-", "bytes=99999999999999999999-"}) {
    EXPECT_FALSE(ParseRange(text, 100)) << text;
  }
  EXPECT_EQ(0U, ParseRange("bytes=0-", 0)->count);
}

TEST(WebEntityTag, MatchesAnyOfAList) {
  EXPECT_TRUE(Matches("\"a\"", "\"a\""));
  EXPECT_TRUE(Matches("\"b\", W/\"a\"", "\"a\""));
  EXPECT_TRUE(Matches("*", "\"a\""));
  EXPECT_FALSE(Matches("", "\"a\""));
  EXPECT_FALSE(Matches("a", "\"a\""));
}

TEST(WebHosts, AreTheLoopbackAndTheNamesOfTheCommandLine) {
  const AllowedHosts hosts({"photos.example.org", "192.0.2.1", "2001:db8::1"});
  for (const char* const header : {"localhost", "localhost:8480", "LOCALHOST:1", "127.0.0.1",
                                   "127.0.0.1:8480", "[::1]", "[::1]:8480", "photos.example.org",
                                   "Photos.Example.org:443", "192.0.2.1:80", "[2001:db8::1]:80"}) {
    EXPECT_TRUE(hosts.Contains(header)) << header;
  }
  for (const char* const header :
       {"", ":", ":80", "localhost.", "localhost.example.org", "example.org", "127.0.0.2",
        "localhost:", "localhost:x", "localhost:123456", "localhost@example.org", "localhost, a",
        "::1", "[::1", "[localhost]", "[]", " localhost", "localhost/", "a localhost"}) {
    if (std::string(header) != "localhost:") { // an empty port is the standard one
      EXPECT_FALSE(hosts.Contains(header)) << header;
    }
  }
}

TEST(WebAddress, IsLoopbackOnlyIfOtherMachinesCannotReachIt) {
  for (const char* const text :
       {"127.0.0.1:80", "127.1.2.3:80", "[::1]:80", "localhost:80", "[::ffff:127.0.0.1]:80"}) {
    ASSERT_TRUE(SocketAddress::Parse(text)) << text;
    EXPECT_TRUE(SocketAddress::Parse(text)->IsLoopback()) << text;
  }
  for (const char* const text :
       {"0.0.0.0:80", "[::]:80", "192.0.2.1:80", "[::ffff:192.0.2.1]:80", "[fe80::1]:80"}) {
    ASSERT_TRUE(SocketAddress::Parse(text)) << text;
    EXPECT_FALSE(SocketAddress::Parse(text)->IsLoopback()) << text;
  }
  for (const char* const text : {"", "80", ":80", "127.0.0.1", "127.0.0.1:", "127.0.0.1:65536",
                                 "127.0.0.1:-1", "::1:80", "[::1]", "example.org:80", "1:2:3"}) {
    EXPECT_FALSE(SocketAddress::Parse(text)) << text;
  }
}

TEST(WebAddress, HasAUrl) {
  EXPECT_EQ("http://127.0.0.1:8480/", SocketAddress::Parse("127.0.0.1:8480")->Url());
  EXPECT_EQ("http://[::1]:8480/", SocketAddress::Parse("[::1]:8480")->Url());
}

TEST(WebFileName, IsSafeInAHeader) {
  EXPECT_EQ("attachment; filename=\"a b.jpg\"; filename*=UTF-8''a%20b.jpg", Attachment("a b.jpg"));
  EXPECT_EQ("attachment; filename=\"__.jpg\"; filename*=UTF-8''%C3%A9.jpg",
            Attachment("\xc3\xa9.jpg"));
  const std::string mark = std::string("\xe2\x80") + '\xae'; // reverses the direction
  for (const std::string& name :
       {std::string("a\"b\r\nX: y"), mark + ".jpg", std::string("\xff\xfe"), std::string(R"(\"\)"),
        std::string(".."), std::string()}) {
    const std::string value = Attachment(name);
    EXPECT_EQ(std::string::npos, value.find_first_of("\r\n\\")) << value;
    EXPECT_EQ(2, std::count(value.begin(), value.end(), '"')) << value;
    EXPECT_EQ(std::string::npos, value.find("%E2%80%AE")) << value;
  }
}

Selection SelectionOf(const std::string& query) {
  return ParseSelection(*ParseTarget("/search?" + query));
}

TEST(WebQuery, SelectsPhotos) {
  const Selection selection =
      SelectionOf("words=sea+side&volume=%2Fshares%2FA%2F&folder=7&month=2026-11");
  EXPECT_EQ("sea side", selection.words);
  EXPECT_EQ("/shares/A/", selection.volume);
  EXPECT_EQ(7, selection.folder);
  EXPECT_EQ(2026, selection.year);
  EXPECT_EQ(11, selection.month);
  EXPECT_EQ(Selection(), SelectionOf("words=&volume=&folder=&month=&year="));
  EXPECT_EQ(2025, SelectionOf("year=2025").year);
  EXPECT_EQ(2025, SelectionOf("month=2025").year);
  EXPECT_FALSE(SelectionOf("month=2025").month);
  EXPECT_EQ(9, SelectionOf("month=2017-09&year=2017").month);
}

TEST(WebQuery, RefusesMoreWordsThanASearchMayHave) {
  std::string words;
  for (char c = 'a'; c <= 'z'; ++c) {
    words += std::string(1, c) + c + '+';
  }
  EXPECT_NO_THROW(SelectionOf("words=" + words + words));
  EXPECT_THROW(SelectionOf("words=" + words + "1+2+3+4+5+6+7"), BadQuery);
  EXPECT_THROW(SelectionOf("words=" + std::string(4097, 'a')), BadQuery);
}

TEST(WebQuery, RefusesMalformedNumbersAndMonths) {
  for (const char* const query :
       {"folder=x", "folder=1.5", "month=2026-13", "month=2026-00", "month=2026-1", "month=20",
        "month=2026-11-01", "month=-2026", "year=0", "year=x", "month=0000-01", "year=2017-junk",
        "year=2017-05", "year=20170", "month=2017-09&year=2016", "month=2017&year=2016"}) {
    EXPECT_THROW(SelectionOf(query), BadQuery) << query;
  }
  for (const char* const query : {"count=0", "count=201", "count=x", "count=-1"}) {
    EXPECT_THROW(ParseCount(*ParseTarget(std::string("/?") + query)), BadQuery) << query;
  }
}

TEST(WebQuery, TakesMonthsAndYearsInLocalTime) {
  setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
  tzset();
  const auto march = ToFilter(SelectionOf("month=2026-03")).times;
  const auto year = ToFilter(SelectionOf("year=2026")).times;
  unsetenv("TZ");
  tzset();
  ASSERT_TRUE(march && year);
  EXPECT_EQ(1772319600, march->first);      // 2026-03-01T00:00:00+01:00
  EXPECT_EQ(1774994400 - 1, march->second); // 2026-04-01T00:00:00+02:00
  EXPECT_EQ(1767222000, year->first);       // 2026-01-01T00:00:00+01:00
  EXPECT_EQ(1798758000 - 1, year->second);  // 2027-01-01T00:00:00+01:00
  EXPECT_FALSE(ToFilter({}).times);
}

} // namespace
} // namespace orva::web

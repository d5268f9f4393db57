// Large amounts of bytes and messages, and unusual ways to send them.

#include "Flood.h"

#include "support/TestScale.h"

#include <algorithm>
#include <climits>

namespace orva::test {
namespace {

using ::testing::IsEmpty;

const LogLine SKIPPED = Error("MessageProcessor:: message of more than 65536 bytes skipped");
const LogLine ILL_FORMED = Error("MessageProcessor:: ");

TEST_F(Flood, ABillionBytesWithoutADelimiterAreOneMessage) {
  const std::string mebibyte(1U << 20U, 'x');
  const int mebibytes = TestScale(64, 1024);
  for (int i = 0; i < mebibytes; ++i) {
    appliance.Service().SendBytes(mebibyte);
  }
  appliance.Service().SendBytes(DELIMITER);
  appliance.Barrier();
  EXPECT_EQ(Log{SKIPPED}, appliance.TakeLog());
  ExpectUnharmed("bytes without a delimiter");
}

TEST_F(Flood, MessagesThatAreTooLongAreSkippedOneByOne) {
  const auto count = TestScale<std::size_t>(200, 4000);
  const std::string message = std::string(LONGEST + 1, 'x') + DELIMITER;
  for (std::size_t i = 0; i < count; ++i) {
    appliance.Service().SendBytes(message);
  }
  appliance.Barrier();
  EXPECT_EQ(Log(count, SKIPPED), appliance.TakeLog());
  ExpectUnharmed("messages that are too long");
}

TEST_F(Flood, AMessageMayComeByteByByte) {
  const auto size = TestScale<std::size_t>(4096, LONGEST);
  const std::string end = GOOD.substr(GOOD.find("?>") + 2);
  const std::string begin = GOOD.substr(0, GOOD.size() - end.size());
  const std::string message = begin + std::string(size - GOOD.size(), ' ') + end + DELIMITER;
  for (const char byte : message) {
    appliance.Service().SendBytes(std::string(1, byte));
    appliance.Service().AwaitConsumed();
  }
  appliance.Barrier();
  EXPECT_EQ(HANDLED, appliance.TakeLog());
  ExpectUnharmed("a message that comes byte by byte");
}

TEST_F(Flood, ManyMessagesAtOnceAreHandledInOrder) {
  const std::string missing = "There is no filesystem location for the mountpoint /shares/B/";
  const std::vector<std::pair<std::string, Log>> kinds = {
      {GOOD, HANDLED},
      {Notification("Purged", "/shares/B"),
       {Info(":: Purged "), Error(missing), Info("Default:: Volume purged - ignored! ")}},
      {Notification("Rescanned", "/shares/B"), {}},
      {"<ORVANotification", {ILL_FORMED}},
      {R"(<Other about="ORVANotification"/>)", {Error("ERROR ! Node name = Other")}},
      {"<Other/>", {}},
  };
  const int messages = TestScale(5'000, 100'000);
  std::string bytes;
  Log expected;
  for (int i = 0; i < messages; ++i) {
    const auto& [message, lines] = kinds[static_cast<std::size_t>(i) % kinds.size()];
    bytes += message + DELIMITER;
    expected.insert(expected.end(), lines.begin(), lines.end());
  }
  appliance.Service().SendBytes(bytes);
  appliance.Barrier();
  Log log = appliance.TakeLog();
  for (LogLine& line : log) {
    if (line.text.starts_with(ILL_FORMED.text)) {
      line = ILL_FORMED; // the rest is the parser's
    }
  }
  EXPECT_TRUE(expected == log) << log.size() << " lines instead of " << expected.size();
  ExpectUnharmed(std::to_string(messages) + " messages at once");
}

TEST_F(Flood, APeerThatNeverReadsHasNothingToRead) {
  const int rounds = TestScale(50, 5'000);
  std::string bytes;
  for (int i = 0; i < rounds; ++i) {
    for (const std::string& message :
         {GOOD, Notification("Purged", "/shares"), std::string("<ORVANotification"),
          Notification("Unknown", "/shares"), std::string(R"(<Other a="ORVANotification"/>)"),
          Notification("End", "")}) {
      bytes += message + DELIMITER;
    }
  }
  appliance.Service().StopReading();
  appliance.Service().SendBytes(bytes);
  appliance.Barrier();
  EXPECT_EQ(6U * static_cast<std::size_t>(rounds), appliance.TakeLog().size());
  ExpectUnharmed("messages of a peer that never reads");
}

TEST_F(Flood, DelimitersInARowAreEmptyMessages) {
  const std::size_t count = 1'000'000;
  appliance.Service().SendBytes(Repeated(DELIMITER, count));
  appliance.Barrier();
  EXPECT_THAT(appliance.TakeLog(), IsEmpty());
  ExpectUnharmed("delimiters in a row");
}

TEST_F(Flood, ZerosThatAreNoDelimiterSpoilOnlyTheNextMessage) {
  for (std::size_t zeros = 0; zeros <= TestScale<std::size_t>(9, 1'000); ++zeros) {
    appliance.Service().SendBytes(std::string(zeros, '\0') + GOOD + DELIMITER);
    appliance.Barrier();
    const Log log = appliance.TakeLog();
    EXPECT_EQ(1U, log.size()) << zeros << ::testing::PrintToString(log);
    EXPECT_EQ(zeros % 4 == 0, log == HANDLED) << zeros;
    Handled(GOOD);
  }
  appliance.Service().SendBytes(std::string(4'000'003, '\0') + "x" + DELIMITER);
  appliance.Barrier();
  EXPECT_THAT(appliance.TakeLog(), IsEmpty());
  ExpectUnharmed("zeros that are no delimiter");
}

TEST_F(Flood, EveryPrefixOfAGoodMessageIsRefused) {
  const std::string comment = "<!-- " + std::string(TestScale<std::size_t>(0, 4'000), 'c') + " -->";
  const std::string message =
      Notification("TranscodedBatch", "/shares/A", comment + ProfileElement("0123"));
  const std::size_t named =
      message.find("ORVANotification") + std::string("ORVANotification").size();
  for (std::size_t size = 0; size < message.size(); ++size) {
    EXPECT_EQ(size < named, Refused(message.substr(0, size)).empty()) << size;
  }
  EXPECT_EQ(Log{Info(":: Transcodedbatch ")}, appliance.Handle(message));
  ExpectUnharmed("prefixes of a message");
}

TEST_F(Flood, EverySuffixOfAGoodMessageIsRefused) {
  const std::string message = GOOD;
  for (std::size_t begin = message.find("<ORVA") + 1; begin < message.size(); ++begin) {
    Refused(message.substr(begin));
  }
  ExpectUnharmed("suffixes of a message");
}

TEST_F(Flood, ConnectionsThatEndInsideAMessageLeaveNothingBehind) {
  const int connections = TestScale(50, 2'000);
  for (int i = 0; i < connections; ++i) {
    appliance.Service().SendBytes(std::string(LONGEST, 'x'));
    appliance.Service().CloseClient();
  }
  appliance.Barrier();
  // Two lines for each new connection, and none for the incomplete messages.
  EXPECT_EQ(2U * static_cast<std::size_t>(connections), appliance.TakeLog().size());
  ExpectUnharmed("connections that end inside a message");
}

/// Another spelling of `path` for each number, of at most `size` bytes.
std::string Spelling(std::string path, int number, std::size_t size) {
  for (int bits = number; bits > 0; bits /= 2) {
    path += bits % 2 == 0 ? "/." : "//.";
  }
  return path + Repeated("/.", (size - path.size()) / 2);
}

TEST_F(Flood, SpellingsOfAMountPointAreABoundedNumberOfVolumes) {
  const int spellings = TestScale(5'000, 100'000);
  for (int i = 0; i < spellings; ++i) {
    appliance.Service().Send(Notification("Purged", Spelling("/shares", i, 2'048)));
  }
  appliance.Barrier();
  appliance.TakeLog();
  ExpectUnharmed("spellings of a mount point");
}

TEST_F(Flood, LongSpellingsOfAMountPointAreABoundedAmountOfMemory) {
  constexpr std::size_t longest = PATH_MAX - 2; // without the "/" and the null byte that are added
  const Volume a("A", "150g");
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Scanned(a.Path()));
  for (int i = 0; i < 1'100; ++i) {
    appliance.Service().Send(Notification("Scanned", Spelling(a.Path(), i, longest)));
  }
  // Each of these starts a new merger, which logs all volumes.
  const int mergers = TestScale(50, 1'000);
  for (int i = 0; i < mergers; ++i) {
    appliance.Service().Send(Unplugged("/shares/Other"));
  }
  appliance.Barrier();
  appliance.TakeLog();
  EXPECT_EQ(Log{Info(":: Scanned")}, appliance.Handle(Scanned(a.Path())));
  ExpectWithinBounds("long spellings of a mount point");
}

} // namespace
} // namespace orva::test

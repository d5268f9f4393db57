#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::StartsWith;

const LogLine CREATING =
    Plain("src/zophotodbmerger/NotificationListener:130: Creating the notification socket "
          "/run/orva/notification.sock");
const LogLine READING =
    Plain("src/zophotodbmerger/NotificationListener:137: Calling ReadMessage()");
const std::string DELIMITER(4, '\0');
/// A good notification, and the log of its handling.
const std::string GOOD = Notification("Unplugged", "/shares/A");
const Log HANDLED = {Info("Default:: Volumeunplugged, ignoring! ")};

/// Bytes of the largest message that the daemon accepts.
constexpr std::size_t LARGEST = 65536;

/// A padded good notification of exactly `size` bytes.
std::string Padded(std::size_t size) {
  const std::string tail = "-->" + GOOD.substr(GOOD.find("<ORVANotification"));
  const std::string head = GOOD.substr(0, GOOD.find("<ORVANotification")) + "<!--";
  return head + std::string(size - head.size() - tail.size(), 'x') + tail;
}

class Intake : public SystemTest {
protected:
  void SetUp() override {
    appliance.Start();
    appliance.TakeLog();
  }

  /// The message processor writes one error line for the message, and the connection stays open.
  /// Returns the line's text.
  std::string RefusedByTheProcessor(const std::string& message) {
    const Log log = appliance.Handle(message);
    EXPECT_EQ(1U, log.size()) << ::testing::PrintToString(log);
    if (log.size() != 1) {
      return "";
    }
    EXPECT_EQ(Error("").priority, log[0].priority);
    EXPECT_THAT(log[0].text, StartsWith("MessageProcessor:: "));
    ExpectGood();
    return log[0].text;
  }

  /// The message has no effect, and the connection stays open.
  void ExpectIgnored(const std::string& message) {
    EXPECT_THAT(appliance.Handle(message), IsEmpty());
    ExpectGood();
  }

  /// The next good notification is handled, on the same connection.
  void ExpectGood() { EXPECT_EQ(HANDLED, appliance.Handle(GOOD)); }
};

TEST_F(Intake, AnotherRootElementIsRefusedByName) {
  EXPECT_EQ(Log{Error("ERROR ! Node name = Other")},
            appliance.Handle(R"(<Other text="ORVANotification"/>)"));
  ExpectGood();
}

TEST_F(Intake, AnUnrelatedMessageIsDroppedWithoutALine) {
  ExpectIgnored("<Other/>");
  ExpectIgnored("no XML at all");
  ExpectIgnored("");
}

TEST_F(Intake, IllFormedXmlIsRefused) {
  RefusedByTheProcessor("<ORVANotification");
  RefusedByTheProcessor("<ORVANotification></Other>");
  RefusedByTheProcessor("ORVANotification");
}

TEST_F(Intake, ADocumentTypeIsRefused) {
  RefusedByTheProcessor("<!DOCTYPE ORVANotification>" + GOOD.substr(GOOD.find("<ORVAN")));
  RefusedByTheProcessor(R"(<!DOCTYPE ORVANotification [<!ENTITY a "/shares/A">]>)"
                        R"(<ORVANotification Name="Plugged" MountPoint="&a;"/>)");
  RefusedByTheProcessor(R"(<!DOCTYPE ORVANotification SYSTEM "file:///etc/passwd">)"
                        R"(<ORVANotification Name="Plugged" MountPoint="/shares/A"/>)");
}

TEST_F(Intake, AMessageOfTheLargestSizeIsHandled) {
  EXPECT_EQ(HANDLED, appliance.Handle(Padded(LARGEST)));
}

TEST_F(Intake, AMessageOverTheLargestSizeIsRefused) {
  RefusedByTheProcessor(Padded(LARGEST + 1));
  RefusedByTheProcessor(Padded(160 * LARGEST));
}

TEST_F(Intake, AnEmptyOrAbsentMountPointIsRefused) {
  EXPECT_THAT(RefusedByTheProcessor(Plugged("")), HasSubstr("basic_string::at"));
  RefusedByTheProcessor(R"(<ORVANotification Name="Unplugged"/>)");
  // Before the name is checked.
  RefusedByTheProcessor(Notification("Unknown", ""));
  RefusedByTheProcessor(TranscodedBatch(""));
}

TEST_F(Intake, AnUnknownOrAbsentNameIsIgnored) {
  ExpectIgnored(Notification("plugged", "/shares/A"));
  ExpectIgnored(Notification("Rescanned", "/shares/A"));
  ExpectIgnored(Notification("", "/shares/A"));
  ExpectIgnored(R"(<ORVANotification MountPoint="/shares/A"/>)");
}

TEST_F(Intake, ABatchWithoutTheProfileIsIgnoredAfterItsLine) {
  const Log only{Info(":: Transcodedbatch ")};
  const auto batch = [this](const std::string& children) {
    return appliance.Handle(Notification("TranscodedBatch", "/shares", children));
  };
  EXPECT_EQ(only, batch(""));
  EXPECT_EQ(only, batch("<other>" + notify::TRANSCODING_PROFILE + "</other>"));
  EXPECT_EQ(only, batch(ProfileElement("")));
  EXPECT_EQ(only, batch(ProfileElement("0123")));
  EXPECT_EQ(only, batch(ProfileElement(notify::TRANSCODING_PROFILE) + ProfileElement("0123")));
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
  ExpectGood();
}

TEST_F(Intake, TheLastProfileOfABatchCounts) {
  const Log log = appliance.Handle(
      Notification("TranscodedBatch", "/shares",
                   ProfileElement("0123") + " " + ProfileElement(notify::TRANSCODING_PROFILE)));
  ASSERT_LE(2U, log.size());
  EXPECT_EQ(BatchLines(), Log(log.begin(), log.begin() + 2));
  EXPECT_THAT(appliance.TakeOutput(), ElementsAre(StartsWith("Setting the current to scanned")));
}

TEST_F(Intake, SeveralMessagesInOneWriteAreHandledInOrder) {
  appliance.Service().SendBytes(GOOD + DELIMITER + "<First a=\"ORVANotification\"/>" + DELIMITER +
                                DELIMITER + GOOD + DELIMITER);
  appliance.Barrier();
  EXPECT_EQ(HANDLED + Log{Error("ERROR ! Node name = First")} + HANDLED, appliance.TakeLog());
}

TEST_F(Intake, AMessageMayComeInPieces) {
  for (const char byte : GOOD + DELIMITER) {
    appliance.Service().SendBytes(std::string(1, byte));
  }
  appliance.Barrier();
  EXPECT_EQ(HANDLED, appliance.TakeLog());
}

TEST_F(Intake, AMountPointIsDecodedAndEndsInOneSeparator) {
  const Volume volume("My Photos", "150g");
  const Log expected{PluggedLine(volume), Info("Default:: VolumePlugged "),
                     Info("We now have a master volume " + MasterText(volume))};
  EXPECT_EQ(expected, appliance.Handle(Notification("Plugged", "/shares/My%20Photos")));
  EXPECT_THAT(PluggedLine(volume).text, HasSubstr("mountPoint /shares/My Photos/"));
}

TEST_F(Intake, BothFormsOfAMountPointAreOneVolume) {
  const Volume a("A", "150g");
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Plugged(a.MountPoint()));
  // If the second were another volume, it would be the successor of the first.
  const Log log = appliance.Handle(Unplugged(a.MountPoint()));
  EXPECT_EQ(Info("We now have a master volume " + SHARES_MASTER_TEXT), log.back());
}

TEST_F(Intake, TheFirstRegistrationFixesAVolumesSize) {
  const Volume a("A", "150g");
  appliance.Handle(Purged(a.Path())); // registers it without its size
  const Log log = appliance.Handle(Plugged(a.Path()));
  EXPECT_EQ(Info("We now have a master volume " + SHARES_MASTER_TEXT), log.back());
}

TEST_F(Intake, AFormatInAMountPointIsOnlyText) {
  EXPECT_EQ((Log{Info(":: Purged "),
                 Error("There is no filesystem location for the mountpoint /shares/%s%n/"),
                 Info("Default:: Volume purged - ignored! ")}),
            appliance.Handle(Notification("Purged", "/shares/%s%n")));
  ExpectGood();
}

TEST_F(Intake, AHandlerThatFailsAffectsOnlyItsMessage) {
  const auto fails = [this] { return appliance.Handle(End("/shares")).back(); };
  const LogLine unusable = Error("MessageProcessor:: Invalid DB location : '/shares/.zophotos'");
  const fs::path directory = "/shares/.zophotos";
  fs::remove_all(directory);
  std::ofstream(directory) << "no directory";
  EXPECT_EQ(unusable, fails());
  ExpectGood();

  fs::remove(directory);
  fs::create_directory("/tmp/elsewhere");
  fs::create_directory_symlink("/tmp/elsewhere", directory);
  EXPECT_EQ(unusable, fails());
  ExpectGood();

  // The database layer throws a std::string.
  fs::remove(directory);
  fs::create_directory(directory);
  std::ofstream(directory / "zophotos.db") << std::string(4096, 'x');
  const LogLine broken = fails();
  EXPECT_EQ(unusable.priority, broken.priority);
  EXPECT_THAT(broken.text, StartsWith("MessageProcessor:: "));
  EXPECT_THAT(broken.text, HasSubstr("not a database"));
  ExpectGood();
}

TEST_F(Intake, AClosedConnectionIsMadeAgain) {
  appliance.Service().CloseClient();
  appliance.Barrier();
  EXPECT_EQ((Log{CREATING, READING}), appliance.TakeLog());
  ExpectGood();
}

TEST_F(Intake, ManyClosedConnectionsAreMadeAgain) {
  Log expected;
  for (int i = 0; i < 20; ++i) {
    appliance.Service().CloseClient();
    expected = expected + Log{CREATING, READING};
  }
  appliance.Barrier();
  EXPECT_EQ(expected, appliance.TakeLog());
}

TEST_F(Intake, BytesAfterTheLastDelimiterAreDroppedWithTheirConnection) {
  appliance.Service().SendBytes(GOOD.substr(0, 30));
  appliance.Service().CloseClient();
  // The rest must not complete the message of the first connection.
  appliance.Service().SendBytes(GOOD.substr(30) + DELIMITER);
  appliance.Service().Send(GOOD);
  appliance.Barrier();
  const Log log = appliance.TakeLog();
  ASSERT_EQ(4U, log.size());
  EXPECT_EQ((Log{CREATING, READING}), Log(log.begin(), log.begin() + 2));
  EXPECT_THAT(log[2].text, StartsWith("MessageProcessor:: "));
  EXPECT_EQ(HANDLED[0], log[3]);
}

TEST_F(Intake, ACompleteMessageWithoutItsDelimiterIsNotHandled) {
  appliance.Service().SendBytes(GOOD);
  appliance.Service().CloseClient();
  appliance.Barrier();
  EXPECT_EQ((Log{CREATING, READING}), appliance.TakeLog());
}

TEST_F(Intake, AnOversizedMessageIsDroppedWithItsConnection) {
  appliance.Service().SendBytes(std::string(2 * LARGEST, 'x'));
  appliance.Service().CloseClient();
  EXPECT_EQ(HANDLED.back(), appliance.Handle(GOOD).back());
}

TEST_F(Intake, WhenTheServiceStopsTheDaemonExitsWithStatusZero) {
  EXPECT_EQ(Exited(0), appliance.Shutdown());
  EXPECT_EQ(
      (Log{CREATING, Error("Unable to open socket (/run/orva/notification.sock)"),
           Info("src/zophotodbmerger/NotificationListener:154: NotificationListener exiting."),
           Info("Returning from the wait")}),
      appliance.TakeLog());
}

} // namespace
} // namespace orva::test

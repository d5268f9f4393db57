#include "StatesTest.h"

#include "Messages.h"
#include "NotificationListener.h"
#include "NotificationService.h"
#include "PhotoDB.h"
#include "Volume.h"

#include "support/XmlPlatform.h"

#include "orvautil/ClientSocket.h"
#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <xercesc/dom/DOMDocument.hpp>
#include <xercesc/dom/DOMElement.hpp>
#include <xercesc/framework/MemBufInputSource.hpp>
#include <xercesc/parsers/XercesDOMParser.hpp>

#include <fstream>
#include <stdexcept>

namespace orva::test {
namespace {

using dbmerger::NotificationListener;
using dbmerger::State;
using dbmerger::VolumeInfo;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;

/// Parses a message and passes its root element to the listener.
void Notify(const NotificationListener& listener, const std::string& message) {
  const XmlPlatform platform;
  xercesc::XercesDOMParser parser;
  parser.parse(xercesc::MemBufInputSource(reinterpret_cast<const XMLByte*>(message.data()),
                                          message.size(), "message"));
  util::ClientSocket unused(util::Socket::Address("@nobody"), false);
  listener.HandleMessage(unused, nullptr, 0, *parser.getDocument()->getDocumentElement());
}

/// A state that records its events.
class RecordingState final : public State {
public:
  void handleVolumePlugged(VolumeInfo volume) override { Note("plugged", std::move(volume)); }
  void handleVolumeUnplugged(VolumeInfo volume) override { Note("unplugged", std::move(volume)); }
  void handleVolumeScanned(VolumeInfo volume) override { Note("scanned", std::move(volume)); }
  void handlePictureTranscoded(VolumeInfo volume) override {
    Note("transcoded", std::move(volume));
  }
  void handleVolumePurged(VolumeInfo volume) override { Note("purged", std::move(volume)); }
  int getStateType() override { return -1; }

  Lines events; ///< "event mount point"
  std::vector<VolumeInfo> volumes;

private:
  void Note(const std::string& event, VolumeInfo volume) {
    events.push_back(event + " " + volume.mountPoint);
    volumes.push_back(std::move(volume));
  }
};

/// A listener with a state that records the events. The shares root is not registered.
class NotificationTest : public StatesTest {
protected:
  NotificationTest() {
    auto recording = std::make_unique<RecordingState>();
    state = recording.get();
    machine.setCurrentState(recording.release());
    ForgetSharesRoot();
    MakeDirectory("/shares/Vol");
  }

  void Notify(const std::string& message) const { test::Notify(listener, message); }

  void NotifyBatch(const std::string& children) const {
    Notify(Notification("TranscodedBatch", "/shares/Vol", children));
  }

  Lines Registered() const {
    Lines mountPoints;
    for (const VolumeInfo& volume : Registry().getVolumes()) {
      mountPoints.push_back(volume.mountPoint);
    }
    return mountPoints;
  }

  RecordingState* state;
  NotificationListener listener;
};

const LogLine BATCH = BatchLines().front();

TEST(NotificationListener, MessageThatMentionsTheRootElementIsValid) {
  const NotificationListener listener;
  EXPECT_TRUE(listener.IsValidMessage("ORVANotification"));
  EXPECT_TRUE(listener.IsValidMessage("<a b=\"xORVANotificationx\"/>"));
  EXPECT_FALSE(listener.IsValidMessage(""));
  EXPECT_FALSE(listener.IsValidMessage("<orvanotification/>"));
  EXPECT_FALSE(listener.IsValidMessage("<ORVANotificatio n/>"));
}

TEST(NotificationListener, DelimiterIsFourZeroBytes) {
  const auto [bytes, count] = NotificationListener().GetDelimiter();
  EXPECT_EQ(std::string(4, '\0'), std::string(bytes, bytes + count));
}

TEST_F(NotificationTest, OtherRootElementIsRefused) {
  Notify("<Status about=\"ORVANotification\" Name=\"Plugged\" MountPoint=\"/shares/Vol\"/>");
  EXPECT_THAT(Logged(), ElementsAre(Error("ERROR ! Node name = Status")));
  EXPECT_THAT(state->events, IsEmpty());
  EXPECT_THAT(Registered(), IsEmpty());
}

TEST_F(NotificationTest, RootElementMustMatchCompletely) {
  Notify("<ORVANotifications Name=\"Scanned\" MountPoint=\"/shares/Vol\"/>");
  Notify("<x:ORVANotification Name=\"Scanned\" MountPoint=\"/shares/Vol\"/>");
  EXPECT_THAT(Logged(), ElementsAre(Error("ERROR ! Node name = ORVANotifications"),
                                    Error("ERROR ! Node name = x:ORVANotification")));
  EXPECT_THAT(state->events, IsEmpty());
}

// Plugged.

TEST_F(NotificationTest, PluggedVolumeIsMeasured) {
  const Volume volume("Tmp", "300m");
  std::ofstream(volume.Path() + "/content") << std::string(1 << 20, 'x');
  const std::time_t before = std::time(nullptr);
  Notify(test::Plugged("/shares/Tmp"));
  EXPECT_THAT(state->events, ElementsAre("plugged /shares/Tmp/"));
  ASSERT_EQ(1U, Registry().getVolumes().size());
  const VolumeInfo& registered = Registry().getVolumes()[0];
  EXPECT_EQ("/shares/Tmp/", registered.mountPoint);
  EXPECT_EQ(314572800.0, registered.capacity);
  EXPECT_EQ(1048576.0, registered.used);
  EXPECT_EQ(1, registered.photoDbSize);
  EXPECT_GE(registered.timestamp, before);
  EXPECT_FALSE(registered.readOnly);
  EXPECT_EQ(registered.ToString(), state->volumes[0].ToString());
  EXPECT_THAT(Logged(),
              ElementsAre(Info("The volume is plugged and capacity is 314572800.000000 and "
                               "capacity_used is 1048576.000000 for mountPoint /shares/Tmp/")));
}

TEST_F(NotificationTest, PluggedReadOnlyVolumeIsRegisteredAsWritable) {
  Volume volume("Tmp", "300m");
  volume.MakeReadOnly();
  Notify(test::Plugged("/shares/Tmp"));
  ASSERT_EQ(1U, Registry().getVolumes().size());
  EXPECT_FALSE(Registry().getVolumes()[0].readOnly);
}

TEST_F(NotificationTest, PluggedVolumeWithoutADirectoryIsStillAnEvent) {
  Notify(test::Plugged("/shares/Gone"));
  EXPECT_THAT(state->events, ElementsAre("plugged /shares/Gone/"));
  EXPECT_EQ(1.0, state->volumes[0].capacity);
  EXPECT_EQ(1.0, state->volumes[0].used);
  EXPECT_THAT(Registered(), IsEmpty());
  EXPECT_THAT(Logged(), ElementsAre(Error(
                            "There is no filesystem location for the mountpoint /shares/Gone/")));
}

// The other events.

TEST_F(NotificationTest, UnpluggedVolumeIsRemovedSilently) {
  Register("/shares/Vol/", LARGE);
  ASSERT_TRUE(Registry().reelectMasterVolume());
  Notify(test::Unplugged("/shares/Vol"));
  EXPECT_THAT(state->events, ElementsAre("unplugged /shares/Vol/"));
  EXPECT_THAT(Registered(), IsEmpty());
  EXPECT_EQ("DUMMY_MOUNT_POINT", Master());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(NotificationTest, ScannedVolumeIsRegisteredUnmeasured) {
  Notify(test::Scanned("/shares/Vol"));
  EXPECT_THAT(state->events, ElementsAre("scanned /shares/Vol/"));
  ASSERT_EQ(1U, Registry().getVolumes().size());
  EXPECT_EQ(1.0, Registry().getVolumes()[0].capacity);
  EXPECT_EQ(1.0, Registry().getVolumes()[0].used);
  EXPECT_EQ(1, Registry().getVolumes()[0].photoDbSize);
  EXPECT_THAT(Logged(), ElementsAre(Info(":: Scanned")));
}

TEST_F(NotificationTest, PurgedVolumeIsRegisteredUnmeasured) {
  Notify(test::Purged("/shares/Vol"));
  EXPECT_THAT(state->events, ElementsAre("purged /shares/Vol/"));
  ASSERT_EQ(1U, Registry().getVolumes().size());
  EXPECT_EQ(1.0, Registry().getVolumes()[0].capacity);
  EXPECT_THAT(Logged(), ElementsAre(Info(":: Purged ")));
}

TEST_F(NotificationTest, FirstEventDeterminesTheCapacity) {
  const Volume volume("Tmp", "300m");
  Notify(test::Scanned("/shares/Tmp"));
  Notify(test::Plugged("/shares/Tmp"));
  ASSERT_EQ(1U, Registry().getVolumes().size());
  EXPECT_EQ(1.0, Registry().getVolumes()[0].capacity);
  EXPECT_EQ(314572800.0, state->volumes[1].capacity) << "the state gets the event's own record";
}

TEST_F(NotificationTest, EndIsATranscodedBatchOfAnyProfile) {
  Notify(End("/shares/Vol"));
  Notify(Notification("End", "/shares/Vol", ProfileElement("other")));
  EXPECT_THAT(state->events, ElementsAre("transcoded /shares/Vol/", "transcoded /shares/Vol/"));
  EXPECT_THAT(Registered(), ElementsAre("/shares/Vol/"));
  EXPECT_THAT(Logged(), ElementsAre(Info(":: End "), Info(":: End ")));
}

TEST_F(NotificationTest, UnknownNamesAreIgnoredSilently) {
  for (const char* const name : {"plugged", "Plug", "PluggedX", "END", "Transcodedbatch", ""}) {
    Notify(Notification(name, "/shares/Vol", ProfileElement(notify::TRANSCODING_PROFILE)));
  }
  Notify("<ORVANotification MountPoint=\"/shares/Vol\"/>");
  EXPECT_THAT(state->events, IsEmpty());
  EXPECT_THAT(Registered(), IsEmpty());
  EXPECT_THAT(Logged(), IsEmpty());
}

// Profiles.

TEST_F(NotificationTest, BatchOfTheAcceptedProfileIsHandled) {
  NotifyBatch(ProfileElement(notify::TRANSCODING_PROFILE));
  EXPECT_THAT(state->events, ElementsAre("transcoded /shares/Vol/"));
  EXPECT_THAT(Registered(), ElementsAre("/shares/Vol/"));
  EXPECT_EQ(BatchLines(), Logged());
}

TEST_F(NotificationTest, ProfileIsFoundAmongOtherChildren) {
  NotifyBatch("\n  <!-- c --><count>3</count>\n  <profile>cb62bbdd389b4889<![CDATA["
              "8f2e5244977cb2c5]]></profile>\n  <Profile>other</Profile>text");
  EXPECT_THAT(state->events, ElementsAre("transcoded /shares/Vol/"));
}

TEST_F(NotificationTest, LastProfileDecides) {
  NotifyBatch(ProfileElement("other") + ProfileElement(notify::TRANSCODING_PROFILE));
  EXPECT_EQ(BatchLines(), Logged());
  EXPECT_THAT(state->events, ElementsAre("transcoded /shares/Vol/"));
  NotifyBatch(ProfileElement(notify::TRANSCODING_PROFILE) + ProfileElement("other"));
  NotifyBatch(ProfileElement(notify::TRANSCODING_PROFILE) + "<profile/>");
  EXPECT_EQ(1U, state->events.size());
  EXPECT_THAT(Logged(), ElementsAre(BATCH, BATCH));
}

TEST_F(NotificationTest, BatchesOfOtherProfilesAreIgnored) {
  const Lines batches{"",
                      "<count>1</count>",
                      "<profile/>",
                      ProfileElement("other"),
                      ProfileElement("CB62BBDD389B48898F2E5244977CB2C5"),
                      ProfileElement(notify::TRANSCODING_PROFILE + " "),
                      "<Profile>" + notify::TRANSCODING_PROFILE + "</Profile>",
                      "<batch>" + ProfileElement(notify::TRANSCODING_PROFILE) + "</batch>"};
  for (const std::string& children : batches) {
    NotifyBatch(children);
    EXPECT_THAT(Logged(), ElementsAre(BATCH)) << children;
  }
  EXPECT_THAT(state->events, IsEmpty());
  EXPECT_THAT(Registered(), IsEmpty());
}

// Mount points.

TEST_F(NotificationTest, TrailingSeparatorMakesNoDifference) {
  Notify(test::Scanned("/shares/Vol"));
  Notify(test::Scanned("/shares/Vol/"));
  EXPECT_THAT(state->events, ElementsAre("scanned /shares/Vol/", "scanned /shares/Vol/"));
  EXPECT_THAT(Registered(), ElementsAre("/shares/Vol/"));
}

TEST_F(NotificationTest, DoubledSeparatorIsAnotherVolume) {
  Notify(test::Scanned("/shares/Vol/"));
  Notify(test::Scanned("/shares/Vol//"));
  EXPECT_THAT(Registered(), ElementsAre("/shares/Vol/", "/shares/Vol//"));
}

TEST_F(NotificationTest, MountPointIsPercentDecoded) {
  MakeDirectory("/shares/Mine & \xC3\xA4+");
  Notify(Notification("Scanned", "/shares/Mine%20%26%20%C3%a4+"));
  EXPECT_THAT(state->events, ElementsAre("scanned /shares/Mine & \xC3\xA4+/"));
  EXPECT_THAT(Registered(), ElementsAre("/shares/Mine & \xC3\xA4+/"));
}

TEST_F(NotificationTest, EncodedSeparatorAtTheEndIsOne) {
  Notify(Notification("Scanned", "/shares/Vol%2F"));
  EXPECT_THAT(state->events, ElementsAre("scanned /shares/Vol/"));
}

TEST_F(NotificationTest, MalformedEscapesAreKept) {
  Notify(Notification("Unplugged", "/shares/100%"));
  Notify(Notification("Unplugged", "/shares/%zz%4"));
  Notify(Notification("Unplugged", "/shares/a%00b"));
  EXPECT_THAT(state->events, ElementsAre("unplugged /shares/100%/", "unplugged /shares/%zz%4/",
                                         "unplugged /shares/a%00b/"));
}

TEST_F(NotificationTest, CharactersOutsideAsciiAreUtf8) {
  MakeDirectory("/shares/\xC3\xA4");
  Notify(Notification("Scanned", "/shares/&#228;"));
  EXPECT_THAT(Registered(), ElementsAre("/shares/\xC3\xA4/"));
}

TEST_F(NotificationTest, OnlyTheMountPointIsDecoded) {
  Notify(Notification("%53canned", "/shares/Vol"));
  EXPECT_THAT(state->events, IsEmpty());
}

TEST_F(NotificationTest, EmptyMountPointIsOutOfRange) {
  for (const char* const name : {"Plugged", "Unplugged", "unknown"}) {
    EXPECT_THROW(Notify(Notification(name, "")), std::out_of_range) << name;
  }
  EXPECT_THROW(Notify("<ORVANotification Name=\"Plugged\"/>"), std::out_of_range);
  EXPECT_THAT(state->events, IsEmpty());
  EXPECT_THAT(Registered(), IsEmpty());
  EXPECT_THAT(Logged(), IsEmpty());
}

// Events that fail.

/// A state whose handlers and recovery fail when a test has set that.
class FailingState final : public State {
public:
  explicit FailingState(const dbmerger::VolumeInfoManager& registry) : registry_(registry) {}

  void handleVolumePlugged(VolumeInfo /*volume*/) override { Handle("plugged"); }
  void handleVolumeUnplugged(VolumeInfo /*volume*/) override { Handle("unplugged"); }
  void handleVolumeScanned(VolumeInfo /*volume*/) override { Handle("scanned"); }
  void handlePictureTranscoded(VolumeInfo /*volume*/) override { Handle("transcoded"); }
  void handleVolumePurged(VolumeInfo /*volume*/) override { Handle("purged"); }
  int getStateType() override { return -1; }

  Unfinished getUnfinished() override { return unfinished; }
  void recover() override {
    steps.push_back("recovery with " + std::to_string(registry_.getVolumes().size()) + " volumes");
    if (recoveryFails) {
      unfinished = Unfinished::Transition;
      throw std::string("recovery failed");
    }
    unfinished = Unfinished::Nothing;
  }

  bool fails = false;
  bool recoveryFails = false;
  Unfinished left = Unfinished::Nothing; ///< by a handler that fails
  Unfinished unfinished = Unfinished::Nothing;
  Lines steps;

private:
  void Handle(const std::string& event) {
    steps.push_back(event);
    if (fails) {
      unfinished = left;
      throw dbmerger::PhotoDB::Error(event + " failed");
    }
  }

  const dbmerger::VolumeInfoManager& registry_;
};

class FailedEventTest : public StatesTest {
protected:
  FailedEventTest() {
    ForgetSharesRoot();
    MakeDirectory("/shares/Vol");
    auto failing = std::make_unique<FailingState>(Registry());
    state = failing.get();
    machine.setCurrentState(failing.release());
    Logged();
  }

  void Notify(const std::string& message) const { test::Notify(listener, message); }

  /// The failure of the message as its reader gets it.
  std::string FailureOf(const std::string& message) const {
    return Thrown<dbmerger::PhotoDB::Error>([&] { Notify(message); }).Message();
  }

  FailingState* state;
  NotificationListener listener;
};

TEST_F(FailedEventTest, WithNothingUnfinishedHasNoRecovery) {
  state->fails = true;
  EXPECT_EQ("scanned failed", FailureOf(test::Scanned("/shares/Vol")));
  EXPECT_EQ("purged failed", FailureOf(test::Purged("/shares/Vol")));
  EXPECT_THAT(state->steps, ElementsAre("scanned", "purged"));
}

TEST_F(FailedEventTest, BeforeItsElectionIsCompletedAtOnce) {
  state->fails = true;
  state->left = State::Unfinished::Election;
  EXPECT_EQ("unplugged failed", FailureOf(test::Unplugged("/shares/Vol")));
  EXPECT_THAT(state->steps, ElementsAre("unplugged", "recovery with 0 volumes"));
  EXPECT_THAT(Logged(), IsEmpty());
  state->fails = false;
  Notify(test::Scanned("/shares/Vol"));
  EXPECT_EQ("scanned", state->steps.back());
}

TEST_F(FailedEventTest, WhoseElectionFailsTooIsLoggedTwiceAndCompletedBeforeTheNextEvent) {
  state->fails = true;
  state->left = State::Unfinished::Election;
  state->recoveryFails = true;
  EXPECT_EQ("unplugged failed", FailureOf(test::Unplugged("/shares/Vol")));
  EXPECT_THAT(state->steps, ElementsAre("unplugged", "recovery with 0 volumes"));
  EXPECT_THAT(Logged(), ElementsAre(Error("MessageProcessor:: recovery failed")));
  state->fails = state->recoveryFails = false;
  Notify(test::Scanned("/shares/Vol"));
  EXPECT_THAT(state->steps, ElementsAre("unplugged", "recovery with 0 volumes",
                                        "recovery with 1 volumes", "scanned"));
}

/// The registry is up to date when the state recovers.
TEST_F(FailedEventTest, InItsTransitionIsCompletedBeforeTheNextEventOfAnyKind) {
  const Lines messages{test::Plugged("/shares/Vol"), test::Scanned("/shares/Vol"),
                       TranscodedBatch("/shares/Vol"), End("/shares/Vol"),
                       test::Purged("/shares/Vol")};
  for (const std::string& message : messages) {
    state->fails = true;
    state->left = State::Unfinished::Transition;
    EXPECT_EQ("unplugged failed", FailureOf(test::Unplugged("/shares/Vol")));
    EXPECT_THAT(state->steps, ElementsAre("unplugged"));
    state->fails = false;
    Notify(message);
    ASSERT_EQ(3U, state->steps.size());
    EXPECT_EQ("recovery with 1 volumes", state->steps[1]);
    Notify(test::Unplugged("/shares/Vol"));
    EXPECT_EQ("unplugged", state->steps[3]);
    state->steps.clear();
  }
}

TEST_F(FailedEventTest, InItsTransitionIsCompletedBeforeAnUnplugging) {
  Register("/shares/Vol/", LARGE);
  state->unfinished = State::Unfinished::Transition;
  Notify(test::Unplugged("/shares/Vol"));
  EXPECT_THAT(state->steps, ElementsAre("recovery with 0 volumes", "unplugged"));
}

TEST_F(FailedEventTest, WhoseRecoveryFailsFailsTheNextEventsUntilItSucceeds) {
  state->unfinished = State::Unfinished::Transition;
  state->recoveryFails = true;
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ("recovery failed", Thrown([&] { Notify(TranscodedBatch("/shares/Vol")); }));
  }
  state->recoveryFails = false;
  Notify(TranscodedBatch("/shares/Vol"));
  EXPECT_THAT(state->steps, ElementsAre("recovery with 1 volumes", "recovery with 1 volumes",
                                        "recovery with 1 volumes", "transcoded"));
}

TEST_F(FailedEventTest, IsNotCompletedByAMessageThatIsNoEvent) {
  state->unfinished = State::Unfinished::Transition;
  Notify(Notification("plugged", "/shares/Vol"));
  EXPECT_THROW(Notify(Notification("Plugged", "")), std::out_of_range);
  EXPECT_THAT(state->steps, IsEmpty());
}

/// The master is missing in the registry when the handler of its unplugging begins.
TEST_F(StatesTest, UnpluggingOfTheMasterIsNotTakenForAFailedEvent) {
  std::filesystem::current_path(MakeDirectory("/tmp/scratch"));
  Register("/shares/Vol/", LARGE);
  Scanned("/shares/Vol/");
  Logged();
  OutputOf([&] { test::Notify(NotificationListener(), test::Unplugged("/shares/Vol")); });
  EXPECT_THAT(Logged(),
              ElementsAre(Info("MasterVolumeScannedState:: Volumeunplugged "),
                          Info("Moving to the scanned state since we can safely do so "),
                          Info("We now have a master volume " + SHARES_MASTER_TEXT + " ")));
}

// The machine.

TEST_F(DaemonLayerTest, NotificationCreatesTheMachineWhenThereIsNone) {
  MakeDirectory("/shares/Vol");
  Notify(NotificationListener(), test::Unplugged("/shares/Vol"));
  EXPECT_NE(nullptr, dbmerger::StateMachine::instance);
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_THAT(Logged(), ElementsAre(Info("Default:: Volumeunplugged, ignoring! ")));
}

// The thread.

const LogLine CREATING = Plain("src/zophotodbmerger/NotificationListener:130: Creating the "
                               "notification socket " +
                               core::ORVA_NOTIFICATION_SOCKET);
const LogLine READING = Plain("src/zophotodbmerger/NotificationListener:137: Calling "
                              "ReadMessage()");
const LogLine CANNOT_OPEN = Error("Unable to open socket (" + core::ORVA_NOTIFICATION_SOCKET + ")");
const LogLine EXITING =
    Info("src/zophotodbmerger/NotificationListener:154: NotificationListener exiting.");

TEST_F(DaemonLayerTest, ListenerEndsWhenThereIsNoService) {
  NotificationListener listener;
  listener.Create(8, 0, false);
  listener.Wait();
  EXPECT_THAT(Logged(), ElementsAre(CREATING, CANNOT_OPEN, EXITING));
}

TEST_F(NotificationTest, ListenerHandlesMessagesInOrderAndReconnects) {
  NotificationService service;
  listener.Create(8, 0, false);
  service.SendBytes(test::Scanned("/shares/Vol") + std::string(4, '\0') +
                    test::Purged("/shares/Vol") + std::string(4, '\0') + "<noise/>" +
                    std::string(4, '\0'));
  service.CloseClient();
  service.Send("<Other about=\"ORVANotification\"/>");
  service.Send(End("/shares/Vol"));
  service.CloseClient();
  service.AwaitClient();
  service.Stop();
  listener.Wait();
  EXPECT_THAT(state->events, ElementsAre("scanned /shares/Vol/", "purged /shares/Vol/",
                                         "transcoded /shares/Vol/"));
  EXPECT_THAT(Logged(),
              ElementsAre(CREATING, READING, Info(":: Scanned"), Info(":: Purged "), CREATING,
                          READING, Error("ERROR ! Node name = Other"), Info(":: End "), CREATING,
                          READING, CREATING, CANNOT_OPEN, EXITING));
}

TEST_F(NotificationTest, FailedMessageIsLoggedAndTheNextIsHandled) {
  NotificationService service;
  listener.Create(8, 0, false);
  service.Send(Notification("Plugged", ""));
  service.Send(test::Scanned("/shares/Vol"));
  service.CloseClient();
  service.Stop();
  listener.Wait();
  EXPECT_THAT(state->events, ElementsAre("scanned /shares/Vol/"));
  const Log lines = Logged();
  ASSERT_GE(lines.size(), 4U);
  EXPECT_EQ(Error("").priority, lines[2].priority);
  EXPECT_THAT(lines[2].text, StartsWith("MessageProcessor:: basic_string::at"));
  EXPECT_EQ(Info(":: Scanned"), lines[3]);
}

TEST_F(StatesTest, UnusableMasterIsLoggedAsTheFailureOfTheMessage) {
  MakeDirectory("/shares/Vol");
  std::filesystem::remove_all("/shares/.zophotos");
  std::ofstream("/shares/.zophotos") << "in the way";
  NotificationService service;
  NotificationListener listener;
  listener.Create(8, 0, false);
  service.Send(test::Scanned("/shares/Vol"));
  service.CloseClient();
  service.Stop();
  listener.Wait();
  EXPECT_THAT(Logged(), ::testing::Contains(
                            Error("MessageProcessor:: Invalid DB location : '/shares/.zophotos'")));
  EXPECT_EQ(State::DEFAULT, CurrentType());
}

} // namespace
} // namespace orva::test

#include "commandline/UsageError.h"
#include "orva-notify/Client.h"
#include "orva-notify/CommandLine.h"
#include "orva-notify/Control.h"
#include "orva-notify/MountInfo.h"
#include "orva-notify/Notification.h"
#include "orva-notify/VolumeMemory.h"

#include "NotifyTest.h"

#include "orvautil/ClientSocket.h"
#include "orvautil/Core.h"
#include "orvautil/Decodestring.h"

#include "support/Programs.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

namespace {

using namespace orva;
using namespace orva::notify;
using namespace orva::test;
using core::ORVA_NOTIFICATION_SOCKET;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::Pair;

TEST(Notification, NamesTheEventAndTheMountPoint) {
  EXPECT_EQ(Compose(Event::Plugged, "/shares/Photos"),
            R"(<ORVANotification Name="Plugged" MountPoint="/shares/Photos"/>)");
  EXPECT_EQ(Compose(Event::Unplugged, "/shares/Photos"),
            R"(<ORVANotification Name="Unplugged" MountPoint="/shares/Photos"/>)");
  EXPECT_EQ(Compose(Event::Scanned, "/shares/Photos"),
            R"(<ORVANotification Name="Scanned" MountPoint="/shares/Photos"/>)");
  EXPECT_EQ(Compose(Event::End, "/shares/Photos"),
            R"(<ORVANotification Name="End" MountPoint="/shares/Photos"/>)");
  EXPECT_EQ(Compose(Event::Purged, "/shares/Photos"),
            R"(<ORVANotification Name="Purged" MountPoint="/shares/Photos"/>)");
}

TEST(Notification, GivesATranscodedBatchItsProfile) {
  EXPECT_EQ(Compose(Event::TranscodedBatch, "/shares/Photos/"),
            R"(<ORVANotification Name="TranscodedBatch" MountPoint="/shares/Photos/">)"
            "<profile>cb62bbdd389b48898f2e5244977cb2c5</profile></ORVANotification>");
}

TEST(Notification, EncodesWhatIsSpecialInXmlOrInTheEncoding) {
  EXPECT_EQ(Compose(Event::End, "/shares/a b%41&<\">'+\n\xC3\xA4"),
            "<ORVANotification Name=\"End\" "
            "MountPoint=\"/shares/a%20b%2541%26%3C%22%3E%27%2B%0A%C3%A4\"/>");
}

TEST(Notification, EveryByteOfAMountPointIsDecodedAgain) {
  std::string mountPoint = "/";
  for (int byte = 1; byte < 256; ++byte) {
    mountPoint += static_cast<char>(byte);
  }
  const std::string message = Compose(Event::Plugged, mountPoint);
  const std::string start = R"(<ORVANotification Name="Plugged" MountPoint=")";
  ASSERT_TRUE(message.starts_with(start));
  const auto end = message.find('"', start.size());
  EXPECT_EQ(util::Decodestring(message.substr(start.size(), end - start.size())), mountPoint);
}

TEST(Notification, IsFramedByFourZeroBytes) {
  EXPECT_EQ(Frame("<a/>"), std::string("<a/>\0\0\0\0", 8));
}

TEST(Notification, SaysThatAVolumeIsAPlainDirectory) {
  EXPECT_EQ(
      Compose(
          {.event = Event::Plugged, .mountPoint = "/shares/Photos", .kind = VolumeKind::Directory}),
      R"(<ORVANotification Name="Plugged" MountPoint="/shares/Photos" Kind="directory"/>)");
  EXPECT_EQ(
      Compose(
          {.event = Event::Scanned, .mountPoint = "/shares/Photos", .kind = VolumeKind::Directory}),
      Compose(Event::Scanned, "/shares/Photos"));
}

TEST(Notification, IsRecognizedIfItIsComposedHere) {
  for (const Event event : {Event::Plugged, Event::Unplugged, Event::Scanned,
                            Event::TranscodedBatch, Event::End, Event::Purged}) {
    const auto announcement = Recognize(Compose(event, "/shares/a \"b\"&\xFF"));
    ASSERT_TRUE(announcement);
    EXPECT_EQ(announcement->event, event);
    EXPECT_EQ(announcement->mountPoint, "/shares/a \"b\"&\xFF");
    EXPECT_EQ(announcement->kind, VolumeKind::Mount);
  }
  const auto directory = Recognize(
      Compose({.event = Event::Plugged, .mountPoint = "/a", .kind = VolumeKind::Directory}));
  ASSERT_TRUE(directory);
  EXPECT_EQ(directory->kind, VolumeKind::Directory);

  const std::string message = Compose(Event::End, "/shares/A");
  for (const std::string& other :
       {std::string(), std::string("<a/>"), message + " ", message.substr(0, message.size() - 1),
        message.substr(0, message.find("/shares")),
        std::string("<ORVANotification Name=\"End\" MountPoint=\"/a b\"/>")}) {
    EXPECT_EQ(Recognize(other), std::nullopt) << other;
  }
}

TEST(Client, HasNotHandledWhatItLeavesUnreadWhenItHangsUp) {
  for (const bool leavesMark : {false, true}) {
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends), 0);
    Client client{util::FileDescriptor(ends[0]), 1};
    util::FileDescriptor reader(ends[1]);
    client.Queue(std::make_shared<const std::string>("message"));
    const auto handling = std::make_shared<Handling>();
    client.QueueMark(handling);
    std::array<char, 64> input{};
    if (leavesMark) {
      ASSERT_EQ(read(reader.Get(), input.data(), input.size()), 7);
      client.SendQueued();
    }
    EXPECT_TRUE(client.AwaitsReader());
    reader.Reset();
    client.SendQueued();
    EXPECT_EQ(handling->handled, 0U);
    client.DiscardInput();
    EXPECT_FALSE(client.IsOpen());
  }
}

/// The names of the events with their mount points, in short.
std::vector<std::string> Texts(const std::vector<Announcement>& announcements) {
  std::vector<std::string> texts;
  for (const auto& announcement : announcements) {
    const std::string message = Compose(announcement);
    const auto start = message.find("Name=") + 6;
    texts.push_back(message.substr(start, message.find('"', start) - start) + ' ' +
                    announcement.mountPoint +
                    (announcement.kind == VolumeKind::Directory ? " directory" : ""));
  }
  return texts;
}

TEST(VolumeMemory, ReplaysPluggedThenScannedThenEnd) {
  VolumeMemory memory;
  EXPECT_THAT(Texts(memory.Replay()), ElementsAre());
  memory.Remember({Event::Plugged, "/shares/B"});
  memory.Remember({Event::Scanned, "/shares/B"});
  memory.Remember({Event::End, "/shares/B"});
  memory.Remember({Event::Plugged, "/shares/C"});
  memory.Remember({Event::Plugged, "/shares/A"});
  memory.Remember({Event::Scanned, "/shares/A"});
  EXPECT_THAT(Texts(memory.Replay()),
              ElementsAre("Plugged /shares/B", "Plugged /shares/C", "Plugged /shares/A",
                          "Scanned /shares/B", "Scanned /shares/A", "End /shares/B"));
  EXPECT_THAT(Texts(memory.Ends()), ElementsAre("End /shares/B"));
}

TEST(VolumeMemory, AVolumeThatIsMergedCountsAsScanned) {
  for (const Event event : {Event::TranscodedBatch, Event::End, Event::Purged}) {
    VolumeMemory memory;
    memory.Remember({Event::Plugged, "/shares/A"});
    memory.Remember({event, "/shares/A"});
    EXPECT_THAT(Texts(memory.Replay()),
                ElementsAre("Plugged /shares/A", "Scanned /shares/A", "End /shares/A"));
  }
}

TEST(VolumeMemory, ForgetsAnUnpluggedVolume) {
  VolumeMemory memory;
  memory.Remember({Event::Plugged, "/shares/A"});
  memory.Remember({Event::End, "/shares/A"});
  EXPECT_TRUE(memory.Remember({Event::Unplugged, "/shares/A"}));
  EXPECT_TRUE(memory.Remember({Event::Unplugged, "/shares/A"}));
  EXPECT_THAT(Texts(memory.Replay()), ElementsAre());
  memory.Remember({Event::Plugged, "/shares/A"});
  EXPECT_THAT(Texts(memory.Replay()), ElementsAre("Plugged /shares/A"));
}

TEST(VolumeMemory, DoesNotPlugAVolumeThatWasNotPlugged) {
  VolumeMemory memory;
  memory.Remember({Event::Scanned, "/shares/A"});
  EXPECT_THAT(Texts(memory.Replay()), ElementsAre("Scanned /shares/A"));
}

TEST(VolumeMemory, TheFirstPluggedSaysWhatTheVolumeIs) {
  VolumeMemory memory;
  memory.Remember({Event::Plugged, "/shares/A", VolumeKind::Directory});
  memory.Remember({Event::Plugged, "/shares/A"});
  EXPECT_THAT(Texts(memory.Replay()), ElementsAre("Plugged /shares/A directory"));
}

TEST(VolumeMemory, ASeparatorAtTheEndMakesNoDifferenceAndTwoDo) {
  VolumeMemory memory;
  memory.Remember({Event::Plugged, "/shares/A"});
  memory.Remember({Event::Scanned, "/shares/A/"});
  memory.Remember({Event::Plugged, "/shares/A//"});
  EXPECT_THAT(Texts(memory.Replay()),
              ElementsAre("Plugged /shares/A", "Plugged /shares/A//", "Scanned /shares/A"));
  memory.Remember({Event::Unplugged, "/shares/A/"});
  EXPECT_THAT(Texts(memory.Replay()), ElementsAre("Plugged /shares/A//"));
}

TEST(VolumeMemory, HoldsAsManyVolumesAsTheDaemon) {
  VolumeMemory memory;
  for (std::size_t i = 0; i < VolumeMemory::MAXIMUM_VOLUMES; ++i) {
    ASSERT_TRUE(memory.Remember({Event::Plugged, "/shares/" + std::to_string(i)}));
  }
  EXPECT_FALSE(memory.Remember({Event::Plugged, "/shares/more"}));
  EXPECT_TRUE(memory.Remember({Event::Scanned, "/shares/7"}));
  EXPECT_EQ(memory.Replay().size(), VolumeMemory::MAXIMUM_VOLUMES + 1);
  EXPECT_TRUE(memory.Remember({Event::Unplugged, "/shares/8"}));
  EXPECT_TRUE(memory.Remember({Event::Plugged, "/shares/more"}));
}

TEST(VolumeMemory, HoldsAsManyBytesOfMountPointsAsTheDaemon) {
  VolumeMemory memory;
  const std::string half(VolumeMemory::MAXIMUM_BYTES / 2, 'x');
  EXPECT_TRUE(memory.Remember({Event::Plugged, half}));
  EXPECT_FALSE(memory.Remember({Event::Plugged, half + "y"}));
  EXPECT_TRUE(memory.Remember({Event::Plugged, "y" + half.substr(1)}));
  EXPECT_FALSE(memory.Remember({Event::Plugged, "z"}));
}

TEST(VolumeMemory, AnEmptyMountPointNamesNoVolume) {
  VolumeMemory memory;
  EXPECT_TRUE(memory.Remember({Event::Scanned, ""}));
  EXPECT_THAT(Texts(memory.Replay()), ElementsAre());
}

TEST(CommandLine, KnowsEachEvent) {
  const std::vector<std::pair<std::string, Event>> words = {
      {"plugged", Event::Plugged}, {"unplugged", Event::Unplugged},
      {"scanned", Event::Scanned}, {"transcoded", Event::TranscodedBatch},
      {"end", Event::End},         {"purged", Event::Purged}};
  for (const auto& [word, event] : words) {
    const auto command = ParseCommandLine({"send", word, "/shares/A"});
    ASSERT_TRUE(command) << word;
    EXPECT_EQ(command->action, CommandLine::Action::Send);
    EXPECT_EQ(command->event, event) << word;
    EXPECT_EQ(command->mountPoint, "/shares/A");
  }
}

TEST(CommandLine, TakesOptionsBeforeAndAfterTheOperands) {
  const auto command =
      ParseCommandLine({"send", "--clients", "3", "scanned", "/shares/A", "--wait", "7"});
  ASSERT_TRUE(command);
  EXPECT_EQ(command->event, Event::Scanned);
  EXPECT_EQ(command->mountPoint, "/shares/A");
  EXPECT_EQ(command->clients, 3U);
  EXPECT_EQ(command->wait, std::chrono::seconds(7));

  const auto raw = ParseCommandLine({"send", "--raw", "-"});
  ASSERT_TRUE(raw);
  EXPECT_EQ(raw->event, std::nullopt);
  EXPECT_EQ(raw->rawFile, "-");
  EXPECT_EQ(raw->wait, std::chrono::seconds(10));

  EXPECT_TRUE(ParseCommandLine({"send", "end", "/shares/A", "--handled"})->handled);
  EXPECT_FALSE(ParseCommandLine({"send", "end", "/shares/A"})->handled);
  EXPECT_TRUE(ParseCommandLine({"serve", "--watch"})->watch);
  EXPECT_THAT(
      ParseCommandLine({"serve", "--volume", "/shares/A", "--volume=/shares/b c"})->directories,
      ElementsAre("/shares/A", "/shares/b c"));
  EXPECT_FALSE(ParseCommandLine({"serve"})->watch);
  EXPECT_EQ(ParseCommandLine({"serve"})->action, CommandLine::Action::Serve);
  EXPECT_EQ(ParseCommandLine({"drop"})->action, CommandLine::Action::Drop);
  EXPECT_EQ(ParseCommandLine({"send", "--help"}), std::nullopt);
}

TEST(CommandLine, TakesDecimalNumbersAndTheLastOneCounts) {
  const auto command =
      ParseCommandLine({"drop", "--clients=1", "--clients=0100000", "--wait", "010"});
  ASSERT_TRUE(command);
  EXPECT_EQ(command->clients, 100'000U);
  EXPECT_EQ(command->wait, std::chrono::seconds(10));
}

TEST(CommandLine, SaysWhatIsWrong) {
  const std::vector<std::pair<Arguments, std::string>> wrong = {
      {{}, "a command is required"},
      {{"listen"}, "unknown command: 'listen'"},
      {{"sned"}, "unknown command: 'sned'; did you mean 'send'?"},
      {{"send"}, "EVENT and MOUNT are required, or --raw FILE"},
      {{"send", "plugged"}, "MOUNT is required"},
      {{"send", "Plugged", "/shares/A"}, "unknown event: 'Plugged'; did you mean 'plugged'?"},
      {{"send", "exploded"}, "unknown event: 'exploded'"},
      {{"send", "plugged", ""}, "MOUNT must be an absolute path such as /shares/Photos, not ''"},
      {{"send", "plugged", "A"}, "MOUNT must be an absolute path such as /shares/Photos, not 'A'"},
      {{"send", "plugged", "/a", "/b"}, "unexpected argument: '/b'"},
      {{"send", "--raw"}, "option --raw needs a value"},
      {{"send", "--raw", ""}, "option --raw must not be empty"},
      {{"send", "--raw=", "f"}, "option --raw needs a value"},
      {{"send", "--raw", "f", "plugged"}, "EVENT and --raw cannot be combined"},
      {{"send", "--watch", "plugged", "/a"}, "unknown option: --watch"},
      {{"serve", "--clients", "1"}, "unknown option: --clients"},
      {{"serve", "--watch=no"}, "option --watch takes no value"},
      {{"serve", "all"}, "unexpected argument: 'all'"},
      {{"serve", "--volume"}, "option --volume needs a value"},
      {{"serve", "--volume", "/shares/A", "/shares/B"}, "unexpected argument: '/shares/B'"},
      {{"serve", "--volume", "Photos"}, "option --volume must be an absolute path, not 'Photos'"},
      {{"serve", "--volume", ""}, "option --volume must be an absolute path, not ''"},
      {{"serve", "--volume", "/"}, "option --volume must be directly below /shares, not '/'"},
      {{"serve", "--volume", "/shares"},
       "option --volume must be directly below /shares, not '/shares'"},
      {{"serve", "--volume", "/srv/Photos"},
       "option --volume must be directly below /shares, not '/srv/Photos'"},
      {{"serve", "--volume", "/shares/A/B"},
       "option --volume must be directly below /shares, not '/shares/A/B'"},
      {{"serve", "--volume", "/shares/A/"},
       "option --volume must not contain '.', '..', '//' or a '/' at the end: '/shares/A/'"},
      {{"serve", "--volume", "/shares/.."},
       "option --volume must not contain '.', '..', '//' or a '/' at the end: '/shares/..'"},
      {{"serve", "--volume", "/shares//A"},
       "option --volume must not contain '.', '..', '//' or a '/' at the end: '/shares//A'"},
      {{"drop", "--handled"}, "unknown option: --handled"},
      {{"drop", "--clients"}, "option --clients needs a value"},
      {{"drop", "--clients", "2x"}, "option --clients takes a number from 0 to 100000, not '2x'"},
      {{"drop", "--clients", "0x2"}, "option --clients takes a number from 0 to 100000, not '0x2'"},
      {{"drop", "--wait", "-1"}, "option --wait takes a number from 0 to 100000, not '-1'"},
      {{"drop", "--wait", "100001"},
       "option --wait takes a number from 0 to 100000, not '100001'"}};
  for (const auto& [arguments, message] : wrong) {
    try {
      ParseCommandLine(arguments);
      ADD_FAILURE() << "accepted instead of: " << message;
    } catch (const commandline::UsageError& error) {
      EXPECT_EQ(error.what(), message);
    }
  }
}

Volumes VolumesOf(const std::string& table) {
  std::istringstream lines(table);
  return ReadVolumes(lines);
}

TEST(MountInfo, HoldsOnlyWhatIsDirectlyBelowShares) {
  EXPECT_THAT(VolumesOf("22 1 8:1 / / rw - ext4 /dev/root rw\n"
                        "30 22 0:5 / /shares rw - tmpfs none rw\n"
                        "31 30 0:6 / /shares/B rw shared:4 - tmpfs none rw\n"
                        "32 31 0:7 / /shares/B/inner rw - tmpfs none rw\n"
                        "33 22 0:8 / /sharesX/C rw - tmpfs none rw\n"
                        "34 30 0:9 /sub /shares/A ro - ext4 /dev/sda rw\n"),
              ElementsAre(Pair("/shares/A", MountIdentity{34, "0:9"}),
                          Pair("/shares/B", MountIdentity{31, "0:6"})));
}

TEST(MountInfo, SharesAndTheDirectoriesAboveItContainTheVolumes) {
  for (const char* const path : {"/", "/shares", "/shares/", "//shares/./", "/shares/A/.."}) {
    EXPECT_TRUE(ContainsShares(path)) << path;
  }
  for (const char* const path : {"/share", "/shares/A", "/shares2/", "/srv/shares", "/shares/A/"}) {
    EXPECT_FALSE(ContainsShares(path)) << path;
  }
}

TEST(MountInfo, DecodesTheKernelsEscapes) {
  EXPECT_THAT(VolumesOf("31 1 0:6 /a\\040b /shares/My\\040Photos\\011\\012\\134040 rw - tmpfs x y\n"
                        "32 1 0:6 / /shares/tail\\04 rw - tmpfs x y\n"
                        "33 1 0:6 / /shares/form\ffeed rw - tmpfs x y\n"),
              ElementsAre(Pair("/shares/My Photos\t\n\\040", MountIdentity{31, "0:6"}),
                          Pair("/shares/form\ffeed", MountIdentity{33, "0:6"}),
                          Pair("/shares/tail\\04", MountIdentity{32, "0:6"})));
}

TEST(MountInfo, HoldsTheTopMountAndNoHiddenOnes) {
  EXPECT_THAT(VolumesOf("31 1 0:6 / /shares/A rw - tmpfs x y\n"
                        "32 1 0:7 / /shares rw - tmpfs x y\n"
                        "33 32 0:8 / /shares/B rw - tmpfs x y\n"
                        "34 33 0:9 / /shares/B rw - tmpfs x y\n"),
              ElementsAre(Pair("/shares/B", MountIdentity{34, "0:9"})));
}

TEST(MountInfo, SkipsMalformedLines) {
  EXPECT_THAT(VolumesOf("\nnonsense\n31 1 0:6\n32 1 0:6 / /shares/A rw - tmpfs x y\n"),
              ElementsAre(Pair("/shares/A", MountIdentity{32, "0:6"})));
}

TEST(MountInfo, AnotherMountOnAMountPointIsUnpluggedAndPlugged) {
  const VolumeChanges changes =
      Compare({{"/shares/A", {1, "8:1"}}, {"/shares/B", {2, "8:2"}}, {"/shares/C", {3, "8:3"}}},
              {{"/shares/B", {2, "8:2"}}, {"/shares/C", {7, "8:3"}}, {"/shares/D", {8, "8:4"}}});
  EXPECT_THAT(changes.unplugged, ElementsAre("/shares/A", "/shares/C"));
  EXPECT_THAT(changes.plugged, ElementsAre("/shares/C", "/shares/D"));
}

TEST(MountInfo, AnotherDiskWithTheNumberOfAnEarlierMountIsUnpluggedAndPlugged) {
  const VolumeChanges changes = Compare({{"/shares/A", {1, "8:1"}}}, {{"/shares/A", {1, "8:17"}}});
  EXPECT_THAT(changes.unplugged, ElementsAre("/shares/A"));
  EXPECT_THAT(changes.plugged, ElementsAre("/shares/A"));
}

TEST_F(OrvaNotify, SendsEveryMessageToEachClient) {
  Serve();
  NotifyClient one;
  NotifyClient two;
  const Answer scanned = RunNotify({"send", "scanned", "/shares/My Photos"});
  EXPECT_EQ(scanned.status, 0);
  EXPECT_EQ(scanned.line, "sent to 2 clients");
  EXPECT_EQ(RunNotify({"send", "purged", "/shares/B"}).line, "sent to 2 clients");
  for (NotifyClient* const client : {&one, &two}) {
    EXPECT_EQ(client->ReadMessage(), Compose(Event::Scanned, "/shares/My Photos"));
    EXPECT_EQ(client->ReadMessage(), Compose(Event::Purged, "/shares/B"));
  }
}

TEST_F(OrvaNotify, PrintsALineForEachEvent) {
  Serve();
  NotifyClient client;
  EXPECT_EQ(service_->ReadLine(), "client 1 connected");
  RunNotify({"send", "end", "/shares/A"});
  EXPECT_EQ(service_->ReadLine(), "sent to 1 client: " + Compose(Event::End, "/shares/A"));
  client.Close();
  EXPECT_EQ(service_->ReadLine(), "client 1 gone");
  RunNotify({"send", "--raw", FileWith("a\nb\x1B")});
  EXPECT_EQ(service_->ReadLine(), "sent to 0 clients: a.b.");
  service_->Signal(SIGTERM);
  EXPECT_EQ(service_->ReadLine(), "stopped");
}

TEST_F(OrvaNotify, SendsRawBytesFromAFileAndFromStandardInput) {
  Serve();
  NotifyClient client;
  const std::string bytes("\x01\0\0\0<a>\xFF\n", 9);
  const std::string file = FileWith(bytes);
  EXPECT_EQ(RunNotify({"send", "--raw", file}).status, 0);
  EXPECT_EQ(client.ReadMessage(), bytes);
  EXPECT_EQ(RunNotify({"send", "--raw", "-"}, file).status, 0);
  EXPECT_EQ(client.ReadMessage(), bytes);
  EXPECT_EQ(RunNotify({"send", "--raw", "/dev/null"}).status, 0);
  EXPECT_EQ(client.ReadMessage(), "");
}

TEST_F(OrvaNotify, ARawFileThatCannotBeReadIsAnError) {
  Serve();
  const Answer outcome = RunNotify({"send", "--raw", folder_ + "/absent"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.line,
            "orva-notify: cannot read " + folder_ + "/absent: No such file or directory");
  EXPECT_EQ(RunNotify({"send", "--raw", folder_}).line,
            "orva-notify: cannot read " + folder_ + ": Is a directory");
}

TEST_F(OrvaNotify, SendFailsWhenNoServiceListens) {
  const Answer outcome = RunNotify({"send", "plugged", "/shares/A"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.line, "orva-notify: no orva-notify serves " + ORVA_NOTIFICATION_SOCKET +
                              ": No such file or directory");
}

TEST_F(OrvaNotify, SendSaysThatItLacksPermission) {
  Serve();
  const std::string socket = ORVA_NOTIFICATION_SOCKET + ".control";
  std::filesystem::permissions(socket, std::filesystem::perms::none);
  const Outcome outcome = test::Run({"setpriv", "--bounding-set=-all", "--inh-caps=-all",
                                     ProgramPath("orva-notify"), "send", "plugged", "/shares/A"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.output, "");
  EXPECT_EQ(outcome.error, "orva-notify: permission denied for the control socket " + socket +
                               "; run it as root\n");
}

TEST_F(OrvaNotify, EachCommandsHelpSaysWhenItReturns) {
  const std::string send = test::Run({ProgramPath("orva-notify"), "send", "--help"}).output;
  EXPECT_THAT(send, testing::HasSubstr("\nReturns when the message is queued for every client"));
  EXPECT_THAT(send, testing::Not(testing::HasSubstr("connections are closed")));
  const std::string drop = test::Run({ProgramPath("orva-notify"), "drop", "--help"}).output;
  EXPECT_THAT(drop, testing::HasSubstr("\nReturns when all connections are closed"));
  EXPECT_THAT(drop, testing::Not(testing::HasSubstr("queued")));
}

TEST_F(OrvaNotify, TheExitStatusDistinguishesWrongUsageFromFailure) {
  const Answer wrong = RunNotify({"send", "exploded", "/shares/A"});
  EXPECT_EQ(wrong.status, 2);
  EXPECT_EQ(wrong.line, "orva-notify: unknown event: 'exploded'");
  const Answer help = RunNotify({"--help"});
  EXPECT_EQ(help.status, 0);
  EXPECT_THAT(help.line, HasSubstr("notification service"));
  const Answer version = RunNotify({"--version"});
  EXPECT_EQ(version.status, 0);
  EXPECT_EQ(version.line, "orva-notify " PROGRAM_VERSION);
}

TEST_F(OrvaNotify, WaitsForTheGivenNumberOfClients) {
  Serve();
  NotifyClient one;
  const Answer tooFew =
      RunNotify({"send", "--clients", "2", "--wait", "0", "plugged", "/shares/TooEarly"});
  EXPECT_EQ(tooFew.status, 1);
  EXPECT_EQ(tooFew.line, "orva-notify: fewer than 2 clients connected within 0 s");

  Program waiting(NotifyCommand({"send", "--clients", "2", "plugged", "/shares/A"}));
  EXPECT_EQ(RunNotify({"send", "scanned", "/shares/B"}).line, "sent to 1 client");
  NotifyClient two;
  EXPECT_EQ(waiting.ReadLine(), "sent to 2 clients");
  EXPECT_EQ(waiting.WaitForEnd(), 0);
  EXPECT_EQ(one.ReadMessage(), Compose(Event::Scanned, "/shares/B"));
  EXPECT_EQ(one.ReadMessage(), Compose(Event::Plugged, "/shares/A"));
  EXPECT_EQ(two.ReadMessage(), Compose(Event::Scanned, "/shares/B")); // remembered for it
  EXPECT_EQ(two.ReadMessage(), Compose(Event::Plugged, "/shares/A"));
}

TEST_F(OrvaNotify, DropClosesTheClientsAndTheServiceListensOn) {
  Serve();
  NotifyClient one;
  NotifyClient two;
  const Answer outcome = RunNotify({"drop"});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.line, "dropped 2 clients");
  EXPECT_EQ(one.ReadMessage(), "(end)");
  EXPECT_EQ(two.ReadMessage(), "(end)");
  NotifyClient three;
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 1 client");
  EXPECT_EQ(three.ReadMessage(), Compose(Event::End, "/shares/A"));
}

TEST_F(OrvaNotify, StopsCleanlyOnBothSignals) {
  for (const int signal : {SIGTERM, SIGINT}) {
    Serve();
    NotifyClient client;
    service_->Signal(signal);
    EXPECT_EQ(service_->WaitForEnd(), 0);
    EXPECT_EQ(client.ReadMessage(), "(end)");
    EXPECT_FALSE(std::filesystem::exists(ORVA_NOTIFICATION_SOCKET));
    EXPECT_FALSE(std::filesystem::exists(ControlAddress(ORVA_NOTIFICATION_SOCKET)));
  }
}

TEST_F(OrvaNotify, ReplacesTheSocketOfAServiceThatWasKilled) {
  Serve();
  service_->Signal(SIGKILL);
  EXPECT_EQ(service_->WaitForEnd(), 128 + SIGKILL);
  ASSERT_TRUE(std::filesystem::exists(ORVA_NOTIFICATION_SOCKET));
  Serve();
  EXPECT_TRUE(NotifyClient().IsConnected());
}

TEST_F(OrvaNotify, FailsWhenAnotherServiceListens) {
  Serve();
  const Answer second = RunNotify({"serve"});
  EXPECT_EQ(second.status, 1);
  EXPECT_EQ(second.line, "orva-notify: cannot listen on " +
                             ControlAddress(ORVA_NOTIFICATION_SOCKET) +
                             ": another service listens there; end it first (the installed "
                             "one: systemctl stop orva-notify)");
  NotifyClient client;
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 1 client");
}

TEST_F(OrvaNotify, DoesNotReplaceAFileThatIsNotASocket) {
  std::filesystem::create_directories(
      std::filesystem::path(ORVA_NOTIFICATION_SOCKET).parent_path());
  std::ofstream(ORVA_NOTIFICATION_SOCKET) << "precious";
  const Answer outcome = RunNotify({"serve"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.line, "orva-notify: cannot listen on " + ORVA_NOTIFICATION_SOCKET +
                              ": there is a file that is not a socket; remove it");
  EXPECT_EQ(std::filesystem::file_size(ORVA_NOTIFICATION_SOCKET), 8U);
}

TEST_F(OrvaNotify, FailsWhenTheDirectoryCannotBeCreated) {
  const auto directory = std::filesystem::path(ORVA_NOTIFICATION_SOCKET).parent_path();
  std::filesystem::remove_all(directory);
  std::ofstream(directory) << "a file";
  const Answer outcome = RunNotify({"serve"});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.line, "orva-notify: cannot create " + directory.native() + ": Not a directory");
}

TEST_F(OrvaNotify, KeepsAMessageForAClientThatReadsLate) {
  Serve();
  NotifyClient client;
  const std::string large(MAXIMUM_QUEUED_BYTES / 2, 'x');
  EXPECT_EQ(RunNotify({"send", "--raw", FileWith(large)}).line, "sent to 1 client");
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 1 client");
  EXPECT_TRUE(client.ReadMessage() == large);
  EXPECT_EQ(client.ReadMessage(), Compose(Event::End, "/shares/A"));
}

TEST_F(OrvaNotify, DropsAClientThatDoesNotRead) {
  Serve();
  NotifyClient idle;
  const std::string file = FileWith(std::string(MAXIMUM_QUEUED_BYTES / 4 * 3, 'x'));
  EXPECT_EQ(RunNotify({"send", "--raw", file}).line, "sent to 1 client");
  EXPECT_EQ(RunNotify({"send", "--raw", file}).line, "sent to 0 clients");
  EXPECT_THAT(service_->ReadLineWith("does not read"), HasSubstr("client 1 does not read"));
  EXPECT_EQ(idle.ReadMessage(), "(end within a message)");
  NotifyClient next;
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 1 client");
}

TEST_F(OrvaNotify, RefusesAMessageThatIsTooLong) {
  Serve();
  const std::string file = FileWith("");
  std::filesystem::resize_file(file, MAXIMUM_QUEUED_BYTES + 1);
  const Answer outcome = RunNotify({"send", "--raw", file});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_EQ(outcome.line,
            "orva-notify: a message of 67108865 bytes is too long, 67108864 are allowed");
}

TEST_F(OrvaNotify, SurvivesMalformedRequests) {
  Serve();
  const std::vector<std::string> texts = {"hello\n", "send 0 99999999999\n", "send 0 1\nxy",
                                          std::string(64, 'x')};
  for (const auto& text : texts) {
    util::ClientSocket socket(util::Socket::Address(ControlAddress(ORVA_NOTIFICATION_SOCKET)),
                              false);
    ASSERT_EQ(socket.Write(text.data(), static_cast<unsigned>(text.size())), text.size());
    ASSERT_TRUE(IsReadable(socket.Descriptor(), Clock::now() + DEADLINE)) << text;
    char answer = 0;
    EXPECT_EQ(socket.Read(&answer, 1), 0U) << text;
  }
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 0 clients");
}

TEST_F(OrvaNotify, ContinuesWhenItsOutputIsClosed) {
  Serve();
  service_->CloseOutput();
  NotifyClient client;
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 1 client");
  EXPECT_EQ(RunNotify({"send", "end", "/shares/B"}).line, "sent to 1 client");
}

TEST_F(OrvaNotify, ContinuesWhenDescriptorsRunOut) {
  service_ = std::make_unique<Program>(Arguments{
      "/bin/sh", "-c", "ulimit -n 12; exec " + test::ProgramPath("orva-notify") + " serve"});
  ASSERT_EQ(service_->ReadLine(), "listening on " + ORVA_NOTIFICATION_SOCKET);
  {
    // The sanitizer opens a pipe when it checks the first object of a class. That must happen now,
    // while there are free descriptors.
    const NotifyClient first;
    EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 1 client");
  }
  EXPECT_EQ(service_->ReadLineWith("gone"), "client 1 gone");
  {
    const std::array<NotifyClient, 12> clients;
    EXPECT_THAT(service_->ReadLineWith("cannot take"),
                HasSubstr("cannot take another connection until one ends"));
  }
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 0 clients");
}

TEST_F(OrvaNotify, AnnouncesMountsAndUnmountsBelowShares) {
  Serve({"--watch"});
  NotifyClient client;
  {
    const TmpfsMount volume("/shares/My Photos");
    EXPECT_EQ(client.ReadMessage(), Compose(Event::Plugged, "/shares/My Photos"));
    EXPECT_EQ(service_->ReadLineWith("seen"), "plugged seen: /shares/My Photos");
    const TmpfsMount inner("/shares/My Photos/inner");
  }
  EXPECT_EQ(client.ReadMessage(), Compose(Event::Unplugged, "/shares/My Photos"));
  EXPECT_EQ(service_->ReadLineWith("seen"), "unplugged seen: /shares/My Photos");
}

TEST_F(OrvaNotify, AnnouncesMountedVolumesToANewClientFirst) {
  const TmpfsMount b("/shares/B");
  Serve({"--watch"});
  const TmpfsMount a("/shares/A");
  NotifyClient client;
  EXPECT_EQ(RunNotify({"send", "scanned", "/shares/A"}).line, "sent to 1 client");
  std::vector<std::string> messages{client.ReadMessage(), client.ReadMessage()};
  std::ranges::sort(messages);
  EXPECT_THAT(messages, ElementsAre(Compose(Event::Plugged, "/shares/A"),
                                    Compose(Event::Plugged, "/shares/B")));
  EXPECT_EQ(client.ReadMessage(), Compose(Event::Scanned, "/shares/A"));
}

TEST_F(OrvaNotify, AnnouncesAMountOnTopOfAnother) {
  const TmpfsMount lower("/shares/A");
  Serve({"--watch"});
  NotifyClient client;
  EXPECT_EQ(client.ReadMessage(), Compose(Event::Plugged, "/shares/A"));
  const TmpfsMount upper("/shares/A");
  EXPECT_EQ(client.ReadMessage(), Compose(Event::Unplugged, "/shares/A"));
  EXPECT_EQ(client.ReadMessage(), Compose(Event::Plugged, "/shares/A"));
}

TEST_F(OrvaNotify, AnnouncesNoMountsWithoutWatch) {
  const TmpfsMount before("/shares/A");
  Serve();
  NotifyClient client;
  const TmpfsMount after("/shares/B");
  EXPECT_EQ(RunNotify({"send", "end", "/shares/C"}).line, "sent to 1 client");
  EXPECT_EQ(client.ReadMessage(), Compose(Event::End, "/shares/C"));
}

} // namespace

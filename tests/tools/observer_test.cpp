#include "notifications/Observer.h"

#include "orva-notify/ListeningSocket.h"
#include "orva-notify/Notification.h"
#include "orvautil/MessageProcessor.h"

#include "system/Deadline.h"
#include "system/Messages.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <chrono>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace {

using namespace orva;
using namespace orva::test;
using notifications::Notification;
using notify::Frame;
using testing::ElementsAre;
using testing::IsEmpty;
using Lines = std::vector<std::string>;
using SteadyClock = std::chrono::steady_clock;

/// "Plugged /shares/A/ directory", or "Connected".
std::string Describe(const Notification& notification) {
  static const std::array names = {"Connected",       "Plugged", "Unplugged", "Scanned",
                                   "TranscodedBatch", "End",     "Purged"};
  return names.at(static_cast<std::size_t>(notification.event)) +
         (notification.mountPoint.empty() ? "" : ' ' + notification.mountPoint) +
         (notification.isDirectory ? " directory" : "");
}

/// An observer and the service that it connects to. The test is the service.
class ObserverTest : public testing::Test {
protected:
  static constexpr char ADDRESS[] = "/tmp/service/notification.sock";

  /// Listens, and waits until the observer is connected.
  void Start() {
    Listen();
    ASSERT_THAT(AwaitReceived(1), ElementsAre("Connected"));
    ASSERT_TRUE(Accept());
  }

  void Listen() { listener_.emplace(ADDRESS); }

  /// Accepts the connection of the observer, and reads its greeting.
  bool Accept() {
    client_ = listener_->Accept();
    std::array<char, 64> text{};
    const ssize_t size = recv(client_.Get(), text.data(), text.size(), 0);
    return size > 0 && std::string(text.data(), static_cast<std::size_t>(size)) == "observe\n";
  }

  void Send(const std::string& bytes) {
    EXPECT_EQ(send(client_.Get(), bytes.data(), bytes.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(bytes.size()));
  }

  void Disconnect() { client_.Reset(); }

  void Stop() {
    listener_.reset();
    client_.Reset();
  }

  /// What the observer reports, at least `count` notifications; fewer after the deadline.
  Lines AwaitReceived(std::size_t count) {
    Lines lines;
    const auto end = SteadyClock::now() + DEADLINE;
    while (lines.size() < count && SteadyClock::now() < end) {
      pollfd ready{.fd = observer_.Descriptor(), .events = POLLIN, .revents = 0};
      poll(&ready, 1, 1000);
      for (const Notification& notification : observer_.Receive()) {
        lines.push_back(Describe(notification));
      }
    }
    return lines;
  }

  notifications::Observer& Observer() { return observer_; }

private:
  std::optional<notify::ListeningSocket> listener_;
  util::FileDescriptor client_;
  notifications::Observer observer_{ADDRESS};
};

TEST_F(ObserverTest, ReportsEachEventWithItsMountPoint) {
  Start();
  Send(Frame(Plugged("/shares/A")) + Frame(Scanned("/shares/A/")) +
       Frame(TranscodedBatch("/shares/B")) + Frame(End("/shares/A")) + Frame(Purged("/shares/A")) +
       Frame(Unplugged("/shares/A")));
  EXPECT_THAT(AwaitReceived(6),
              ElementsAre("Plugged /shares/A/", "Scanned /shares/A/", "TranscodedBatch /shares/B/",
                          "End /shares/A/", "Purged /shares/A/", "Unplugged /shares/A/"));
}

TEST_F(ObserverTest, TellsAPlainDirectoryFromAMountPoint) {
  Start();
  Send(Frame(R"(<ORVANotification Name="Plugged" MountPoint="/shares/A" Kind="directory"/>)"));
  Send(Frame(R"(<ORVANotification Name="Plugged" MountPoint="/shares/B" Kind="other"/>)"));
  EXPECT_THAT(AwaitReceived(2), ElementsAre("Plugged /shares/A/ directory", "Plugged /shares/B/"));
}

TEST_F(ObserverTest, DecodesTheMountPoint) {
  Start();
  Send(Frame(Plugged("/shares/\xC3\xA4 %\"&<\xFF")));
  EXPECT_THAT(AwaitReceived(1), ElementsAre("Plugged /shares/\xC3\xA4 %\"&<\xFF/"));
}

TEST_F(ObserverTest, AMessageMayBeSplitAtEachByte) {
  Start();
  const std::string bytes = Frame(Plugged("/shares/A"));
  for (std::size_t split = 1; split < bytes.size(); ++split) {
    Send(bytes.substr(0, split));
    EXPECT_THAT(Observer().Receive(), IsEmpty()) << split;
    Send(bytes.substr(split));
    EXPECT_THAT(AwaitReceived(1), ElementsAre("Plugged /shares/A/")) << split;
  }
}

TEST_F(ObserverTest, BytesMayArriveOneByOne) {
  Start();
  const std::string bytes = Frame(Plugged("/shares/A")) + Frame(End("/shares/A"));
  Lines received;
  for (const char byte : bytes) {
    Send(std::string(1, byte));
    for (const Notification& notification : Observer().Receive()) {
      received.push_back(Describe(notification));
    }
  }
  EXPECT_THAT(received, ElementsAre("Plugged /shares/A/", "End /shares/A/"));
}

TEST_F(ObserverTest, ManyMessagesMayArriveAtOnce) {
  Start();
  constexpr std::size_t COUNT = 500;
  std::string bytes;
  Lines expected;
  for (std::size_t i = 0; i < COUNT; ++i) {
    const std::string volume = "/shares/" + std::to_string(i);
    bytes += Frame(Scanned(volume));
    expected.push_back("Scanned " + volume + "/");
  }
  Send(bytes);
  EXPECT_EQ(AwaitReceived(COUNT), expected);
}

TEST_F(ObserverTest, WhatIsNoNotificationIsSkipped) {
  Start();
  const Lines garbage = {"",
                         "no XML",
                         "<ORVANotification",
                         "<ORVANotification/>",
                         R"(<Other Name="Plugged" MountPoint="/shares/A"/>)",
                         R"(<ORVANotification Name="Plugged"/>)",
                         R"(<ORVANotification Name="Plugged" MountPoint=""/>)",
                         R"(<ORVANotification Name="Plugged" MountPoint="shares/A"/>)",
                         R"(<ORVANotification Name="plugged" MountPoint="/shares/A"/>)",
                         R"(<ORVANotification MountPoint="/shares/A"/>)",
                         R"(<?xml version="1.0"?><!DOCTYPE a [<!ENTITY b "c">]><a>&b;</a>)",
                         "\xFF\xFE\x01",
                         std::string("a\0b", 3)};
  for (const std::string& text : garbage) {
    Send(Frame(text) + Frame(End("/shares/A")));
    EXPECT_THAT(AwaitReceived(1), ElementsAre("End /shares/A/")) << text;
  }
}

TEST_F(ObserverTest, TheLongestMessageIsRead) {
  Start();
  const std::string begin = R"(<ORVANotification Name="End" MountPoint="/shares/A" Other=")";
  const std::string end = "\"/>";
  constexpr std::size_t LONGEST = util::MessageProcessor::MAXIMUM_MESSAGE_LENGTH;
  Send(Frame(begin + std::string(LONGEST - begin.size() - end.size(), 'x') + end));
  EXPECT_THAT(AwaitReceived(1), ElementsAre("End /shares/A/"));
}

TEST_F(ObserverTest, AMessageWithoutAnEndEndsTheConnection) {
  Start();
  Send(Frame(Plugged("/shares/A")) +
       std::string(util::MessageProcessor::MAXIMUM_MESSAGE_LENGTH + 1, 'x'));
  EXPECT_THAT(AwaitReceived(2), ElementsAre("Plugged /shares/A/", "Connected"));
  ASSERT_TRUE(Accept());
  Send(Frame(End("/shares/A")));
  EXPECT_THAT(AwaitReceived(1), ElementsAre("End /shares/A/"));
}

TEST_F(ObserverTest, ConnectsAgainAndForgetsHalfAMessage) {
  Start();
  const std::string bytes = Frame(Plugged("/shares/A"));
  Send(Frame(Scanned("/shares/A")) + bytes.substr(0, bytes.size() / 2));
  Disconnect();
  EXPECT_THAT(AwaitReceived(2), ElementsAre("Scanned /shares/A/", "Connected"));
  ASSERT_TRUE(Accept());
  Send(bytes);
  EXPECT_THAT(AwaitReceived(1), ElementsAre("Plugged /shares/A/"));
}

TEST_F(ObserverTest, ConnectsToAServiceThatIsStartedLater) {
  EXPECT_THAT(Observer().Receive(), IsEmpty()); // there is no directory either
  Start();
  Send(Frame(End("/shares/A")));
  EXPECT_THAT(AwaitReceived(1), ElementsAre("End /shares/A/"));
}

TEST_F(ObserverTest, ConnectsToAServiceThatIsStartedAgain) {
  for (int round = 0; round < 3; ++round) {
    Start();
    Stop();
    EXPECT_THAT(Observer().Receive(), IsEmpty());
  }
}

TEST_F(ObserverTest, ConnectsWhenTheDirectoryIsMadeAgain) {
  Start();
  Stop();
  EXPECT_THAT(Observer().Receive(), IsEmpty());
  std::filesystem::remove_all("/tmp/service");
  EXPECT_THAT(Observer().Receive(), IsEmpty());
  Start();
}

TEST_F(ObserverTest, ConnectsToTheSocketOfAProcessThatWasKilledWhenItIsReplaced) {
  {
    // Refuses connections: bound, and nobody listens.
    std::filesystem::create_directories("/tmp/service");
    const util::FileDescriptor dead(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const util::Socket::Address address(ADDRESS);
    ASSERT_EQ(bind(dead.Get(), address.Get(), address.Length()), 0);
  }
  EXPECT_THAT(Observer().Receive(), IsEmpty());
  Start();
}

TEST_F(ObserverTest, NeedsNoDirectoryForAnAbstractAddress) {
  notify::ListeningSocket listener("@observed");
  notifications::Observer observer("@observed");
  const auto end = SteadyClock::now() + DEADLINE;
  std::vector<Notification> received;
  while (received.empty() && SteadyClock::now() < end) {
    received = observer.Receive();
  }
  ASSERT_EQ(received.size(), 1U);
  EXPECT_EQ(Describe(received.front()), "Connected");
}

} // namespace

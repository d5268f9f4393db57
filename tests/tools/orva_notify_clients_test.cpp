// What the service remembers for a new client, observers, and requests that wait until a message is
// handled.

#include "NotifyTest.h"

#include "orva-notify/Notification.h"
#include "orva-notify/VolumeMemory.h"

#include "system/Messages.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <csignal>
#include <string>
#include <thread>
#include <vector>

namespace {

using namespace orva;
using namespace orva::test;
using notify::Event;
using notify::Request;
using testing::ElementsAre;
using testing::HasSubstr;

class OrvaNotifyReplay : public OrvaNotify {};
class OrvaNotifyObserver : public OrvaNotify {};
class OrvaNotifyHandled : public OrvaNotify {};

void Send(const std::string& message) {
  Ask({.message = message});
}

TEST_F(OrvaNotifyReplay, ANewClientIsToldWhatWasAnnouncedOfEachVolume) {
  Serve();
  for (const auto& message :
       {Plugged("/shares/B"), Plugged("/shares/A"), Scanned("/shares/B"), End("/shares/B"),
        Scanned("/shares/A"), TranscodedBatch("/shares/C"), Plugged("/shares/D")}) {
    Send(message);
  }
  NotifyClient client;
  EXPECT_THAT(client.ReadMessages(8),
              ElementsAre(Plugged("/shares/B"), Plugged("/shares/A"), Plugged("/shares/D"),
                          Scanned("/shares/B"), Scanned("/shares/A"), Scanned("/shares/C"),
                          End("/shares/B"), End("/shares/C")));
  Send(Purged("/shares/A"));
  EXPECT_EQ(client.ReadMessage(), Purged("/shares/A"));
}

TEST_F(OrvaNotifyReplay, TheCommandLineIsRememberedLikeAnyOtherProgram) {
  Serve();
  RunNotify({"send", "plugged", "/shares/My Photos"});
  RunNotify({"send", "end", "/shares/My Photos"});
  NotifyClient client;
  EXPECT_THAT(client.ReadMessages(3),
              ElementsAre(Plugged("/shares/My Photos"), Scanned("/shares/My Photos"),
                          End("/shares/My Photos")));
}

TEST_F(OrvaNotifyReplay, AnUnpluggedVolumeIsForgotten) {
  Serve();
  for (const auto& message :
       {Plugged("/shares/A"), End("/shares/A"), Unplugged("/shares/A"), Plugged("/shares/B")}) {
    Send(message);
  }
  NotifyClient client;
  Send(End("/shares/B"));
  EXPECT_THAT(client.ReadMessages(2), ElementsAre(Plugged("/shares/B"), End("/shares/B")));
}

TEST_F(OrvaNotifyReplay, AMountedVolumeIsRememberedUntilItIsUnmounted) {
  Serve({"--watch"});
  TmpfsMount volume("/shares/A");
  Send(End("/shares/A"));
  NotifyClient first;
  EXPECT_THAT(first.ReadMessages(3),
              ElementsAre(Plugged("/shares/A"), Scanned("/shares/A"), End("/shares/A")));
  volume.Unmount();
  EXPECT_EQ(first.ReadMessage(), Unplugged("/shares/A"));
  const TmpfsMount again("/shares/A");
  NotifyClient second;
  Send(Scanned("/shares/B"));
  EXPECT_THAT(second.ReadMessages(2), ElementsAre(Plugged("/shares/A"), Scanned("/shares/B")));
}

TEST_F(OrvaNotifyReplay, RawMessagesAreNotRemembered) {
  Serve();
  RunNotify({"send", "--raw", FileWith(Plugged("/shares/A"))});
  NotifyClient client;
  Send(End("/shares/B"));
  EXPECT_EQ(client.ReadMessage(), End("/shares/B"));
}

TEST_F(OrvaNotifyReplay, ALineSaysThatAVolumeIsNotRemembered) {
  Serve();
  {
    // More lines than a pipe holds.
    const std::jthread reader([this] {
      EXPECT_EQ(service_->ReadLineWith("not remembered"),
                "not remembered, 1000 volumes or 1048576 bytes of mount points are the limit: "
                "/shares/more");
    });
    for (std::size_t i = 0; i < notify::VolumeMemory::MAXIMUM_VOLUMES; ++i) {
      Send(Plugged("/shares/" + std::to_string(i)));
    }
    Send(Plugged("/shares/more"));
  }
  service_->CloseOutput();
  NotifyClient client;
  Send(End("/shares/7"));
  EXPECT_EQ(client.ReadMessages(1001).back(), End("/shares/7"));
}

TEST_F(OrvaNotifyReplay, AfterAnUnplugTheOtherVolumesEndAgainToFillANewMaster) {
  Serve({"--watch"});
  TmpfsMount b("/shares/B");
  for (const auto& message : {Plugged("/shares/A"), End("/shares/A"), End("/shares/B"),
                              Scanned("/shares/C"), End("/shares/D")}) {
    Send(message);
  }
  NotifyClient client;
  client.ReadMessages(9);
  Send(Unplugged("/shares/A"));
  EXPECT_THAT(client.ReadMessages(3),
              ElementsAre(Unplugged("/shares/A"), End("/shares/B"), End("/shares/D")));
  b.Unmount();
  EXPECT_THAT(client.ReadMessages(2), ElementsAre(Unplugged("/shares/B"), End("/shares/D")));
}

TEST_F(OrvaNotifyObserver, ReceivesEverythingAndIsNotCounted) {
  Serve();
  Send(Plugged("/shares/A"));
  NotifyClient observer;
  observer.Write("observe\n");
  EXPECT_EQ(service_->ReadLineWith("observer"), "client 1 is an observer");
  EXPECT_EQ(RunNotify({"send", "end", "/shares/A"}).line, "sent to 0 clients");
  EXPECT_THAT(observer.ReadMessages(2), ElementsAre(Plugged("/shares/A"), End("/shares/A")));
  const Answer tooFew =
      RunNotify({"send", "--clients", "1", "--wait", "0", "scanned", "/shares/A"});
  EXPECT_EQ(tooFew.line, "orva-notify: fewer than 1 clients connected within 0 s");

  NotifyClient client;
  EXPECT_EQ(RunNotify({"send", "--clients", "1", "scanned", "/shares/A"}).line, "sent to 1 client");
  EXPECT_EQ(observer.ReadMessage(), Scanned("/shares/A"));
  EXPECT_EQ(RunNotify({"drop"}).line, "dropped 1 client");
  EXPECT_EQ(observer.ReadMessage(), "(end)");
}

TEST_F(OrvaNotifyObserver, MayWriteMuch) {
  Serve();
  NotifyClient observer;
  for (int i = 0; i < 64; ++i) {
    observer.Write(std::string(std::size_t{64} * 1024, 'x'));
  }
  Send(End("/shares/A"));
  EXPECT_EQ(observer.ReadMessage(), End("/shares/A"));
}

TEST_F(OrvaNotifyObserver, NeverReadsAndIsNotWaitedFor) {
  Serve();
  NotifyClient observer;
  observer.Write("observe\n");
  service_->ReadLineWith("observer");
  EXPECT_EQ(RunNotify({"send", "--handled", "end", "/shares/A"}).line, "handled by 0 clients");
}

TEST_F(OrvaNotifyObserver, IsNoLongerWaitedForWhenItHasWritten) {
  Serve();
  NotifyClient client;
  Program waiting(NotifyCommand({"send", "--handled", "end", "/shares/A"}));
  EXPECT_EQ(service_->ReadLineWith("sent to"), "sent to 1 client: " + End("/shares/A"));
  client.Write("o");
  EXPECT_EQ(waiting.ReadLine(), "handled by 0 clients");
  Send(End("/shares/B"));
  EXPECT_THAT(client.ReadMessages(3), ElementsAre(End("/shares/A"), "", End("/shares/B")));
}

TEST_F(OrvaNotifyHandled, TheAnswerWaitsUntilTheClientReadsOn) {
  Serve();
  NotifyClient client;
  Program waiting(NotifyCommand({"send", "--handled", "end", "/shares/A"}));
  EXPECT_EQ(service_->ReadLineWith("sent to"), "sent to 1 client: " + End("/shares/A"));
  EXPECT_EQ(client.ReadMessage(), End("/shares/A"));
  // The client has read the message and handles it. The empty message arrives meanwhile.
  ASSERT_TRUE(client.AwaitMessage());
  EXPECT_FALSE(waiting.AwaitEnd(std::chrono::milliseconds(0)));
  Send(Scanned("/shares/B"));
  EXPECT_EQ(service_->ReadLine(), "sent to 1 client: " + Scanned("/shares/B"));
  EXPECT_EQ(client.ReadMessage(), "");
  EXPECT_EQ(waiting.ReadLine(), "handled by 1 client");
  EXPECT_EQ(waiting.WaitForEnd(), 0);
  EXPECT_EQ(service_->ReadLine(), "handled by 1 client");
  EXPECT_EQ(client.ReadMessage(), Scanned("/shares/B"));
}

TEST_F(OrvaNotifyHandled, TheAnswerWaitsForWhatWasSentBefore) {
  Serve();
  NotifyClient client;
  Send(Plugged("/shares/A"));
  Program waiting(NotifyCommand({"send", "--handled", "end", "/shares/A"}));
  service_->ReadLineWith("End");
  EXPECT_THAT(client.ReadMessages(3), ElementsAre(Plugged("/shares/A"), End("/shares/A"), ""));
  EXPECT_EQ(waiting.ReadLine(), "handled by 1 client");
}

TEST_F(OrvaNotifyHandled, SeveralRequestsAreAnsweredInTheirOrder) {
  Serve();
  NotifyClient client;
  Program first(NotifyCommand({"send", "--handled", "end", "/shares/A"}));
  service_->ReadLineWith("shares/A");
  Program second(NotifyCommand({"send", "--handled", "end", "/shares/B"}));
  service_->ReadLineWith("shares/B");
  EXPECT_THAT(client.ReadMessages(2), ElementsAre(End("/shares/A"), ""));
  EXPECT_EQ(first.ReadLine(), "handled by 1 client");
  EXPECT_EQ(client.ReadMessage(), End("/shares/B"));
  EXPECT_FALSE(second.AwaitEnd(std::chrono::milliseconds(0)));
  EXPECT_EQ(client.ReadMessage(), "");
  EXPECT_EQ(second.ReadLine(), "handled by 1 client");
}

TEST_F(OrvaNotifyHandled, AnUnplugIsHandledWhenTheOtherVolumesHaveEndedAgain) {
  Serve();
  Send(End("/shares/A"));
  NotifyClient client;
  client.ReadMessages(2);
  Program waiting(NotifyCommand({"send", "--handled", "unplugged", "/shares/B"}));
  EXPECT_THAT(client.ReadMessages(3), ElementsAre(Unplugged("/shares/B"), End("/shares/A"), ""));
  EXPECT_EQ(waiting.ReadLine(), "handled by 1 client");
}

TEST_F(OrvaNotifyHandled, SaysWhenTheTimeIsOverAndTheMessageIsStillHandled) {
  Serve();
  NotifyClient client;
  const Answer late = RunNotify({"send", "--handled", "--wait", "1", "end", "/shares/A"});
  EXPECT_EQ(late.status, 1);
  EXPECT_EQ(late.line, "orva-notify: sent, but not yet handled by all clients within 1 s");
  Send(End("/shares/B"));
  EXPECT_THAT(client.ReadMessages(3), ElementsAre(End("/shares/A"), "", End("/shares/B")));
}

TEST_F(OrvaNotifyHandled, ADeadlineThatPassesWhileAClientHandlesIsNotCalledTooFewClients) {
  Serve();
  const NotifyClient client;
  const Answer late =
      RunNotify({"send", "--handled", "--clients", "1", "--wait", "1", "end", "/shares/A"});
  EXPECT_EQ(late.status, 1);
  EXPECT_EQ(late.line, "orva-notify: sent, but not yet handled by all clients within 1 s");
}

TEST_F(OrvaNotifyHandled, AClientThatDisconnectsIsNotCounted) {
  Serve();
  NotifyClient reads;
  NotifyClient leavesUnread;
  NotifyClient leavesTheMark;
  Program waiting(NotifyCommand({"send", "--handled", "end", "/shares/A"}));
  EXPECT_THAT(reads.ReadMessages(2), ElementsAre(End("/shares/A"), ""));
  ASSERT_TRUE(leavesUnread.AwaitMessage());
  leavesUnread.Close();
  EXPECT_EQ(leavesTheMark.ReadMessage(), End("/shares/A"));
  ASSERT_TRUE(leavesTheMark.AwaitMessage());
  leavesTheMark.Close();
  EXPECT_EQ(waiting.ReadLine(), "handled by 1 client");
}

TEST_F(OrvaNotifyHandled, ARequesterThatLeavesChangesNothingForTheClients) {
  Serve();
  NotifyClient client;
  Program waiting(NotifyCommand({"send", "--handled", "end", "/shares/A"}));
  service_->ReadLineWith("sent to");
  waiting.Signal(SIGKILL);
  waiting.WaitForEnd();
  Send(End("/shares/B"));
  EXPECT_THAT(client.ReadMessages(3), ElementsAre(End("/shares/A"), "", End("/shares/B")));
}

TEST_F(OrvaNotifyHandled, NoReadOfAClientIsMissed) {
  Serve();
  service_->CloseOutput();
  NotifyClient client;
  constexpr int COUNT = 3000;
  std::jthread reader([&client] {
    while (client.ReadMessage() != "(end)") {
    }
  });
  for (int i = 0; i < COUNT; ++i) {
    ASSERT_EQ(Ask({.clients = 1, .message = End("/shares/A"), .handled = true}), 1U) << i;
  }
  Ask({.kind = Request::Kind::Drop});
}

} // namespace

// Plain directories that are volumes.

#include "NotifyTest.h"

#include "orva-notify/Notification.h"

#include "system/Messages.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

namespace {

using namespace orva;
using namespace orva::test;
using notify::Event;
using notify::VolumeKind;
using testing::ElementsAre;
using testing::HasSubstr;
namespace fs = std::filesystem;

const std::string PHOTOS = "/shares/Photos";
const std::string UNPLUGGED = Unplugged(PHOTOS);
const std::string PLUGGED =
    notify::Compose({.event = Event::Plugged, .mountPoint = PHOTOS, .kind = VolumeKind::Directory});

class OrvaNotifyDirectory : public OrvaNotify {
protected:
  void SetUp() override {
    OrvaNotify::SetUp();
    fs::remove_all(PHOTOS);
  }

  /// Starts the service and connects a client to it.
  void ServeClient(const Arguments& options = {"--volume", PHOTOS}) {
    Serve(options);
    client_ = std::make_unique<NotifyClient>();
    ASSERT_EQ(service_->ReadLineWith("connected"), "client 1 connected");
  }

  std::string Next() { return client_->ReadMessage(); }

  /// Expects that nothing was announced of the directory.
  void ExpectNothing() {
    static int count = 0;
    const std::string mark = Scanned("/shares/mark" + std::to_string(++count));
    Ask({.message = mark, .raw = true});
    EXPECT_EQ(Next(), mark);
  }

  std::unique_ptr<NotifyClient> client_;
};

TEST_F(OrvaNotifyDirectory, IsAnnouncedAtTheStartIfItExists) {
  fs::create_directory(PHOTOS);
  fs::create_directory("/shares/Second");
  ServeClient({"--watch", "--volume", PHOTOS, "--volume", "/shares/Second", "--volume", PHOTOS});
  EXPECT_EQ(Next(), PLUGGED);
  EXPECT_EQ(Next(), notify::Compose({.event = Event::Plugged,
                                     .mountPoint = "/shares/Second",
                                     .kind = VolumeKind::Directory}));
  fs::remove("/shares/Second");
  EXPECT_EQ(Next(), Unplugged("/shares/Second"));
}

TEST_F(OrvaNotifyDirectory, IsAnnouncedWhenItAppearsAndWhenItIsRemoved) {
  ServeClient();
  ExpectNothing();
  fs::create_directory("/shares/Other");
  ExpectNothing();
  fs::create_directory(PHOTOS);
  EXPECT_EQ(Next(), PLUGGED);
  EXPECT_EQ(service_->ReadLineWith("seen"), "plugged seen: " + PHOTOS);
  fs::remove(PHOTOS);
  EXPECT_EQ(Next(), UNPLUGGED);
  EXPECT_EQ(service_->ReadLineWith("seen"), "unplugged seen: " + PHOTOS);
  fs::remove("/shares/Other");
}

TEST_F(OrvaNotifyDirectory, IsAnnouncedWhenItIsRenamed) {
  fs::create_directory("/shares/New");
  ServeClient();
  fs::rename("/shares/New", PHOTOS);
  EXPECT_EQ(Next(), PLUGGED);
  fs::rename(PHOTOS, "/shares/New");
  EXPECT_EQ(Next(), UNPLUGGED);
  fs::remove("/shares/New");
}

TEST_F(OrvaNotifyDirectory, IsUnpluggedAndPluggedWhenAnotherTakesItsPlace) {
  fs::create_directory(PHOTOS);
  fs::create_directory("/shares/New");
  ServeClient();
  EXPECT_EQ(Next(), PLUGGED);
  fs::rename("/shares/New", PHOTOS);
  EXPECT_EQ(Next(), UNPLUGGED);
  EXPECT_EQ(Next(), PLUGGED);
}

TEST_F(OrvaNotifyDirectory, AnythingElseThanADirectoryIsNoVolume) {
  fs::create_directory("/shares/Real");
  fs::create_directory_symlink("/shares/Real", PHOTOS);
  ServeClient();
  ExpectNothing();
  fs::remove(PHOTOS);
  std::ofstream(PHOTOS) << "a file";
  ExpectNothing();
  fs::remove(PHOTOS);
  fs::create_directory(PHOTOS);
  EXPECT_EQ(Next(), PLUGGED);
  fs::remove(PHOTOS);
  fs::create_directory_symlink("/shares/Real", PHOTOS);
  EXPECT_EQ(Next(), UNPLUGGED);
  ExpectNothing();
  fs::remove(PHOTOS);
  fs::remove("/shares/Real");
}

TEST_F(OrvaNotifyDirectory, IsAnnouncedWhenTheSharesRootAppears) {
  fs::remove_all("/shares");
  ServeClient();
  ExpectNothing();
  fs::create_directories(PHOTOS);
  EXPECT_EQ(Next(), PLUGGED);
  fs::rename("/shares", "/shares.old");
  EXPECT_EQ(Next(), UNPLUGGED);
  fs::create_directories(PHOTOS);
  EXPECT_EQ(Next(), PLUGGED);
  fs::remove_all("/shares.old");
  fs::remove_all(PHOTOS);
  EXPECT_EQ(Next(), UNPLUGGED);
}

TEST_F(OrvaNotifyDirectory, WhatIsMountedThereIsAVolumeInItsPlace) {
  fs::create_directory(PHOTOS);
  for (const Arguments& options :
       {Arguments{"--volume", PHOTOS}, {"--watch", "--volume", PHOTOS}}) {
    ServeClient(options);
    EXPECT_EQ(Next(), PLUGGED);
    {
      TmpfsMount volume(PHOTOS);
      EXPECT_EQ(Next(), UNPLUGGED);
      EXPECT_EQ(Next(), Plugged(PHOTOS));
      EXPECT_EQ(NotifyClient().ReadMessage(), Plugged(PHOTOS));
      volume.Unmount();
    }
    EXPECT_EQ(Next(), UNPLUGGED);
    EXPECT_EQ(Next(), PLUGGED);
    EXPECT_EQ(NotifyClient().ReadMessage(), PLUGGED);
    client_.reset();
    service_.reset();
  }
}

TEST_F(OrvaNotifyDirectory, IsAnnouncedAfterTheMounts) {
  fs::create_directory(PHOTOS);
  const TmpfsMount disk("/shares/Zoo");
  ServeClient({"--watch", "--volume", PHOTOS});
  EXPECT_EQ(Next(), Plugged("/shares/Zoo"));
  EXPECT_EQ(Next(), PLUGGED);
}

TEST_F(OrvaNotifyDirectory, IsAnnouncedAfterTheMountsToAClientThatConnectsLater) {
  fs::create_directory(PHOTOS);
  ServeClient({"--watch", "--volume", PHOTOS});
  EXPECT_EQ(Next(), PLUGGED);
  const TmpfsMount disk("/shares/Zoo");
  EXPECT_EQ(Next(), Plugged("/shares/Zoo"));
  EXPECT_THAT(NotifyClient().ReadMessages(2), ElementsAre(Plugged("/shares/Zoo"), PLUGGED));
}

TEST_F(OrvaNotifyDirectory, OtherMountsAreNotAnnouncedWithoutWatch) {
  ServeClient();
  const TmpfsMount other("/shares/Other");
  ExpectNothing();
}

TEST_F(OrvaNotifyDirectory, AFileSystemOfTheSharesRootCanBeMountedAndUnmounted) {
  fs::create_directory(PHOTOS);
  ServeClient();
  EXPECT_EQ(Next(), PLUGGED);
  TmpfsMount shares("/shares");
  EXPECT_EQ(Next(), UNPLUGGED);
  fs::create_directory(PHOTOS);
  EXPECT_EQ(Next(), PLUGGED);
  shares.Unmount();
  EXPECT_EQ(Next(), UNPLUGGED);
  EXPECT_EQ(Next(), PLUGGED);
}

TEST_F(OrvaNotifyDirectory, IsUnpluggedAfterARestartWithoutItsOption) {
  setenv("STATE_DIRECTORY", folder_.c_str(), 1);
  fs::create_directory(PHOTOS);
  fs::create_directory("/shares/Second");
  ServeClient({"--volume", PHOTOS, "--volume", "/shares/Second"});
  EXPECT_EQ(Next(), PLUGGED);
  service_.reset();
  for (int time = 0; time < 2; ++time) { // until a client has handled it
    Serve({"--volume", "/shares/Second"});
    Ask({.message = Scanned("/shares/Second")});
    service_.reset();
  }
  ServeClient({"--volume", "/shares/Second"});
  EXPECT_THAT(Next(), HasSubstr("Name=\"Plugged\""));
  // The daemon removes rows only after a volume was scanned.
  Ask({.message = Scanned("/shares/Second")});
  EXPECT_EQ(Next(), Scanned("/shares/Second"));
  EXPECT_EQ(Next(), UNPLUGGED);
  EXPECT_EQ(Next(), ""); // a client that reads this has handled everything before it
  ExpectNothing();
  ExpectNothing();
  client_.reset();
  service_.reset();
  ServeClient({"--volume", "/shares/Second"});
  EXPECT_THAT(Next(), HasSubstr("Name=\"Plugged\""));
  Ask({.message = Scanned("/shares/Second")});
  EXPECT_EQ(Next(), Scanned("/shares/Second"));
  ExpectNothing();
  fs::remove("/shares/Second");
  unsetenv("STATE_DIRECTORY");
}

TEST_F(OrvaNotifyDirectory, ALineSaysWhyItIsNoVolume) {
  fs::create_directory("/shares/Real");
  fs::create_directory_symlink("/shares/Real", PHOTOS);
  Serve({"--volume", PHOTOS, "--volume", "/shares/Missing"});
  EXPECT_EQ(service_->ReadLine(), PHOTOS + " is not a directory: it is no volume");
  EXPECT_EQ(service_->ReadLine(), "/shares/Missing does not exist: waiting for it");
  fs::create_directory("/shares/Missing");
  EXPECT_EQ(service_->ReadLineWith("seen"), "plugged seen: /shares/Missing");
  fs::remove("/shares/Missing");
  fs::remove(PHOTOS);
  fs::remove("/shares/Real");
}

TEST_F(OrvaNotifyDirectory, APluggedByHandDoesNotMakeItAMount) {
  fs::create_directory(PHOTOS);
  ServeClient();
  Ask({.message = Plugged(PHOTOS)});
  EXPECT_EQ(NotifyClient().ReadMessage(), PLUGGED);
}

} // namespace

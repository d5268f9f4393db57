// The service and the real daemon.

#include "NotifyTest.h"

#include "orva-notify/Notification.h"

#include "system/Appliance.h"
#include "system/Catalog.h"
#include "system/DaemonProcess.h"
#include "system/Messages.h"
#include "system/Syslog.h"
#include "system/Volume.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

namespace {

using namespace orva;
using namespace orva::test;
namespace fs = std::filesystem;

void AddPhotos(Catalog& catalog, int count) {
  catalog.AddFolder("Pictures/");
  catalog.AddPhotos("Pictures/", count, 1);
}

class OrvaNotifyDaemon : public OrvaNotify {
protected:
  void TearDown() override {
    if (service_ && daemon_ && daemon_->IsRunning()) {
      service_->Signal(SIGTERM);
      EXPECT_EQ(service_->WaitForEnd(), 0);
      EXPECT_EQ(daemon_->AwaitEnd(), Exited(0));
    }
    OrvaNotify::TearDown();
  }

  void StartDaemon() {
    daemon_ = std::make_unique<DaemonProcess>("/tmp/daemon", "/tmp/daemon.out");
  }

  void KillDaemon() {
    kill(daemon_->Pid(), SIGKILL);
    EXPECT_EQ(daemon_->AwaitEnd(), Killed(SIGKILL));
  }

  /// Sends `message` and waits until a daemon has handled it, and all that was sent before.
  static void Handle(const std::string& message = "") {
    while (Ask({.clients = 1, .message = message, .handled = true}) == 0) {
    }
  }

  static std::vector<std::string> Content() {
    const std::string locator = Appliance::Locator();
    const std::string end = "/.zophotos/zophotos.db\n";
    const auto start = locator.find('=') + 1;
    return MergedDatabase(locator.substr(start, locator.size() - start - end.size())).Content();
  }

  /// The files of the volume in the merged database.
  static std::vector<std::string> FilesOf(const Volume& volume) {
    std::vector<std::string> files;
    for (const auto& line : Content()) {
      if (line.find(volume.Path()) != std::string::npos && line.find(".jpg") != std::string::npos) {
        files.push_back(line);
      }
    }
    return files;
  }

  const Syslog log_;
  std::unique_ptr<DaemonProcess> daemon_;
};

TEST_F(OrvaNotifyDaemon, AMessageThatIsHandledIsMerged) {
  Serve({"--watch"});
  const Volume volume("A", "150g");
  Catalog catalog(volume);
  StartDaemon();
  Handle(Scanned(volume.Path()));
  for (int i = 1; i <= 100; ++i) {
    catalog.AddPhoto(std::to_string(i) + ".jpg", i, i);
    ASSERT_EQ(Ask({.clients = 1, .message = TranscodedBatch(volume.Path()), .handled = true}), 1U);
    ASSERT_EQ(FilesOf(volume).size(), static_cast<std::size_t>(i));
  }
}

TEST_F(OrvaNotifyDaemon, IsCompleteAgainAfterItWasKilled) {
  for (const std::string size : {"150g", "1g"}) { // on the volume, and at the shares root
    Serve({"--watch"});
    const Volume a("A", size);
    const Volume b("B", "1g");
    fs::create_directory("/shares/Plain");
    Catalog onA(a);
    Catalog onB(b);
    Catalog onPlain("/shares/Plain");
    AddPhotos(onA, 10);
    AddPhotos(onB, 10);
    AddPhotos(onPlain, 10);
    StartDaemon();
    Handle(Scanned(a.Path()));
    Handle(TranscodedBatch(a.Path()));
    Handle(End(b.Path()));
    Handle(Plugged("/shares/Plain"));
    Handle(End("/shares/Plain"));
    const auto complete = Content();
    EXPECT_EQ(FilesOf(b).size(), 10U);
    for (int i = 0; i < 5; ++i) {
      KillDaemon();
      StartDaemon();
      Handle();
      EXPECT_EQ(Content(), complete);
    }
    KillDaemon();
    onB.AddPhoto("Pictures/missed.jpg", 2, 2);
    StartDaemon();
    Handle();
    EXPECT_EQ(FilesOf(b).size(), 11U);
    service_->Signal(SIGTERM);
    EXPECT_EQ(daemon_->AwaitEnd(), Exited(0));
    service_->WaitForEnd();
    fs::remove_all("/shares/Plain");
  }
}

TEST_F(OrvaNotifyDaemon, ADirectoryThatIsNoVolumeAfterARestartLeavesTheMergedDatabase) {
  setenv("STATE_DIRECTORY", folder_.c_str(), 1);
  fs::create_directory("/shares/Plain");
  const Volume a("A", "150g");
  Catalog onA(a);
  Catalog onPlain("/shares/Plain");
  AddPhotos(onA, 10);
  AddPhotos(onPlain, 10);
  const auto plain = [] {
    return std::ranges::count_if(Content(), [](const std::string& line) {
      return line.find("/shares/Plain") != std::string::npos &&
             line.find(".jpg") != std::string::npos;
    });
  };
  Serve({"--watch", "--volume", "/shares/Plain"});
  StartDaemon();
  Handle(Scanned(a.Path()));
  Handle(End(a.Path()));
  Handle(End("/shares/Plain"));
  EXPECT_EQ(plain(), 10);
  service_->Signal(SIGTERM);
  EXPECT_EQ(service_->WaitForEnd(), 0);
  EXPECT_EQ(daemon_->AwaitEnd(), Exited(0));
  Serve({"--watch"});
  StartDaemon();
  Handle(Scanned(a.Path()));
  Handle();
  EXPECT_EQ(plain(), 0);
  EXPECT_EQ(FilesOf(a).size(), 10U);
  fs::remove_all("/shares/Plain");
  unsetenv("STATE_DIRECTORY");
}

/// A volume that stays, and one that is removed.
class OrvaNotifyRemoval : public OrvaNotifyDaemon {
protected:
  OrvaNotifyRemoval() {
    setenv("STATE_DIRECTORY", "/tmp/orva_notify_state", 1);
    fs::create_directories("/tmp/orva_notify_state");
    Catalog onA(a_);
    Catalog onB(b_);
    AddPhotos(onA, 10);
    AddPhotos(onB, 10);
  }
  ~OrvaNotifyRemoval() override {
    unsetenv("STATE_DIRECTORY");
    fs::remove_all("/tmp/orva_notify_state");
  }

  /// Starts the programs, and merges both volumes.
  void Start() {
    Serve({"--watch"});
    StartDaemon();
    Handle(Scanned(a_.Path()));
    Handle(End(a_.Path()));
    Handle(End(b_.Path()));
    ASSERT_EQ(FilesOf(b_).size(), 10U);
  }

  void StopService() {
    service_->Signal(SIGTERM);
    EXPECT_EQ(service_->WaitForEnd(), 0);
    EXPECT_EQ(daemon_->AwaitEnd(), Exited(0));
  }

  /// Expects that only the photos of the volume that stays are merged.
  void ExpectRemoval() {
    Handle();
    EXPECT_EQ(FilesOf(b_).size(), 0U);
    EXPECT_EQ(FilesOf(a_).size(), 10U);
  }

  const Volume a_{"A", "150g"};
  Volume b_{"B", "1g"};
};

TEST_F(OrvaNotifyRemoval, WhileNothingRunsIsAnnouncedAfterTheStart) {
  Start();
  StopService();
  b_.Unmount();
  Serve({"--watch"});
  StartDaemon();
  Handle(Scanned(a_.Path()));
  ExpectRemoval();
}

TEST_F(OrvaNotifyRemoval, WhileTheDaemonDoesNotRunIsAnnouncedAfterItsStart) {
  Start();
  KillDaemon();
  service_->ReadLineWith("gone");
  b_.Unmount();
  EXPECT_EQ(service_->ReadLineWith("seen"), "unplugged seen: /shares/B");
  StartDaemon();
  ExpectRemoval();
}

TEST_F(OrvaNotifyRemoval, WhileTheDaemonDoesNotRunIsAnnouncedAfterTheStartOfBoth) {
  Start();
  KillDaemon();
  service_->ReadLineWith("gone");
  b_.Unmount();
  EXPECT_EQ(service_->ReadLineWith("seen"), "unplugged seen: /shares/B");
  service_->Signal(SIGKILL);
  service_->WaitForEnd();
  Serve({"--watch"});
  StartDaemon();
  Handle(Scanned(a_.Path()));
  ExpectRemoval();
}

TEST_F(OrvaNotifyRemoval, ThatTheDaemonDidNotHandleIsAnnouncedToTheNextOne) {
  Start();
  kill(daemon_->Pid(), SIGSTOP);
  b_.Unmount();
  EXPECT_EQ(service_->ReadLineWith("Unplugged"), "sent to 1 client: " + Unplugged(b_.Path()));
  KillDaemon();
  StartDaemon();
  ExpectRemoval();
}

TEST_F(OrvaNotifyRemoval, OfADiskThatIsBackIsNotAnnounced) {
  Start();
  KillDaemon();
  service_->ReadLineWith("gone");
  b_.Unmount();
  EXPECT_EQ(service_->ReadLineWith("seen"), "unplugged seen: /shares/B");
  const Volume back("B", "1g");
  EXPECT_EQ(service_->ReadLineWith("seen"), "plugged seen: /shares/B");
  StartDaemon();
  Handle();
  EXPECT_EQ(FilesOf(b_).size(), 10U);
  EXPECT_EQ(FilesOf(a_).size(), 10U);
}

TEST_F(OrvaNotifyDaemon, IsCompleteAgainAfterItWasKilledWhileItIsTold) {
  Serve({"--watch"});
  const Volume a("A", "150g");
  const Volume b("B", "1g");
  Catalog onA(a);
  Catalog onB(b);
  AddPhotos(onA, 300);
  AddPhotos(onB, 300);
  StartDaemon();
  Handle(Scanned(a.Path()));
  Handle(End(a.Path()));
  Handle(End(b.Path()));
  const auto complete = Content();
  EXPECT_EQ(FilesOf(b).size(), 300U);
  for (int i = 0; i < 10; ++i) {
    KillDaemon();
    fs::remove_all("/shares/A/.zophotos");
    StartDaemon();
    service_->ReadLineWith("connected");
    for (int line = 0; line < i % 6; ++line) {
      service_->ReadLine();
    }
    KillDaemon();
    StartDaemon();
    Handle();
    EXPECT_EQ(Content(), complete);
  }
}

TEST_F(OrvaNotifyDaemon, ANewMasterHasAllRowsOfTheRemainingVolumes) {
  Serve({"--watch"});
  Volume a("A", "200g");
  Volume b("B", "150g");
  const Volume c("C", "1g");
  Catalog onB(b);
  Catalog onC(c);
  {
    Catalog onA(a);
    AddPhotos(onA, 5);
  }
  AddPhotos(onB, 20);
  AddPhotos(onC, 30);
  StartDaemon();
  Handle(Scanned(a.Path()));
  for (const std::string& path : {a.Path(), b.Path(), c.Path()}) {
    Handle(TranscodedBatch(path));
  }
  ASSERT_EQ(Appliance::Locator(), "zophotos_db_path=/shares/A//.zophotos/zophotos.db\n");
  const auto rowsOfB = FilesOf(b);
  const auto rowsOfC = FilesOf(c);
  EXPECT_EQ(rowsOfB.size(), 20U);
  EXPECT_EQ(rowsOfC.size(), 30U);
  a.Unmount();
  Handle();
  EXPECT_EQ(Appliance::Locator(), "zophotos_db_path=/shares/B//.zophotos/zophotos.db\n");
  EXPECT_EQ(FilesOf(b), rowsOfB);
  EXPECT_EQ(FilesOf(c), rowsOfC);
  EXPECT_EQ(FilesOf(a).size(), 0U);

  // And with the shares root as the new master.
  Handle(Unplugged(b.Path()));
  EXPECT_EQ(FilesOf(c), rowsOfC);
  EXPECT_EQ(FilesOf(b).size(), 0U);
}

TEST_F(OrvaNotifyDaemon, ADiskBecomesTheMasterAlthoughThereIsAPlainDirectory) {
  fs::create_directories("/shares/Photos");
  const Volume disk("Zoo", "150g");
  Serve({"--watch", "--volume", "/shares/Photos"});
  StartDaemon();
  Handle(Scanned("/shares/Photos"));
  EXPECT_EQ(Appliance::Locator(), "zophotos_db_path=/shares/Zoo//.zophotos/zophotos.db\n");
  fs::remove_all("/shares/Photos");
}

TEST_F(OrvaNotifyDaemon, ADaemonThatIsKilledHasNotHandledTheMessage) {
  Serve();
  const Volume volume("A", "150g");
  Catalog catalog(volume);
  AddPhotos(catalog, 10);
  StartDaemon();
  Handle(Plugged(volume.Path()));
  kill(daemon_->Pid(), SIGSTOP);
  Program waiting(NotifyCommand({"send", "--handled", "end", "/shares/A"}));
  EXPECT_EQ(service_->ReadLineWith("End"), "sent to 1 client: " + End("/shares/A"));
  KillDaemon();
  EXPECT_EQ(waiting.ReadLine(), "handled by 0 clients");
}

} // namespace

#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include "CatalogSchema.h"
#include "Renditions.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"
#include "support/Programs.h"
#include "system/Appliance.h"
#include "system/Messages.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <sys/mount.h>

namespace {

namespace catalog = orva::catalog;
namespace db = orva::db;
namespace test = orva::test;
using namespace orva::test;
using testing::HasSubstr;
using testing::IsEmpty;
namespace fs = std::filesystem;

class Announcements : public TranscoderTest {
protected:
  void AddPhotos(int count) const {
    MakePhoto("/tmp/photo.jpg", 300, 200);
    Lines names;
    for (int i = 0; i < count; ++i) {
      names.push_back(std::to_string(i) + ".jpg");
      fs::copy_file("/tmp/photo.jpg", At(names.back()));
    }
    AddAllWaiting(names);
  }
};

TEST_F(Announcements, TheEndIsAnnouncedWhenNoPhotoWaits) {
  AddPhotos(3);
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("Name=\"End\" MountPoint=\"/shares/A\""));
  EXPECT_EQ(Waiting(), 0);
}

TEST_F(Announcements, ADiskThatIsMountedTwiceIsAnnouncedAsBothVolumes) {
  const std::string other = "/shares/B";
  AddAllWaiting({}); // makes the catalog
  fs::create_directory(other);
  ASSERT_EQ(mount(Root().c_str(), other.c_str(), nullptr, MS_BIND, nullptr), 0);
  TranscoderTest::Announce("plugged", other);
  TranscoderTest::Announce("scanned", other);
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("Name=\"End\" MountPoint=\"/shares/A\""));
  AddPhotos(3);
  Announce("transcoded");
  EXPECT_TRUE(AwaitSent("Name=\"End\" MountPoint=\"/shares/B\""));
  EXPECT_EQ(Waiting(), 0);
  umount2(other.c_str(), MNT_DETACH);
}

TEST_F(Announcements, NothingIsAnnouncedBeforeTheVolumeWasScanned) {
  AddPhotos(3);
  Announce("plugged");
  ASSERT_TRUE(Await([this] { return Waiting() == 0; }));
  Announce("scanned");
  std::string line = Service().ReadLineWith("sent to ");
  while (line.find("Scanned") == std::string::npos) {
    EXPECT_EQ(line.find("End"), std::string::npos) << line;
    line = Service().ReadLineWith("sent to ");
  }
  EXPECT_TRUE(AwaitSent("\"End\""));
}

TEST_F(Announcements, FiveHundredPhotosAreAnnouncedAsABatch) {
  AddPhotos(1200);
  Announce("scanned");
  EXPECT_TRUE(AwaitSent("Name=\"TranscodedBatch\" MountPoint=\"/shares/A\"><profile>"
                        "cb62bbdd389b48898f2e5244977cb2c5</profile>"));
  EXPECT_GT(Waiting(), 0);
  EXPECT_LT(Waiting(), 1200);
  EXPECT_TRUE(AwaitSent("\"End\""));
  EXPECT_EQ(Waiting(), 0);
}

TEST_F(Announcements, AfterARestartTheEndIsAnnouncedAgain) {
  AddPhotos(1);
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("\"End\""));
  KillTranscoder();
  StartTranscoder();
  Announce("scanned");
  EXPECT_TRUE(AwaitSent("\"End\""));
}

TEST_F(Announcements, WhatIsDoneWithoutAServiceIsAnnouncedLater) {
  MakeSlowPhoto(At("a.png"));
  AddWaiting("a.png");
  Announce("scanned");
  ASSERT_TRUE(Await([] { return Status().find("\"rendering\":true") != std::string::npos; }));
  Service().Signal(SIGKILL);
  ASSERT_TRUE(Await([this] { return Waiting() == 0; }));
  StartService();
  Service().ReadLineWith("connected");
  Announce("scanned");
  EXPECT_TRUE(AwaitSent("\"End\""));
}

TEST_F(Announcements, TheTranscoderMayStartBeforeTheService) {
  AddPhotos(1);
  KillTranscoder();
  Service().Signal(SIGTERM);
  Service().WaitForEnd();
  fs::remove_all("/run/orva");
  const Program transcoder({ProgramPath("orva-transcoder")},
                           {.environment = {"RUNTIME_DIRECTORY=" + std::string(RUNTIME)}});
  ASSERT_TRUE(Await([] { return !Status().empty(); }));
  StartService();
  Service().ReadLineWith("connected");
  RenderAll();
}

TEST_F(Announcements, TheStatusFileTellsWhatIsGoingOn) {
  AddPhotos(2);
  WriteBytes(At("bad.jpg"), "bad");
  AddWaiting("bad.jpg");
  MakeSlowPhoto(At("slow.png"));
  AddWaiting("slow.png");
  Announce("scanned");
  ASSERT_TRUE(Await([] { return Status().find("\"rendering\":true") != std::string::npos; }));
  ASSERT_TRUE(Await([] { return Status().find("\"waiting\":0") != std::string::npos; }));
  EXPECT_EQ(nlohmann::json::parse(Status()),
            nlohmann::json::parse(R"({"volumes":[{"mountPoint":"/shares/A/","waiting":0,)"
                                  R"("failed":1,"rendering":false}]})"));
  Announce("unplugged");
  EXPECT_TRUE(Await([] { return Status() == "{\"volumes\":[]}\n"; }));
}

TEST_F(Announcements, VolumesTakeTurns) {
  const Volume second("B", "100m");
  AddPhotos(1200);
  Announce("scanned");
  UseRoot(second.Path());
  AddPhotos(1);
  RenderAll();
  UseRoot("/shares/A");
  EXPECT_GT(Waiting(), 600);
}

TEST_F(Announcements, AVolumeWhoseCatalogIsLockedDoesNotHoldUpOthers) {
  const Volume second("B", "100m");
  AddPhotos(400);
  const auto first = catalog::OpenCatalog(Root());
  {
    const db::Transaction lock(*first, catalog::BUSY_TIMEOUT);
    Announce("scanned");
    ASSERT_TRUE(Await([] { return Status().find("\"rendering\":true") != std::string::npos; }));
    UseRoot(second.Path());
    AddPhotos(30);
    RenderAll();
    EXPECT_EQ(catalog::CountWaiting(*first), 400);
  }
  UseRoot("/shares/A");
  EXPECT_TRUE(Await([this] { return Waiting() == 0; })) << Status();
}

TEST_F(Announcements, TheDaemonListsAPhotoOnlyWithItsRendition) {
  MakePhoto(At("a.jpg"), 300, 200);
  MakePhoto(At("b.jpg"), 300, 200);
  AddAllWaiting({"a.jpg", "b.jpg"});
  const Program daemon({ProgramPath("zophotodbmerger")}, {.output = "/tmp/daemon.out"});
  Service().ReadLineWith("connected");
  Announce("plugged");
  Announce("scanned");
  const auto merged = [] {
    try {
      return Database("/shares/.zophotos/zophotos.db").Run("SELECT name FROM Files ORDER BY 1");
    } catch (const std::exception&) {
      return Lines{"(no database)"};
    }
  };
  const auto isMerged = [&merged](const Lines& names) { return merged() == names; };
  EXPECT_TRUE(Await([&] {
    return isMerged({"a.jpg", "b.jpg"});
  })) << testing::PrintToString(merged());
  // The new content cannot be rendered.
  WriteBytes(At("a.jpg"), "no image any more");
  AddWaiting("a.jpg");
  Announce("end");
  EXPECT_TRUE(Await([&] { return isMerged({"b.jpg"}); })) << testing::PrintToString(merged());
  // And again an image.
  fs::copy_file(At("b.jpg"), At("a.jpg"), fs::copy_options::overwrite_existing);
  AddWaiting("a.jpg");
  Announce("end");
  EXPECT_TRUE(Await([&] {
    return isMerged({"a.jpg", "b.jpg"});
  })) << testing::PrintToString(merged());
}

TEST(TranscoderCommandLine, HasOnlyHelpAndVersion) {
  const std::string program = ProgramPath("orva-transcoder");
  const Outcome help = test::Run({program, "--help"});
  EXPECT_EQ(help.status, 0);
  EXPECT_THAT(help.output, HasSubstr("Usage: orva-transcoder"));
  EXPECT_THAT(test::Run({program, "--version"}).output, testing::StartsWith("orva-transcoder "));
  const Outcome wrong = test::Run({program, "stray"});
  EXPECT_EQ(wrong.status, 2);
  EXPECT_THAT(wrong.error, HasSubstr("'stray'\nTry 'orva-transcoder --help'.\n"));
}

TEST(TranscoderCommandLine, AWorkingFolderThatCannotBeUsedIsAFailure) {
  const Outcome outcome =
      test::Run({"env", "RUNTIME_DIRECTORY=/absent", ProgramPath("orva-transcoder")});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_THAT(outcome.error, HasSubstr("/absent/staging: No such file or directory"));
}

} // namespace

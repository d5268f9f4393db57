#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include "support/OtherUsers.h"

#include <gmock/gmock.h>

#include <fcntl.h>
#include <grp.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <sstream>

namespace {

using namespace orva::test;
using testing::Contains;
using testing::HasSubstr;
namespace fs = std::filesystem;

/// What is outside of the volume and must stay as it is.
class HostileVolumes : public TranscoderTest {
protected:
  void SetUp() override {
    TranscoderTest::SetUp();
    MakePhoto("/tmp/photo.jpg", 600, 400);
    fs::create_directories("/tmp/outside/0");
    WriteBytes("/tmp/outside/1.jpg", "outside");
    WriteBytes("/tmp/outside/0/1.jpg", "outside");
    WriteBytes("/tmp/outside/0/2.jpg", "outside");
    WriteBytes("/tmp/outside/0/2.jpg.new", "outside");
    fs::create_directories("/tmp/outside/renditions/0");
    WriteBytes("/tmp/outside/renditions/0/2.jpg", "outside");
    outside_ = Outside();
  }

  void TearDown() override {
    EXPECT_EQ(Outside(), outside_);
    TranscoderTest::TearDown();
  }

  /// Renders a photo, the second one, in a volume where `replace` has changed something. The
  /// renditions were compared with the catalog before, which removes links and other files.
  void RenderAfter(const std::function<void()>& replace) {
    CopyPhoto("first.jpg");
    AddWaiting("first.jpg");
    Announce("scanned");
    ASSERT_TRUE(AwaitSent("\"End\""));
    fs::remove_all(At(".orva/renditions"));
    replace();
    CopyPhoto("a.jpg");
    AddWaiting("a.jpg");
    RenderAll();
    EXPECT_EQ(HeaderOf(At(".orva/renditions/0/2.jpg")).width, 600);
    EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(At(".orva/renditions/0/2.jpg"))));
    EXPECT_TRUE(fs::is_directory(fs::symlink_status(At(".orva/renditions/0"))));
    EXPECT_TRUE(fs::is_directory(fs::symlink_status(At(".orva/renditions"))));
  }

private:
  /// Every path with its content.
  static Lines Outside() {
    Lines lines;
    for (const auto& entry : fs::recursive_directory_iterator("/tmp/outside")) {
      lines.push_back(entry.path().native() +
                      (entry.is_regular_file() ? '=' + ReadBytes(entry.path()) : ""));
    }
    std::ranges::sort(lines);
    return lines;
  }

  Lines outside_;
};

TEST_F(HostileVolumes, ALinkInPlaceOfTheRenditionsIsNotFollowed) {
  RenderAfter([this] { fs::create_directory_symlink("/tmp/outside", At(".orva/renditions")); });
}

TEST_F(HostileVolumes, ALinkInPlaceOfAFolderOfRenditionsIsNotFollowed) {
  RenderAfter([this] {
    fs::create_directory(At(".orva/renditions"));
    fs::create_directory_symlink("/tmp/outside/0", At(".orva/renditions/0"));
  });
}

TEST_F(HostileVolumes, LinksInPlaceOfARenditionAreReplaced) {
  RenderAfter([this] {
    fs::create_directories(At(".orva/renditions/0"));
    fs::create_symlink("/tmp/outside/1.jpg", At(".orva/renditions/0/2.jpg"));
    fs::create_symlink("/tmp/outside/1.jpg", At(".orva/renditions/0/2.jpg.new"));
  });
}

TEST_F(HostileVolumes, ASpecialFileInPlaceOfTheRenditionsIsReplaced) {
  RenderAfter([this] { ASSERT_EQ(mkfifo(At(".orva/renditions").c_str(), 0600), 0); });
}

TEST_F(HostileVolumes, SpecialFilesInPlaceOfARenditionAreReplaced) {
  RenderAfter([this] {
    fs::create_directories(At(".orva/renditions/0"));
    ASSERT_EQ(mkfifo(At(".orva/renditions/0/2.jpg").c_str(), 0600), 0);
    ASSERT_EQ(mkfifo(At(".orva/renditions/0/2.jpg.new").c_str(), 0600), 0);
  });
}

TEST_F(HostileVolumes, AHardLinkInPlaceOfARenditionIsNotWrittenTo) {
  WriteBytes(At("precious"), "precious");
  RenderAfter([this] {
    fs::create_directories(At(".orva/renditions/0"));
    fs::create_hard_link(At("precious"), At(".orva/renditions/0/2.jpg"));
    fs::create_hard_link(At("precious"), At(".orva/renditions/0/2.jpg.new"));
  });
  EXPECT_EQ(ReadBytes(At("precious")), "precious");
}

TEST_F(HostileVolumes, AFolderInPlaceOfARenditionStaysAndItsPhotoWaits) {
  CopyPhoto("a.jpg");
  CopyPhoto("b.jpg");
  AddAllWaiting({"a.jpg", "b.jpg"});
  WriteBytes(At(".orva/renditions/0/1.jpg/kept"), "kept");
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("\"End\""));
  EXPECT_EQ(StateOf("a.jpg"), "waiting");
  EXPECT_EQ(StateOf("b.jpg"), "finished");
  EXPECT_TRUE(fs::exists(At(".orva/renditions/0/1.jpg/kept")));
  EXPECT_THAT(Logged(), Contains(HasSubstr("/.orva/renditions/0/1.jpg is a folder")));
  fs::remove_all(At(".orva/renditions/0/1.jpg"));
  RenderAll();
  EXPECT_EQ(StateOf("a.jpg"), "finished");
}

TEST_F(HostileVolumes, ALinkInPlaceOfTheProductsFolderIsNotFollowed) {
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  fs::create_directory("/tmp/home");
  fs::copy(At(".orva"), "/tmp/home", fs::copy_options::recursive);
  fs::remove_all(At(".orva"));
  fs::create_directory_symlink("/tmp/home", At(".orva"));
  const std::string before = ReadBytes("/tmp/home/orva.db");
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("\"End\""));
  EXPECT_FALSE(fs::exists("/tmp/home/renditions"));
  EXPECT_EQ(ReadBytes("/tmp/home/orva.db"), before);
}

TEST_F(HostileVolumes, WhatIsNoFileIsNotRendered) {
  CopyPhoto("good.jpg");
  fs::create_symlink("/tmp/photo.jpg", At("link.jpg"));
  ASSERT_EQ(mkfifo(At("fifo.jpg").c_str(), 0600), 0);
  fs::create_directory(At("folder.jpg"));
  fs::create_directory_symlink("/tmp", At("tmp"));
  fs::copy_file("/tmp/photo.jpg", "/shares/photo.jpg");
  const Lines names = {"good.jpg",      "link.jpg",     "fifo.jpg",       "folder.jpg",
                       "tmp/photo.jpg", "../photo.jpg", "/tmp/photo.jpg", "../../tmp/photo.jpg"};
  AddAllWaiting(names);
  Announce("scanned");
  ASSERT_TRUE(Await([this] { return StateOf("good.jpg") == "finished"; }));
  ASSERT_TRUE(AwaitSent("\"End\""));
  for (const std::string& name : names) {
    EXPECT_EQ(StateOf(name), name == "good.jpg" ? "finished" : "waiting") << name;
  }
}

TEST_F(HostileVolumes, CatalogsOfOthersAreLeftAlone) {
  CopyPhoto("a.jpg");
  AddWaiting("a.jpg");
  const std::string catalog = At(".orva/orva.db");
  Query("CREATE TRIGGER T AFTER UPDATE ON Files BEGIN DELETE FROM Folders; END");
  const std::string crafted = ReadBytes(catalog);
  for (const std::string& content :
       {crafted, std::string(8192, 'x'), std::string(), crafted.substr(0, 5000)}) {
    fs::remove(catalog + "-wal");
    WriteBytes(catalog, content);
    Announce("unplugged");
    Announce("plugged");
    Announce("scanned");
    ASSERT_TRUE(AwaitSent("\"End\""));
    EXPECT_EQ(ReadBytes(catalog), content);
    EXPECT_FALSE(fs::exists(At(".orva/renditions")));
  }
  fs::remove(catalog);
  ASSERT_EQ(mkfifo(catalog.c_str(), 0600), 0);
  Announce("scanned");
  fs::remove_all(At(".orva"));
  Announce("unplugged");
  Announce("plugged");
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("\"End\""));
  EXPECT_FALSE(fs::exists(At(".orva")));
}

TEST_F(HostileVolumes, LongTextsInACatalogTakeNoMemory) {
  AddAllWaiting({});
  Query("WITH N(n) AS (SELECT 1 UNION ALL SELECT n + 1 FROM N WHERE n < 12) "
        "INSERT INTO Files(folderId, path, name, category, lastModifiedDate, isBackup, isHidden, "
        "isSystem, isDeleted, status, lastUpdatedDate, ext, size) "
        "SELECT -1, n || hex(zeroblob(7000000)), '', 3, 1, 0, 0, 0, 0, 1, 1, '', 1 FROM N");
  ASSERT_EQ(Waiting(), 12);
  Announce("scanned");
  EXPECT_TRUE(Await([this] {
    return testing::Matches(Contains(HasSubstr("string or blob too big")))(Logged());
  })) << testing::PrintToString(Logged());
  std::istringstream status(ReadBytes("/proc/" + std::to_string(Transcoder().Pid()) + "/status"));
  std::string word;
  while (status >> word && word != "VmHWM:") {
  }
  long long kibibytes = 0;
  status >> kibibytes;
  EXPECT_GT(kibibytes, 0);
  EXPECT_LT(kibibytes, 100 << 10);
}

TEST_F(HostileVolumes, AnErrorOfTheDatabaseNamesItsVolume) {
  fs::create_directories(At(".orva"));
  WriteBytes(At(".orva/orva.db"), std::string(8192, 'x'));
  Announce("scanned");
  ASSERT_TRUE(Await([this] { return !Logged().empty(); }));
  EXPECT_THAT(Logged(), testing::ElementsAre(testing::StartsWith(Root() + ": ")));
}

TEST_F(HostileVolumes, FoldersThatAreSwappedAllTheTimeAreNotLeft) {
  SKIP_WITHOUT_OTHER_USERS();
  Lines names;
  for (int i = 0; i < 120; ++i) {
    names.push_back(std::to_string(i) + ".jpg");
    CopyPhoto(names.back());
  }
  AddAllWaiting(names);
  // The volume belongs to a user who exchanges folders for links as fast as possible.
  fs::create_directory(At(".orva/renditions"));
  fs::create_directory(At(".orva/renditions/0"));
  fs::create_directory_symlink("/tmp/outside", At("link"));
  fs::create_directory_symlink("/tmp/outside/0", At("link0"));
  for (const char* const path : {"", ".orva", ".orva/renditions", ".orva/renditions/0"}) {
    ASSERT_EQ(chown(At(path).c_str(), 1234, 1234), 0);
  }
  chmod("/tmp/outside", 0777);
  chmod("/tmp/outside/0", 0777);
  const std::string renditions = At(".orva/renditions");
  const std::string folder = renditions + "/0";
  const std::string link = At("link");
  const std::string link0 = At("link0");
  const pid_t swapper = fork();
  if (swapper == 0) {
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (setgroups(0, nullptr) != 0 || setgid(1234) != 0 || setuid(1234) != 0) {
      _exit(1);
    }
    for (;;) {
      for (int i = 0; i < 2; ++i) {
        renameat2(AT_FDCWD, folder.c_str(), AT_FDCWD, link0.c_str(), RENAME_EXCHANGE);
        usleep(200);
      }
      for (int i = 0; i < 2; ++i) {
        renameat2(AT_FDCWD, renditions.c_str(), AT_FDCWD, link.c_str(), RENAME_EXCHANGE);
        usleep(200);
      }
    }
  }
  for (int i = 0; i < 20; ++i) {
    Announce("scanned");
    AwaitSent("\"Scanned\"");
  }
  EXPECT_TRUE(Await([this] { return Waiting() < 120; }));
  kill(swapper, SIGKILL);
  int status = 0;
  waitpid(swapper, &status, 0);
  EXPECT_TRUE(WIFSIGNALED(status));
  // Afterwards it converges. A rendition may have been lost in a folder that was moved away.
  KillTranscoder();
  StartTranscoder();
  Announce("scanned");
  EXPECT_TRUE(Await([&] {
    return Waiting() == 0 && std::ranges::all_of(names, [this](const std::string& name) {
             return fs::exists(Rendition(name));
           });
  }));
}

} // namespace

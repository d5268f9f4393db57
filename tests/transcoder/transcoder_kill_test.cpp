#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include "support/TestScale.h"

#include <gmock/gmock.h>

#include <chrono>
#include <csignal>
#include <random>
#include <thread>

namespace {

namespace test = orva::test;
using namespace orva::test;
namespace fs = std::filesystem;

using TranscoderKill = TranscoderTest;

TEST_F(TranscoderKill, AtAnyInstantNothingIsListedWithoutARendition) {
  const int kills = TestScale(10, 50);
  const int count = TestScale(120, 300);
  MakePhoto("/tmp/photo.jpg", 1200, 800);
  Lines names;
  for (int i = 0; i < count; ++i) {
    names.push_back(std::to_string(i) + ".jpg");
    fs::copy_file("/tmp/photo.jpg", At(names.back()));
  }
  AddAllWaiting(names);
  std::mt19937 random(7);
  for (int i = 0; i < kills; ++i) {
    Announce("scanned");
    // At a random point of the work: after so many photos, and so many files in memory.
    const long long photos = Waiting() - static_cast<long long>(random() % 60);
    const std::size_t files = random() % 100;
    const auto isReached = [&] {
      std::error_code ignored;
      std::size_t found = 0;
      for (auto entry =
               fs::recursive_directory_iterator(std::string(RUNTIME) + "/staging", ignored);
           !ignored && entry != fs::recursive_directory_iterator(); entry.increment(ignored)) {
        ++found;
      }
      return Waiting() <= std::max(photos, 0LL) || found > files;
    };
    Await(isReached, 0);
    KillTranscoder();
    for (const std::string& id : Query("SELECT sourceId FROM Transcodings WHERE status = 1")) {
      ASSERT_GT(fs::file_size(RenditionOf(std::stoll(id))), 100U) << id;
    }
    // Some wait again, so that there is always work.
    if (Waiting() < count / 3) {
      AddAllWaiting(names);
    }
    StartTranscoder();
    EXPECT_TRUE(Await([] { return fs::is_empty(std::string(RUNTIME) + "/staging"); }));
  }
  RenderAll();
  for (const std::string& name : names) {
    ASSERT_EQ(StateOf(name), "finished");
    ASSERT_EQ(HeaderOf(Rendition(name)).width, 1024);
  }
  EXPECT_TRUE(Await([&] {
    return std::distance(fs::directory_iterator(At(".orva/renditions/0")),
                         fs::directory_iterator()) == count;
  }));
}

TEST_F(TranscoderKill, ProgramsInTheSandboxEndWithTheService) {
  MakeSlowPhoto(At("slow.png"));
  AddWaiting("slow.png");
  Announce("scanned");
  const auto isRendering = [] { return test::Run({"pidof", "vipsthumbnail"}).status == 0; };
  ASSERT_TRUE(Await(isRendering));
  // It cannot end by itself.
  ASSERT_EQ(kill(std::stoi(RunChecked({"pidof", "-s", "vipsthumbnail"})), SIGSTOP), 0);
  KillTranscoder();
  EXPECT_TRUE(Await([&] { return !isRendering(); }));
}

TEST_F(TranscoderKill, APhotoWhoseProgramIsKilledIsRenderedLater) {
  MakeSlowPhoto(At("slow.png"));
  AddWaiting("slow.png");
  Announce("scanned");
  std::string program;
  ASSERT_TRUE(Await([&program] {
    program = test::Run({"pidof", "-s", "vipsthumbnail"}).output;
    return !program.empty();
  }));
  ASSERT_EQ(kill(std::stoi(program), SIGKILL), 0);
  ASSERT_TRUE(AwaitSent("\"End\""));
  EXPECT_EQ(StateOf("slow.png"), "waiting");
  EXPECT_TRUE(Await([this] { return StateOf("slow.png") != "waiting"; }));
  EXPECT_EQ(StateOf("slow.png"), "finished");
}

} // namespace

#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include "VolumeRoot.h"
#include "orva-transcoder/Renderer.h"
#include "orva-transcoder/Staging.h"
#include "orva-transcoder/Volume.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <ctime>
#include <filesystem>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

namespace {

namespace transcoder = orva::transcoder;
using namespace orva::test;
namespace fs = std::filesystem;

class SlowPhotos : public TranscoderTest {
protected:
  void TearDown() override {
    for (const pid_t id : Programs()) {
      kill(id, SIGCONT);
    }
    TranscoderTest::TearDown();
  }

  Lines AddPhotos(int count) const {
    Lines names;
    for (int i = 0; i < count; ++i) {
      names.push_back(std::to_string(i) + ".jpg");
      CopyPhoto(names.back());
    }
    AddAllWaiting(names);
    return names;
  }

  /// Those that render photos now.
  static std::vector<pid_t> Programs() {
    std::istringstream ids(orva::test::Run({"pidof", "vipsthumbnail"}).output);
    std::vector<pid_t> programs;
    for (pid_t id = 0; ids >> id;) {
      programs.push_back(id);
    }
    return programs;
  }

  /// Stops a program that renders: its photos become slow. Returns its id.
  static pid_t StopProgram() {
    pid_t stopped = 0;
    EXPECT_TRUE(Await([&] {
      const auto programs = Programs();
      stopped = programs.empty() ? 0 : programs.front();
      return stopped != 0 && kill(stopped, SIGSTOP) == 0;
    }));
    return stopped;
  }

  /// Files that the programs have written for this number of batches.
  static std::size_t OutputsOf(std::size_t batches) {
    std::size_t count = 0;
    for (std::size_t batch = 1; batch <= batches; ++batch) {
      std::error_code absent;
      for (const auto& file : fs::directory_iterator(
               std::string(RUNTIME) + "/staging/" + std::to_string(batch) + "/out", absent)) {
        count += file.file_size(absent) > 0 ? 1 : 0;
      }
    }
    return count;
  }
};

TEST_F(SlowPhotos, DoNotHoldUpAnotherVolume) {
  const Volume second("B", "100m");
  const std::size_t processors = std::max(std::thread::hardware_concurrency(), 1U);
  MakePhoto("/tmp/photo.jpg", 2000, 1500);
  AddPhotos(static_cast<int>(processors + 1) * 50);
  Announce("scanned");
  // The more photos a batch has rendered, the longer it is waited for.
  ASSERT_TRUE(Await([&] { return OutputsOf(processors) >= 20 * processors; }));
  for (const pid_t id : Programs()) {
    kill(id, SIGSTOP);
  }
  const long long waiting = Waiting();
  UseRoot(second.Path());
  CopyPhoto("b.jpg");
  AddWaiting("b.jpg");
  RenderAll();
  EXPECT_EQ(StateOf("b.jpg"), "finished");
  UseRoot("/shares/A");
  EXPECT_EQ(Waiting(), waiting);
}

TEST_F(SlowPhotos, AreRenderedOneByOneBesideTheOthers) {
  MakePhoto("/tmp/photo.jpg", 3000, 2000);
  const Lines names = AddPhotos(10);
  Announce("scanned");
  const pid_t group = StopProgram();
  EXPECT_TRUE(Await([group] { return kill(group, 0) != 0; })) << "not ended";
  const pid_t slow = StopProgram();
  CopyPhoto("new.jpg");
  AddWaiting("new.jpg");
  Announce("scanned");
  EXPECT_TRUE(Await([this] { return StateOf("new.jpg") == "finished"; }));
  EXPECT_GT(Waiting(), 0);
  EXPECT_TRUE(Await([slow] { return Programs() == std::vector{slow}; }));
  kill(slow, SIGCONT);
  RenderAll();
  for (const std::string& name : names) {
    EXPECT_EQ(StateOf(name), "finished") << name;
  }
}

TEST_F(SlowPhotos, TakeAllProcessorsWhenNoOthersWait) {
  const std::size_t processors = std::max(std::thread::hardware_concurrency(), 1U);
  MakePhoto("/tmp/photo.jpg", 3000, 2000);
  const Lines names = AddPhotos(10);
  Announce("scanned");
  const pid_t group = StopProgram();
  ASSERT_TRUE(Await([group] { return kill(group, 0) != 0; })) << "not ended";
  std::set<pid_t> stopped;
  EXPECT_TRUE(Await([&] {
    for (const pid_t id : Programs()) {
      kill(id, SIGSTOP);
      stopped.insert(id);
    }
    return Programs().size() == std::min<std::size_t>(processors, 10) &&
           stopped.size() >= Programs().size();
  }));
  for (const pid_t id : stopped) {
    kill(id, SIGCONT);
  }
  RenderAll();
  for (const std::string& name : names) {
    EXPECT_EQ(StateOf(name), "finished") << name;
  }
}

TEST_F(SlowPhotos, SmallPhotosOfABatchAreRenderedFirst) {
  KillTranscoder();
  MakePhoto(At("large.jpg"), 6000, 4000);
  MakePhoto(At("small.jpg"), 60, 40);
  AddAllWaiting({"small.jpg", "large.jpg"}); // the last one is taken first
  Query("UPDATE Files SET lastModifiedDate = 1000");
  for (const char* const name : {"large.jpg", "small.jpg"}) {
    fs::last_write_time(At(name), fs::file_time_type::clock::from_sys(
                                      std::chrono::system_clock::from_time_t(1000)));
  }
  transcoder::Volume volume(Root() + '/', orva::catalog::VolumeRoot::Kind::Mount);
  volume.Look();
  transcoder::PrepareStaging("/tmp/staging");
  constexpr long long SPACE = 100 << 20;
  const auto batch =
      volume.Stage("/tmp/staging/1", {.photos = 2, .bytes = SPACE, .space = SPACE, .most = SPACE},
                   [](long long) { return false; });
  ASSERT_TRUE(batch);
  ASSERT_EQ(batch->photos.size(), 2U);
  ASSERT_EQ(batch->photos.front().photo.path, "large.jpg");
  transcoder::Render(*batch);
  EXPECT_LT(fs::last_write_time(batch->folder.Output() + "/1.jpg"),
            fs::last_write_time(batch->folder.Output() + "/0.jpg"));
}

} // namespace

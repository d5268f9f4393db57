#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include "orva-transcoder/Staging.h"

#include <sys/mount.h>

#include <algorithm>
#include <cerrno>

namespace {

using namespace orva::test;
namespace fs = std::filesystem;

constexpr std::uintmax_t MIB = 1 << 20;

class Staging : public TranscoderTest {
protected:
  void TearDown() override {
    TranscoderTest::TearDown();
    umount2(RUNTIME, MNT_DETACH);
  }

  /// A photo with so many bytes: what follows the image is ignored.
  void MakeLarge(const std::string& name, std::uintmax_t size) const {
    CopyPhoto(name);
    fs::resize_file(At(name), size);
  }
};

TEST_F(Staging, CopiesLeaveAQuarterOfTheFileSystemFree) {
  RestartInFileSystem("64m");
  Lines names;
  for (int i = 0; i < 20; ++i) {
    names.push_back(std::to_string(i) + ".jpg");
    MakeLarge(names.back(), 6 * MIB);
  }
  AddAllWaiting(names);
  Announce("scanned");
  std::uintmax_t free = 64 * MIB;
  EXPECT_TRUE(Await(
      [&] {
        free = std::min(free, fs::space(RUNTIME).available);
        return Waiting() == 0;
      },
      0));
  EXPECT_LT(free, 64 * MIB);
  EXPECT_GT(free, 14 * MIB); // renditions are there, too
  for (const std::string& name : names) {
    EXPECT_EQ(StateOf(name), "finished") << name;
  }
}

TEST_F(Staging, APhotoThatNeverFitsFails) {
  RestartInFileSystem("100m");
  MakeLarge("large.jpg", 127 * MIB);
  MakeLarge("fits.jpg", 70 * MIB);
  AddAllWaiting({"large.jpg", "fits.jpg"});
  RenderAll();
  EXPECT_EQ(StateOf("large.jpg"),
            "failed: the file is larger than the 75 MiB that copies of photos may take");
  EXPECT_EQ(StateOf("fits.jpg"), "finished");
}

TEST_F(Staging, APhotoWaitsForSpaceThatOthersUse) {
  RestartInFileSystem("64m");
  const std::string other = std::string(RUNTIME) + "/other";
  WriteBytes(other, std::string(50 * MIB, 'x'));
  MakeLarge("a.jpg", 6 * MIB);
  AddWaiting("a.jpg");
  Announce("scanned");
  ASSERT_TRUE(AwaitSent("\"End\""));
  EXPECT_EQ(StateOf("a.jpg"), "waiting");
  fs::remove(other);
  EXPECT_TRUE(Await([this] { return StateOf("a.jpg") == "finished"; }));
}

TEST_F(Staging, TheFolderMayBeAMountPoint) {
  const std::string folder = "/tmp/staging";
  fs::create_directory(folder);
  RunChecked({"mount", "-t", "tmpfs", "-o", "size=8m", "staging", folder});
  WriteBytes(folder + "/1/in/0", "of an earlier run");
  orva::transcoder::PrepareStaging(folder);
  EXPECT_TRUE(fs::is_empty(folder));
  const orva::transcoder::StagingSpace space = orva::transcoder::SpaceFor(folder);
  EXPECT_EQ(space.now, 6LL << 20);
  EXPECT_EQ(space.most, 6LL << 20);
  EXPECT_EQ(umount2(folder.c_str(), 0), 0) << errno;
}

} // namespace

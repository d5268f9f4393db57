#include "DaemonLayerTest.h"

#include "Util.h"

#include "orvautil/FileDescriptor.h"

#include "support/OtherUsers.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <fstream>

namespace orva::test {
namespace {

using dbmerger::updateLocatorFile;
using ::testing::IsEmpty;
using util::FileDescriptor;

const std::string LOCATOR_PATH = "/tmp/zophotodbmerger.conf";

class LocatorTest : public DaemonLayerTest {
protected:
  void TearDown() override { EXPECT_THAT(Logged(), IsEmpty()) << "the locator is never logged"; }
};

std::string LocatorContent(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

TEST_F(LocatorTest, NamesTheDatabaseOfTheMountPoint) {
  updateLocatorFile("/shares/Vol");
  EXPECT_EQ("zophotos_db_path=/shares/Vol/.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, UsesTheMountPointUnchanged) {
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, EmptyMountPointLeavesOnlyTheKey) {
  updateLocatorFile("");
  EXPECT_EQ("zophotos_db_path=\n", Appliance::Locator());
}

TEST_F(LocatorTest, ShorterLineReplacesALongerOne) {
  updateLocatorFile("/shares/A rather long name of a volume/");
  updateLocatorFile("/shares/V/");
  EXPECT_EQ("zophotos_db_path=/shares/V//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, FileOfAnotherUserIsWritten) {
  SKIP_WITHOUT_OTHER_USERS();
  std::ofstream(LOCATOR_PATH) << "theirs";
  ASSERT_EQ(0, chown(LOCATOR_PATH.c_str(), 1, 1));
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, LinkInItsPlaceIsNotFollowed) {
  std::ofstream("/tmp/precious") << "keep";
  std::filesystem::create_symlink("/tmp/precious", LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("keep", LocatorContent("/tmp/precious"));
  EXPECT_TRUE(std::filesystem::is_symlink(LOCATOR_PATH));
}

TEST_F(LocatorTest, DanglingLinkInItsPlaceCreatesNothing) {
  std::filesystem::create_symlink("/tmp/nowhere", LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_FALSE(std::filesystem::exists("/tmp/nowhere"));
}

TEST_F(LocatorTest, DirectoryInItsPlaceIsIgnored) {
  MakeDirectory(LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_TRUE(std::filesystem::is_empty(LOCATOR_PATH));
}

TEST_F(LocatorTest, PipeWithoutAReaderIsNotWaitedFor) {
  ASSERT_EQ(0, mkfifo(LOCATOR_PATH.c_str(), 0666));
  updateLocatorFile("/shares/Vol/");
  EXPECT_TRUE(std::filesystem::is_fifo(LOCATOR_PATH));
}

TEST_F(LocatorTest, PipeWithAReaderGetsNothing) {
  ASSERT_EQ(0, mkfifo(LOCATOR_PATH.c_str(), 0666));
  const FileDescriptor reader(open(LOCATOR_PATH.c_str(), O_RDONLY | O_NONBLOCK));
  ASSERT_TRUE(reader);
  updateLocatorFile("/shares/Vol/");
  std::array<char, 64> bytes{};
  EXPECT_EQ(0, read(reader.Get(), bytes.data(), bytes.size())) << "nothing was written";
}

} // namespace
} // namespace orva::test

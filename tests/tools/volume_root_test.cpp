#include "catalog/VolumeRoot.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using catalog::VolumeRoot;

/// Refuses openat2 to the calling thread, as systemd does with RestrictSUIDSGID=yes.
bool RefuseOpenat2() {
  std::array<sock_filter, 4> rules{{{BPF_LD | BPF_W | BPF_ABS, 0, 0, offsetof(seccomp_data, nr)},
                                    {BPF_JMP | BPF_JEQ | BPF_K, 0, 1, SYS_openat2},
                                    {BPF_RET | BPF_K, 0, 0, SECCOMP_RET_ERRNO | ENOSYS},
                                    {BPF_RET | BPF_K, 0, 0, SECCOMP_RET_ALLOW}}};
  const sock_fprog program{rules.size(), rules.data()};
  return prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
         prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

/// With openat2, and without it.
class VolumeRootTest : public ::testing::TestWithParam<bool> {
protected:
  void SetUp() override {
    fs::create_directories(root / "a/b");
    std::ofstream(root / "a/b/file") << "content";
    std::ofstream(outside) << "outside";
    fs::create_symlink("a", root / "linked-folder");
    fs::create_symlink("a/b/file", root / "linked-file");
    fs::create_symlink("../outside", root / "a/escape");
  }

  /// Opens a path in a thread of its own. Returns what the file contains, or the errno.
  std::string Open(const std::string& path, int flags = O_RDONLY) const {
    std::string result;
    std::thread([&] {
      if (!GetParam() && !RefuseOpenat2()) {
        result = "no filter";
        return;
      }
      const VolumeRoot volume(root, VolumeRoot::Kind::Directory);
      const util::FileDescriptor file = volume.Open(path, flags, (flags & O_CREAT) != 0 ? 0640 : 0);
      const int error = errno;
      result = file ? Content(file.Get()) : std::to_string(error);
    }).join();
    return result;
  }

  fs::path root = "/tmp/volume"; // the /tmp of each test is its own
  fs::path outside = "/tmp/outside";

private:
  static std::string Content(int file) {
    struct stat status {};
    fstat(file, &status);
    if (S_ISDIR(status.st_mode)) {
      return "folder";
    }
    std::string content(100, '\0');
    const ssize_t count = read(file, content.data(), content.size());
    content.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
    return content;
  }
};

TEST_P(VolumeRootTest, OpensWhatIsBelowTheRoot) {
  EXPECT_EQ("content", Open("a/b/file"));
  EXPECT_EQ("folder", Open("a/b"));
  EXPECT_EQ("folder", Open("a/b/"));
  EXPECT_EQ("folder", Open(""));
  EXPECT_EQ("folder", Open("a", O_PATH));
}

TEST_P(VolumeRootTest, CreatesFiles) {
  EXPECT_EQ("", Open("a/new", O_RDWR | O_CREAT | O_EXCL));
  EXPECT_TRUE(fs::exists(root / "a/new"));
  EXPECT_EQ(std::to_string(EEXIST), Open("a/new", O_RDWR | O_CREAT | O_EXCL));
}

TEST_P(VolumeRootTest, FollowsNoLink) {
  EXPECT_EQ(std::to_string(ELOOP), Open("linked-file"));
  EXPECT_EQ(std::to_string(ELOOP), Open("linked-folder/b/file"));
  EXPECT_EQ(std::to_string(ELOOP), Open("linked-folder/"));
  EXPECT_EQ(std::to_string(ELOOP), Open("a/escape"));
}

TEST_P(VolumeRootTest, OpensNothingOutside) {
  EXPECT_EQ(std::to_string(EXDEV), Open("../outside"));
  EXPECT_EQ(std::to_string(EXDEV), Open("a/../../outside"));
  EXPECT_EQ(std::to_string(EXDEV), Open(outside.string()));
  EXPECT_EQ(std::to_string(EXDEV), Open(".."));
  // The system sees a path up to its first NUL.
  EXPECT_EQ(std::to_string(EXDEV), Open(std::string("..\0", 3), O_PATH));
  EXPECT_EQ(std::to_string(EXDEV), Open(std::string("..\0/", 4), O_PATH));
}

TEST_P(VolumeRootTest, FollowsNoLinkOfTheProcessFileSystem) {
  ASSERT_EQ(0, mount("proc", (root / "a").c_str(), "proc", 0, nullptr));
  EXPECT_EQ(std::to_string(ELOOP), Open("a/self/root"));
  const std::string process = "a/" + std::to_string(getpid());
  EXPECT_EQ("folder", Open(process));
  EXPECT_EQ(std::to_string(ELOOP), Open(process + "/root"));
  EXPECT_EQ(std::to_string(ELOOP), Open(process + "/root/tmp/outside"));
  EXPECT_EQ(std::to_string(ELOOP), Open(process + "/cwd/"));
  EXPECT_EQ(0, umount((root / "a").c_str()));
}

TEST_P(VolumeRootTest, DoesNotWaitForAFifo) {
  ASSERT_EQ(0, mkfifo((root / "fifo").c_str(), 0600));
  EXPECT_EQ("", Open("fifo"));
  EXPECT_EQ(std::to_string(ENXIO), Open("fifo", O_WRONLY));
  EXPECT_EQ(std::to_string(ENOTDIR), Open("fifo/file"));
  EXPECT_EQ(std::to_string(ENOTDIR), Open("fifo/"));
}

TEST_P(VolumeRootTest, SaysWhatIsMissing) {
  EXPECT_EQ(std::to_string(ENOENT), Open("a/none"));
  EXPECT_EQ(std::to_string(ENOENT), Open("none/file"));
  EXPECT_EQ(std::to_string(ENOTDIR), Open("a/b/file/none"));
}

INSTANTIATE_TEST_SUITE_P(System, VolumeRootTest, ::testing::Bool(), [](const auto& kind) {
  return kind.param ? "WithOpenat2" : "WithoutOpenat2";
});

} // namespace
} // namespace orva::test

#include "DaemonLayerTest.h"

#include "InstanceLock.h"

#include "orvautil/FileDescriptor.h"

#include "support/OtherUsers.h"

#include <fcntl.h>
#include <sys/fsuid.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using dbmerger::InstanceLock;
using util::FileDescriptor;

const std::string LOCK_DIRECTORY = "/run/zophotodbmerger";
const std::string FILE_PATH = LOCK_DIRECTORY + "/lock";

TEST(InstanceLock, IsHeldByOneAtATime) {
  {
    const InstanceLock first;
    EXPECT_FALSE(first.IsHeldByAnother());
    EXPECT_TRUE(InstanceLock().IsHeldByAnother());
    EXPECT_TRUE(InstanceLock().IsHeldByAnother()) << "a refused one has released it";
  }
  EXPECT_FALSE(InstanceLock().IsHeldByAnother());
}

TEST(InstanceLock, FileIsForItsOwnerOnlyWhateverTheUmask) {
  umask(0);
  const InstanceLock lock;
  EXPECT_EQ(0755U, ModeOf(LOCK_DIRECTORY));
  EXPECT_EQ(0600U, ModeOf(FILE_PATH));
}

TEST(InstanceLock, IsNotInheritedByOtherPrograms) {
  const InstanceLock lock;
  int found = 0;
  for (const auto& descriptor : fs::directory_iterator("/proc/self/fd")) {
    std::error_code error;
    if (fs::read_symlink(descriptor, error) == FILE_PATH) {
      EXPECT_EQ(FD_CLOEXEC, fcntl(std::stoi(descriptor.path().filename()), F_GETFD));
      ++found;
    }
  }
  EXPECT_EQ(1, found);
}

TEST(InstanceLock, UsesAnExistingDirectoryAndFile) {
  MakeDirectory(LOCK_DIRECTORY);
  std::ofstream(FILE_PATH) << "content";
  ASSERT_EQ(0, chmod(FILE_PATH.c_str(), 0600));
  const InstanceLock first;
  EXPECT_TRUE(InstanceLock().IsHeldByAnother());
  EXPECT_EQ(7U, fs::file_size(FILE_PATH));
}

TEST(InstanceLock, RepairsTheModeOfItsFile) {
  MakeDirectory(LOCK_DIRECTORY);
  for (const mode_t mode : {0644U, 0604U, 0640U, 0666U}) {
    std::ofstream(FILE_PATH) << "content";
    ASSERT_EQ(0, chmod(FILE_PATH.c_str(), mode));
    const InstanceLock first;
    EXPECT_FALSE(first.IsHeldByAnother());
    EXPECT_EQ(0600U, ModeOf(FILE_PATH));
    EXPECT_TRUE(InstanceLock().IsHeldByAnother());
  }
}

TEST(InstanceLock, IsHeldWhenTheFileOfRootCannotBeOpened) {
  SKIP_WITHOUT_OTHER_USERS();
  { const InstanceLock root; }
  setfsuid(1000); // without the privilege to open every file
  EXPECT_TRUE(InstanceLock().IsHeldByAnother());
  setfsuid(0);
  EXPECT_FALSE(InstanceLock().IsHeldByAnother());
}

TEST(InstanceLock, IsNotHeldWhenTheFileCannotBeCreated) {
  MakeDirectory(LOCK_DIRECTORY);
  setfsuid(1000);
  EXPECT_FALSE(InstanceLock().IsHeldByAnother());
  setfsuid(0);
}

/// What other users could lock or replace, or what is no file: there is no lock.
struct Unsafe {
  const char* name;
  void (*prepare)();
};

void MakeFile(const std::string& path, mode_t mode = 0600) {
  MakeDirectory(fs::path(path).parent_path());
  std::ofstream(path) << "content";
  ASSERT_EQ(0, chmod(path.c_str(), mode));
}

void GiveAway(const std::string& path) {
  SKIP_WITHOUT_OTHER_USERS();
  ASSERT_EQ(0, chown(path.c_str(), 65534, 65534));
}

const std::vector<Unsafe> UNSAFE{
    {"AParentThatOthersCanWrite", [] { ASSERT_EQ(0, chmod("/run", 01777)); }},
    {"ADirectoryThatItsGroupCanWrite",
     [] { ASSERT_EQ(0, chmod(MakeDirectory(LOCK_DIRECTORY).c_str(), 0775)); }},
    {"ADirectoryThatOthersCanWrite",
     [] { ASSERT_EQ(0, chmod(MakeDirectory(LOCK_DIRECTORY).c_str(), 0757)); }},
    {"ADirectoryOfAnotherUser", [] { GiveAway(MakeDirectory(LOCK_DIRECTORY)); }},
    {"ALinkToADirectory",
     [] { fs::create_directory_symlink(MakeDirectory("/tmp/elsewhere"), LOCK_DIRECTORY); }},
    {"AFileInPlaceOfTheDirectory", [] { MakeFile(LOCK_DIRECTORY); }},
    {"AFileOfAnotherUser",
     [] {
       MakeFile(FILE_PATH);
       GiveAway(FILE_PATH);
     }},
    {"AFileWithASecondName",
     [] {
       MakeFile(FILE_PATH);
       fs::create_hard_link(FILE_PATH, LOCK_DIRECTORY + "/second");
     }},
    {"ALinkToAFile",
     [] {
       MakeFile("/tmp/elsewhere");
       MakeDirectory(LOCK_DIRECTORY);
       fs::create_symlink("/tmp/elsewhere", FILE_PATH);
     }},
    {"ADanglingLink",
     [] {
       MakeDirectory(LOCK_DIRECTORY);
       fs::create_symlink("/tmp/elsewhere", FILE_PATH);
     }},
    {"AFifo",
     [] {
       MakeDirectory(LOCK_DIRECTORY);
       ASSERT_EQ(0, mkfifo(FILE_PATH.c_str(), 0600));
     }},
    {"ADirectoryInPlaceOfTheFile", [] { MakeDirectory(FILE_PATH); }},
};

/// Without this function gtest prints the bytes of the object.
void PrintTo(const Unsafe& place, std::ostream* stream) {
  *stream << place.name;
}

class UnsafeInstanceLock : public ::testing::TestWithParam<Unsafe> {};

TEST_P(UnsafeInstanceLock, IsNoLock) {
  GetParam().prepare();
  if (IsSkipped() || HasFatalFailure()) {
    return;
  }
  const bool elsewhere = fs::exists("/tmp/elsewhere");
  const InstanceLock first;
  EXPECT_FALSE(first.IsHeldByAnother());
  EXPECT_FALSE(InstanceLock().IsHeldByAnother());
  EXPECT_EQ(elsewhere, fs::exists("/tmp/elsewhere"));
  EXPECT_FALSE(fs::exists("/tmp/elsewhere/lock"));
}

INSTANTIATE_TEST_SUITE_P(With, UnsafeInstanceLock, ::testing::ValuesIn(UNSAFE),
                         [](const auto& tested) { return tested.param.name; });

} // namespace
} // namespace orva::test

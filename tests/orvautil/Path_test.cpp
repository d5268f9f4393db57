#include "orvautil/Path.h"

#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

namespace orva::util {
namespace {

namespace fs = std::filesystem;

/// Paths of each kind.
class PathOnDisk : public testing::Test {
protected:
  PathOnDisk() {
    fs::remove_all("/tmp/path");
    fs::create_directories("/tmp/path/folder");
    std::ofstream("/tmp/path/file") << "content";
    fs::create_symlink("folder", "/tmp/path/link");
    fs::create_symlink("nowhere", "/tmp/path/dangling");
  }
};

bool Exists(const std::string& path) {
  return Path(path).Exists();
}
std::string Canonicalize(const std::string& path) {
  return Path(path).Canonicalize();
}
std::string Basic(const std::string& path) {
  return Path(path).Basic();
}
bool Create(const std::string& path, unsigned permissions) {
  return Path(path).Create(permissions);
}

unsigned Permissions(const std::string& path) {
  return static_cast<unsigned>(fs::status(path).permissions());
}

TEST_F(PathOnDisk, ExistsIsTrueForFilesFoldersAndLinksToThem) {
  EXPECT_TRUE(Exists("/tmp/path/folder"));
  EXPECT_TRUE(Exists("/tmp/path/folder/"));
  EXPECT_TRUE(Exists("/tmp/path/file"));
  EXPECT_TRUE(Exists("/tmp/path/link"));
}

TEST_F(PathOnDisk, ExistsIsFalseForMissingPathsAndDanglingLinks) {
  EXPECT_FALSE(Exists("/tmp/path/none"));
  EXPECT_FALSE(Exists("/tmp/path/dangling"));
  EXPECT_FALSE(Exists("/tmp/path/file/below"));
  EXPECT_FALSE(Exists(""));
}

TEST_F(PathOnDisk, ExistsLooksAtTheFileSystemEachTime) {
  const std::string text = "/tmp/path/later";
  const Path path(text);
  EXPECT_FALSE(path.Exists());
  EXPECT_TRUE(path.Create(0700));
  EXPECT_TRUE(path.Exists());
}

TEST_F(PathOnDisk, CreateMakesADirectoryWithThePermissionsLessTheUmask) {
  const mode_t before = umask(0);
  EXPECT_TRUE(Create("/tmp/path/open", 0775));
  umask(027);
  EXPECT_TRUE(Create("/tmp/path/masked", 0775));
  umask(before);
  EXPECT_TRUE(fs::is_directory("/tmp/path/open"));
  EXPECT_EQ(Permissions("/tmp/path/open"), 0775U);
  EXPECT_EQ(Permissions("/tmp/path/masked"), 0750U);
}

TEST_F(PathOnDisk, CreateMakesNoParents) {
  EXPECT_FALSE(Create("/tmp/path/none/below", 0775));
  EXPECT_FALSE(fs::exists("/tmp/path/none"));
}

TEST_F(PathOnDisk, CreateFailsForAPathThatExists) {
  fs::permissions("/tmp/path/folder", fs::perms{0700});
  EXPECT_FALSE(Create("/tmp/path/folder", 0775));
  EXPECT_FALSE(Create("/tmp/path/file", 0775));
  EXPECT_FALSE(Create("/tmp/path/dangling", 0775));
  EXPECT_EQ(Permissions("/tmp/path/folder"), 0700U);
  EXPECT_FALSE(fs::exists("/tmp/path/nowhere"));
}

TEST_F(PathOnDisk, CanonicalizeGivesTheAbsolutePathWithoutLinksDotsOrTrailingSeparators) {
  EXPECT_EQ(Canonicalize("/tmp/path/link"), "/tmp/path/folder");
  EXPECT_EQ(Canonicalize("/tmp//path/./file/../link///"), "");
  EXPECT_EQ(Canonicalize("/tmp//path/./folder/../link///"), "/tmp/path/folder");
  EXPECT_EQ(Canonicalize("/tmp/path/file"), "/tmp/path/file");
  EXPECT_EQ(Canonicalize("/"), "/");
}

TEST_F(PathOnDisk, CanonicalizeResolvesARelativePathInTheWorkingDirectory) {
  const fs::path before = fs::current_path();
  fs::current_path("/tmp/path");
  EXPECT_EQ(Canonicalize("folder/"), "/tmp/path/folder");
  EXPECT_EQ(Canonicalize("."), "/tmp/path");
  fs::current_path(before);
}

TEST_F(PathOnDisk, CanonicalizeOfAMissingPathIsEmpty) {
  EXPECT_EQ(Canonicalize("/tmp/path/none"), "");
  EXPECT_EQ(Canonicalize("/tmp/path/dangling"), "");
  EXPECT_EQ(Canonicalize("DUMMY_MOUNT_POINT"), "");
  EXPECT_EQ(Canonicalize(""), "");
}

TEST(Path, BasicDropsTrailingSeparatorsOnly) {
  EXPECT_EQ(Basic("/shares/Vol"), "/shares/Vol");
  EXPECT_EQ(Basic("/shares/Vol/"), "/shares/Vol");
  EXPECT_EQ(Basic("/shares/Vol//"), "/shares/Vol");
  EXPECT_EQ(Basic("//shares//Vol/."), "//shares//Vol/.");
  EXPECT_EQ(Basic("relative/"), "relative");
  EXPECT_EQ(Basic(""), "");
}

TEST(Path, BasicKeepsTheRoot) {
  EXPECT_EQ(Basic("/"), "/");
  EXPECT_EQ(Basic("///"), "/");
}

TEST(Path, TheSeparatorIsASlash) {
  EXPECT_EQ(Path::GetNativePathSeparator(), '/');
}

TEST(MakePath, JoinsWithExactlyOneSeparator) {
  EXPECT_EQ(MakePath("/shares/Vol", "Pictures"), "/shares/Vol/Pictures");
  EXPECT_EQ(MakePath("/shares/Vol/", "Pictures"), "/shares/Vol/Pictures");
  EXPECT_EQ(MakePath("/shares/Vol", "/Pictures"), "/shares/Vol/Pictures");
  EXPECT_EQ(MakePath("/shares/Vol//", "//Pictures"), "/shares/Vol/Pictures");
}

TEST(MakePath, KeepsInnerAndTrailingSeparators) {
  EXPECT_EQ(MakePath("/shares/Vol/", "Pictures/"), "/shares/Vol/Pictures/");
  EXPECT_EQ(MakePath("/shares//Vol", "a//b//"), "/shares//Vol/a//b//");
}

TEST(MakePath, AddsNoSeparatorBelowTheRoot) {
  EXPECT_EQ(MakePath("/", "shares"), "/shares");
  EXPECT_EQ(MakePath("/", "/"), "/");
}

TEST(MakePath, AnEmptyDirectoryGivesTheName) {
  EXPECT_EQ(MakePath("", "name"), "name");
  EXPECT_EQ(MakePath("", "/name"), "/name");
  EXPECT_EQ(MakePath("", ""), "");
}

TEST(MakePath, AnEmptyNameGivesTheDirectoryAndASeparator) {
  EXPECT_EQ(MakePath("/shares/Vol", ""), "/shares/Vol/");
  EXPECT_EQ(MakePath("/shares/Vol/", ""), "/shares/Vol/");
  EXPECT_EQ(MakePath("/", ""), "/");
}

} // namespace
} // namespace orva::util

// The files of photos: originals and renditions, on volumes that are untrusted.

#include "zophotos-web/VolumeFiles.h"

#include "hostile/SpecialFile.h"
#include "support/OtherUsers.h"
#include "system/Catalog.h"
#include "system/Volume.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fcntl.h>
#include <grp.h>
#include <malloc.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <vector>

namespace orva::web {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr uid_t NOBODY = 65534;

void Write(const std::string& path, const std::string& content) {
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << content;
}

/// The content of an open file; "(none)" if there is none.
std::string ContentOf(const std::optional<VolumeFile>& file) {
  if (!file) {
    return "(none)";
  }
  std::string content(file->size, '\0');
  const ssize_t count = pread(file->file.Get(), content.data(), content.size(), 0);
  content.resize(static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
  return content;
}

/// A volume with a catalog that has a.jpg and sea/b.jpg, and their renditions.
class WebFiles : public ::testing::Test {
protected:
  void SetUp() override {
    catalog.AddPhoto("a.jpg", 1000, 2000);
    catalog.AddFolder("sea/", 10);
    catalog.AddPhoto("sea/b.jpg", 1001, 2001);
    Write("/shares/A/a.jpg", "original a");
    Write("/shares/A/sea/b.jpg", "original b");
    WriteRendition("a.jpg", "rendition a");
    WriteRendition("sea/b.jpg", "rendition b");
  }

  std::string RenditionOf(const std::string& path) const {
    const std::string id = catalog.Rows().Run("SELECT id FROM Files WHERE path = ?", {path}).at(0);
    return "/shares/A/.orva/renditions/0/" + id + ".jpg";
  }

  /// Changes the catalog as the indexer does. The change stays in the log.
  void UseLog() const {
    catalog.Rows().Run("PRAGMA journal_mode = WAL");
    catalog.Rows().Run("UPDATE Files SET lastUpdatedDate = lastUpdatedDate + 1");
    ASSERT_NE(0U, fs::file_size("/shares/A/.orva/orva.db-wal"));
  }

  void WriteRendition(const std::string& path, const std::string& content) const {
    Write(RenditionOf(path), content);
  }

  static Photo PhotoAt(const std::string& path, const std::string& volume = "/shares/A/") {
    Photo photo;
    photo.id = static_cast<PhotoId>(std::hash<std::string>{}(path));
    photo.path = volume + path;
    photo.volume = volume;
    return photo;
  }

  std::string Original(const std::string& path, const std::string& mountPoint = "/shares/A/") {
    return ContentOf(files.OpenOriginal(PhotoAt(path, mountPoint)));
  }

  std::string Rendition(const std::string& path, const std::string& mountPoint = "/shares/A/") {
    return ContentOf(files.OpenRendition(PhotoAt(path, mountPoint)));
  }

  /// What a new process of another user reads as the rendition of a.jpg.
  static std::string RenditionForOtherUser() {
    std::array<int, 2> ends{};
    EXPECT_EQ(0, pipe(ends.data()));
    const pid_t child = fork();
    if (child == 0) {
      if (setgroups(0, nullptr) != 0 || setgid(NOBODY) != 0 || setuid(NOBODY) != 0) {
        _exit(1);
      }
      VolumeFiles own([](const std::string&) {});
      const std::string content = ContentOf(own.OpenRendition(PhotoAt("a.jpg")));
      const ssize_t written = write(ends[1], content.data(), content.size());
      _exit(written == static_cast<ssize_t>(content.size()) ? 0 : 1);
    }
    close(ends[1]);
    std::string content(100, '\0');
    const ssize_t count = read(ends[0], content.data(), content.size());
    content.resize(static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    close(ends[0]);
    int status = 0;
    EXPECT_EQ(child, waitpid(child, &status, 0));
    EXPECT_EQ(0, status);
    return content;
  }

  test::Volume volume{"A", "100m"};
  test::Catalog catalog{volume};
  std::vector<std::string> log;
  VolumeFiles files{[this](const std::string& text) { log.push_back(text); }};
};

TEST_F(WebFiles, AreFoundByPath) {
  EXPECT_EQ("original a", Original("a.jpg"));
  EXPECT_EQ("original b", Original("sea/b.jpg"));
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  EXPECT_EQ("rendition b", Rendition("sea/b.jpg"));
  EXPECT_THAT(log, IsEmpty());
}

TEST_F(WebFiles, HaveATagThatChangesWithTheContent) {
  const auto before = files.OpenOriginal(PhotoAt("a.jpg"));
  EXPECT_EQ(before->tag, files.OpenOriginal(PhotoAt("a.jpg"))->tag);
  Write("/shares/A/a.jpg", "another original");
  EXPECT_NE(before->tag, files.OpenOriginal(PhotoAt("a.jpg"))->tag);
}

TEST_F(WebFiles, OfPagesAreLookedUpTogether) {
  files.Expect({PhotoAt("a.jpg"), PhotoAt("sea/b.jpg")});
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  // Was looked up with a.jpg: the content of the catalog does not matter any more.
  catalog.Rows().Run("DELETE FROM Files");
  EXPECT_EQ("rendition b", Rendition("sea/b.jpg"));
}

// As after the election of another master: the ids of photos are given again.
TEST_F(WebFiles, AreNotMixedUpWhenAnotherPhotoHasTheId) {
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  Photo other = PhotoAt("sea/b.jpg");
  other.id = PhotoAt("a.jpg").id;
  EXPECT_EQ("rendition b", ContentOf(files.OpenRendition(other)));
}

TEST_F(WebFiles, AreLookedUpAgainForAnotherPhotoAtTheSamePath) {
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  catalog.Rows().Run("UPDATE Files SET isDeleted = 1 WHERE path = 'a.jpg'");
  catalog.Rows().Run("UPDATE Files SET path = 'a.jpg' WHERE path = 'sea/b.jpg'");
  Photo other = PhotoAt("a.jpg");
  ++other.id;
  EXPECT_EQ("rendition b", ContentOf(files.OpenRendition(other)));
}

TEST_F(WebFiles, ThatAreExpectedTakeLittleMemory) {
  const std::size_t before = mallinfo2().uordblks;
  for (int i = 0; i < 50; ++i) {
    const std::string mountPoint = "/shares/" + std::to_string(i) + '/';
    for (int page = 0; page < 10; ++page) {
      const std::string folder = std::string(4000, 'x') + std::to_string(page) + '/';
      files.Expect(std::vector<Photo>(100, PhotoAt(folder + "a.jpg", mountPoint)));
    }
  }
  EXPECT_LT(mallinfo2().uordblks, before + (16 << 20));
}

TEST_F(WebFiles, AreLookedUpAgainInAnotherCatalog) {
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  const std::string rendition = RenditionOf("a.jpg");
  fs::rename("/shares/A/.orva", "/shares/A/old");
  test::Catalog other{volume};
  EXPECT_EQ("(none)", Rendition("a.jpg"));
  other.AddPhotos("", 5, 100);
  other.AddPhoto("a.jpg", 1000, 2000);
  const std::string id = other.Rows().Run("SELECT id FROM Files WHERE path = 'a.jpg'").at(0);
  Write("/shares/A/.orva/renditions/0/" + id + ".jpg", "another rendition");
  EXPECT_EQ("another rendition", Rendition("a.jpg"));
}

TEST_F(WebFiles, AreMissingIfTheCatalogDoesNotHaveThem) {
  catalog.Rows().Run("UPDATE Files SET isDeleted = 1 WHERE path = 'a.jpg'");
  EXPECT_EQ("(none)", Rendition("a.jpg"));
  EXPECT_EQ("(none)", Rendition("missing.jpg"));
  EXPECT_THAT(log, IsEmpty());
}

TEST_F(WebFiles, AreMissingOnAnUnpluggedVolume) {
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  EXPECT_EQ("(none)", Rendition("a.jpg", "/shares/B/"));
  EXPECT_EQ("(none)", Original("a.jpg", "/shares/B/"));
}

TEST_F(WebFiles, DoNotKeepTheVolumeMounted) {
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  EXPECT_EQ("original a", Original("a.jpg"));
  fs::create_directory("/shares/Other");
  ASSERT_EQ(0, mount("Other", "/shares/Other", "tmpfs", 0, nullptr));
  {
    test::Catalog other("/shares/Other");
    other.AddPhoto("a.jpg", 1, 2);
    Write("/shares/Other/.orva/renditions/0/1.jpg", "other rendition");
    EXPECT_EQ("other rendition", Rendition("a.jpg", "/shares/Other/"));
  }
  EXPECT_EQ(0, umount("/shares/Other"));
}

TEST_F(WebFiles, AreNeverOutsideTheVolume) {
  Write("/shares/outside.jpg", "outside");
  Write("/secret.jpg", "outside");
  for (const char* const path :
       {"../outside.jpg", "sea/../../outside.jpg", "/shares/outside.jpg", "./a.jpg", "sea/../a.jpg",
        "sea//b.jpg", "a.jpg/", "", "sea", "..", "."}) {
    EXPECT_EQ("(none)", Original(path)) << path;
    EXPECT_EQ("(none)", Rendition(path)) << path;
  }
  EXPECT_EQ("(none)", Original(std::string("a.jpg\0.txt", 10)));
  for (const char* const mountPoint :
       {"/", "/shares/", "/shares//", "/shares/./", "/shares/../", "/shares/A/sea/", "/shares/A",
        "/tmp/", "", "shares/A/", "<DUMMY>"}) {
    EXPECT_EQ("(none)", Original("a.jpg", mountPoint)) << mountPoint;
    EXPECT_EQ("(none)", Original("outside.jpg", mountPoint)) << mountPoint;
    EXPECT_EQ("(none)", Rendition("a.jpg", mountPoint)) << mountPoint;
  }
  Photo other = PhotoAt("a.jpg");
  other.path = "/shares/B/a.jpg";
  EXPECT_EQ("(none)", ContentOf(files.OpenOriginal(other)));
}

TEST_F(WebFiles, AreNeverBehindLinks) {
  Write("/shares/outside.jpg", "outside");
  fs::create_directory("/shares/folder");
  Write("/shares/folder/c.jpg", "outside");
  fs::create_symlink("/shares/outside.jpg", "/shares/A/link.jpg");
  fs::create_symlink("a.jpg", "/shares/A/inside.jpg");
  fs::create_symlink("/shares/folder", "/shares/A/folder");
  fs::create_symlink("/shares/folder", "/shares/L");
  for (const char* const path : {"link.jpg", "inside.jpg", "folder/c.jpg"}) {
    EXPECT_EQ("(none)", Original(path)) << path;
  }
  EXPECT_EQ("(none)", Original("c.jpg", "/shares/L/"));
}

TEST_F(WebFiles, AreNeverTheProductsOwn) {
  Write("/shares/A/.zophotos/zophotos.db", "merged database");
  Write("/shares/A/.ORVA/x.jpg", "in another spelling");
  for (const char* const path :
       {".orva/orva.db", ".orva/renditions/0/1.jpg", ".zophotos/zophotos.db", ".ORVA/x.jpg"}) {
    EXPECT_EQ("(none)", Original(path)) << path;
  }
  // A file system may know the folder by another name, too.
  fs::create_directory("/shares/A/ORVA~1");
  ASSERT_EQ(0, mount("/shares/A/.orva", "/shares/A/ORVA~1", nullptr, MS_BIND, nullptr));
  EXPECT_EQ("(none)", Original("ORVA~1/orva.db"));
  ASSERT_EQ(0, umount("/shares/A/ORVA~1"));
}

/// What can be in the place of a file.
class WebSpecialFiles : public WebFiles, public ::testing::WithParamInterface<test::SpecialKind> {};

TEST_P(WebSpecialFiles, AreNotOriginals) {
  Write("/shares/outside.jpg", "outside");
  const test::SpecialFile special(GetParam(), "/shares/A/a.jpg", "/shares/outside.jpg");
  EXPECT_EQ("(none)", Original("a.jpg"));
}

TEST_P(WebSpecialFiles, AreNotRenditions) {
  Write("/shares/outside.jpg", "outside");
  const test::SpecialFile special(GetParam(), RenditionOf("a.jpg"), "/shares/outside.jpg");
  EXPECT_EQ("(none)", Rendition("a.jpg"));
  EXPECT_EQ("rendition b", Rendition("sea/b.jpg"));
}

TEST_P(WebSpecialFiles, AreNotCatalogs) {
  fs::create_directory("/tmp/elsewhere");
  fs::copy_file("/shares/A/.orva/orva.db", "/tmp/elsewhere/orva.db");
  const test::SpecialFile special(GetParam(), "/shares/A/.orva/orva.db", "/tmp/elsewhere/orva.db");
  EXPECT_EQ("(none)", Rendition("a.jpg"));
}

INSTANTIATE_TEST_SUITE_P(Kinds, WebSpecialFiles, ::testing::ValuesIn(test::SPECIAL_KINDS),
                         [](const auto& kind) { return test::NameOf(kind.param); });

TEST_F(WebFiles, AreNotServedIfARenditionIsTooLarge) {
  fs::resize_file(RenditionOf("a.jpg"), std::uintmax_t{17} << 20);
  EXPECT_EQ("(none)", Rendition("a.jpg"));
}

TEST_F(WebFiles, AreMissingIfTheCatalogIsDamaged) {
  Write("/shares/B/.orva/orva.db", std::string(10'000, 'x'));
  EXPECT_EQ("(none)", Rendition("a.jpg", "/shares/B/"));
  ASSERT_EQ(1U, log.size());
  EXPECT_THAT(log[0], HasSubstr("cannot read the catalog of /shares/B: "));
  EXPECT_EQ("(none)", Rendition("a.jpg", "/shares/B/"));
  EXPECT_EQ(1U, log.size());
}

TEST_F(WebFiles, IgnoreIdsThatAreNoFileNames) {
  fs::create_directories("/shares/B/.orva");
  {
    const test::Database other("/shares/B/.orva/orva.db", true);
    other.Run("CREATE TABLE Files(id, path, isDeleted)");
    other.Run("INSERT INTO Files VALUES(-5, 'a.jpg', 0), ('x/../../../a', 'b.jpg', 0), "
              "(NULL, 'c.jpg', 0), (1.5, 'd.jpg', 0), (x'00', 'e.jpg', 0)");
  }
  for (const char* const path : {"a.jpg", "b.jpg", "c.jpg", "d.jpg", "e.jpg"}) {
    EXPECT_EQ("(none)", Rendition(path, "/shares/B/")) << path;
  }
}

TEST_F(WebFiles, IgnoreComputedCatalogs) {
  fs::create_directories("/shares/B/.orva");
  {
    const test::Database other("/shares/B/.orva/orva.db", true);
    other.Run(
        "CREATE VIEW Files AS WITH RECURSIVE c(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM c) "
        "SELECT i AS id, 'x' AS path, 0 AS isDeleted FROM c");
  }
  EXPECT_EQ("(none)", Rendition("a.jpg", "/shares/B/"));
  EXPECT_EQ(1U, log.size());
}

TEST_F(WebFiles, GiveUpOnCatalogsThatTakeTooLong) {
  fs::create_directories("/shares/B/.orva");
  {
    const test::Database other("/shares/B/.orva/orva.db", true);
    other.Run("CREATE TABLE Files(id INTEGER PRIMARY KEY, path TEXT, isDeleted INTEGER)");
    other.Run("WITH RECURSIVE c(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM c WHERE i < 2000000) "
              "INSERT INTO Files SELECT i, 'p', 0 FROM c");
  }
  // Each of them reads the whole table.
  std::vector<Photo> photos;
  photos.reserve(200);
  for (int i = 0; i < 200; ++i) {
    photos.push_back(PhotoAt(std::to_string(i), "/shares/B/"));
  }
  files.Expect(photos);
  EXPECT_EQ("(none)", Rendition("a.jpg", "/shares/B/"));
  EXPECT_THAT(log, ElementsAre(HasSubstr("/shares/B: more work than")));
}

TEST_F(WebFiles, AreFoundWhileAWriterIsAtWork) {
  UseLog();
  catalog.Rows().Run("BEGIN IMMEDIATE");
  catalog.Rows().Run("UPDATE Files SET lastUpdatedDate = lastUpdatedDate + 1");
  EXPECT_EQ("rendition a", Rendition("a.jpg"));
  catalog.Rows().Run("ROLLBACK");
}

TEST_F(WebFiles, AreFoundInTheLog) {
  UseLog();
  catalog.AddPhoto("new.jpg", 5, 6);
  WriteRendition("new.jpg", "new rendition");
  EXPECT_EQ("new rendition", Rendition("new.jpg"));
}

TEST_F(WebFiles, ChangeNothingNextToACatalogAfterACrash) {
  UseLog();
  fs::create_directories("/shares/B/.orva");
  for (const char* const suffix : {"", "-wal"}) {
    fs::copy_file(std::string("/shares/A/.orva/orva.db") + suffix,
                  std::string("/shares/B/.orva/orva.db") + suffix);
  }
  EXPECT_EQ("(none)", Rendition("a.jpg", "/shares/B/"));
  EXPECT_THAT(log, ElementsAre(HasSubstr("its write-ahead log is not in use")));
  EXPECT_FALSE(fs::exists("/shares/B/.orva/orva.db-shm"));
}

TEST_F(WebFiles, AreFoundByAUserWhoCannotWrite) {
  SKIP_WITHOUT_OTHER_USERS();
  UseLog();
  EXPECT_EQ("rendition a", RenditionForOtherUser());
  // Without the logs, as they are when all writers have ended.
  catalog.Rows().Run("PRAGMA wal_checkpoint(TRUNCATE)");
  fs::remove("/shares/A/.orva/orva.db-wal");
  fs::remove("/shares/A/.orva/orva.db-shm");
  EXPECT_EQ("rendition a", RenditionForOtherUser());
  EXPECT_FALSE(fs::exists("/shares/A/.orva/orva.db-shm"));
  fs::permissions(RenditionOf("a.jpg"), fs::perms::owner_read);
  EXPECT_EQ("(none)", RenditionForOtherUser());
}

TEST_F(WebFiles, AreMissingIfTheUserMayNotReadTheCatalog) {
  SKIP_WITHOUT_OTHER_USERS();
  fs::permissions("/shares/A/.orva/orva.db", fs::perms::owner_read);
  EXPECT_EQ("(none)", RenditionForOtherUser());
}

TEST_F(WebFiles, AreFoundOnAReadOnlyVolume) {
  test::Volume other("B", "10m");
  {
    test::Catalog onOther(other);
    onOther.AddPhoto("a.jpg", 1, 2);
    onOther.Rows().Run("PRAGMA journal_mode = WAL");
    Write("/shares/B/.orva/renditions/0/1.jpg", "rendition on B");
  }
  other.MakeReadOnly();
  EXPECT_EQ("rendition on B", Rendition("a.jpg", "/shares/B/"));
}

} // namespace
} // namespace orva::web

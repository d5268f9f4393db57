#include "TestDB.h"

#include "system/Database.h"

#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"
#include "orvadb/VolumeDB.h"

#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sys/mount.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <system_error>
#include <vector>

namespace orva::db {
namespace {

namespace fs = std::filesystem;
using test::Database;
using test::Thrown;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

/// A catalog with rows as texts.
class Catalog : public VolumeDB {
public:
  using VolumeDB::Handle;
  using VolumeDB::VolumeDB;

  std::vector<std::string> Rows(const char* sql) const {
    std::vector<std::string> rows;
    Statement select(*this, sql);
    while (select.Fetch()) {
      rows.push_back(select.GetText(0));
    }
    return rows;
  }
};

/// A file system of its own below /shares, mounted for as long as the object lives.
class Mount {
public:
  explicit Mount(std::string point) : point_(std::move(point)) {
    fs::create_directories(point_);
    Check(mount("tmpfs", point_.c_str(), "tmpfs", 0, "size=4m"));
    fs::create_directory(point_ + "/.orva");
  }
  Mount(const Mount&) = delete;
  Mount& operator=(const Mount&) = delete;
  ~Mount() { umount2(point_.c_str(), MNT_DETACH); }

  void MakeReadOnly() const {
    Check(mount(nullptr, point_.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr));
  }

private:
  static void Check(int result) {
    if (result != 0) {
      throw std::system_error(errno, std::generic_category(), "mount");
    }
  }

  std::string point_;
};

/// Files in the folder of the catalog.
std::vector<std::string> FilesIn(const std::string& folder) {
  std::vector<std::string> names;
  for (const auto& entry : fs::directory_iterator(folder)) {
    names.push_back(entry.path().filename());
  }
  return names;
}

/// A volume with the product's folder and no catalog yet.
class VolumeDBTest : public testing::Test {
protected:
  VolumeDBTest() {
    fs::remove_all(volume);
    fs::create_directories(home);
  }

  /// Writes a catalog that holds the text `kept`.
  static void WriteCatalog(const std::string& path) {
    Database(path, true).exec("CREATE TABLE t(a); INSERT INTO t VALUES('kept')");
  }

  const std::string volume = "/shares/Vol";
  const std::string home = volume + "/.orva";
  const std::string catalog = home + "/orva.db";
};

TEST_F(VolumeDBTest, FindsTheCatalogOfTheVolume) {
  WriteCatalog(catalog);
  const Catalog db(volume, false);
  EXPECT_EQ(db.GetPath(), catalog);
  EXPECT_THAT(db.Rows("SELECT a FROM t"), ElementsAre("kept"));
}

TEST_F(VolumeDBTest, ThePrefixIsTheMountPointAsItWasGiven) {
  WriteCatalog(catalog);
  EXPECT_EQ(Catalog("/shares/Vol", false).GetPrefix(), "/shares/Vol");
  EXPECT_EQ(Catalog("/shares/Vol/", false).GetPrefix(), "/shares/Vol/");
  const Catalog db("/shares//./Vol//", false);
  EXPECT_EQ(db.GetPrefix(), "/shares//./Vol//");
  EXPECT_EQ(static_cast<const DB&>(db).GetPrefix(), "/shares//./Vol//");
  EXPECT_EQ(db.GetPath(), catalog);
}

TEST_F(VolumeDBTest, OpeningForReadingCreatesNothing) {
  EXPECT_THAT(Thrown([&] { Catalog(volume, false); }),
              AllOf(HasSubstr("unable to open database file"), HasSubstr(catalog)));
  EXPECT_TRUE(fs::is_empty(home));
}

TEST_F(VolumeDBTest, OpeningForReadingWritesNothing) {
  WriteCatalog(catalog);
  const Catalog db(volume, false);
  EXPECT_THAT(Thrown([&] { db.Rows("DELETE FROM t"); }),
              HasSubstr("attempt to write a readonly database"));
  EXPECT_THAT(FilesIn(home), ElementsAre("orva.db"));
}

TEST_F(VolumeDBTest, OpeningForWritingCreatesTheFileButNotItsFolder) {
  {
    const Catalog db(volume, true);
    db.Rows("CREATE TABLE t(a)");
  }
  EXPECT_THAT(Database(catalog).Run("SELECT name FROM sqlite_master"), ElementsAre("t"));
  fs::remove_all(home);
  EXPECT_THROW(Catalog(volume, true), std::string);
  EXPECT_FALSE(fs::exists(home));
}

TEST_F(VolumeDBTest, ACatalogThatIsBeingWrittenIsWaitedFor) {
  WriteCatalog(catalog);
  EXPECT_THAT(Catalog(volume, false).Rows("PRAGMA busy_timeout"), ElementsAre("5000"));
  EXPECT_THAT(Catalog(volume, true).Rows("PRAGMA busy_timeout"), ElementsAre("5000"));
}

TEST_F(VolumeDBTest, AMissingVolumeIsAnError) {
  EXPECT_THAT(Thrown([] { Catalog("/shares/None/", false); }), HasSubstr("'/shares/None/'"));
  EXPECT_THROW(Catalog("/shares/None", true), std::string);
  EXPECT_THROW(Catalog("", false), std::string);
  EXPECT_THROW(Catalog("DUMMY_MOUNT_POINT", false), std::string);
  EXPECT_FALSE(fs::exists("/shares/None"));
}

TEST_F(VolumeDBTest, AMountPointMayBeALink) {
  WriteCatalog(catalog);
  fs::remove("/shares/Link");
  fs::create_symlink("Vol", "/shares/Link");
  const Catalog db("/shares/Link/", false);
  EXPECT_THAT(db.Rows("SELECT a FROM t"), ElementsAre("kept"));
  EXPECT_EQ(db.GetPrefix(), "/shares/Link/");
}

TEST_F(VolumeDBTest, LinksBelowTheMountPointAreNotFollowed) {
  WriteCatalog("/tmp/elsewhere.db");
  fs::create_symlink("/tmp/elsewhere.db", catalog);
  EXPECT_THROW(Catalog(volume, false), std::string);
  EXPECT_THROW(Catalog(volume, true), std::string);

  fs::remove_all(home);
  fs::create_directories("/tmp/elsewhere");
  fs::copy("/tmp/elsewhere.db", "/tmp/elsewhere/orva.db", fs::copy_options::overwrite_existing);
  fs::create_symlink("/tmp/elsewhere", home);
  EXPECT_THROW(Catalog(volume, false), std::string);
}

TEST_F(VolumeDBTest, SpecialFilesAreRefusedWithoutWaiting) {
  ASSERT_EQ(mkfifo(catalog.c_str(), 0666), 0);
  EXPECT_THROW(Catalog(volume, false), std::string);
  EXPECT_THROW(Catalog(volume, true), std::string);
  fs::remove(catalog);
  fs::create_directory(catalog);
  EXPECT_THROW(Catalog(volume, false), std::string);
}

TEST_F(VolumeDBTest, AnEmptyFileIsACatalogWithoutTables) {
  std::ofstream{catalog};
  const Catalog db(volume, false);
  EXPECT_THAT(db.Rows("SELECT name FROM sqlite_master"), IsEmpty());
  EXPECT_EQ(fs::file_size(catalog), 0U);
}

TEST_F(VolumeDBTest, ALogOfARunningWriterIsReadWithTheCatalog) {
  WriteCatalog(catalog);
  Database indexer(catalog, true);
  indexer.exec("PRAGMA journal_mode = WAL; INSERT INTO t VALUES('logged')");
  EXPECT_THAT(Catalog(volume, false).Rows("SELECT a FROM t"), ElementsAre("kept", "logged"));
  indexer.exec("INSERT INTO t VALUES('later')");
  EXPECT_THAT(Catalog(volume, false).Rows("SELECT a FROM t"),
              ElementsAre("kept", "logged", "later"));
}

// Read-only file systems, with volumes of different names.

class ReadOnlyVolumeTest : public testing::TestWithParam<std::string> {
protected:
  /// Writes a catalog that holds the text `kept`, with the journal `mode`.
  void WriteCatalog(const std::string& mode) const {
    Database indexer(catalog, true);
    indexer.exec("PRAGMA journal_mode = " + mode);
    indexer.exec("CREATE TABLE t(a); INSERT INTO t VALUES('kept')");
  }

  const std::string point = "/shares/" + GetParam();
  const std::string home = point + "/.orva";
  const std::string catalog = home + "/orva.db";
  const Mount volume{point};
};

TEST_P(ReadOnlyVolumeTest, ACatalogWithARollbackJournalIsRead) {
  WriteCatalog("DELETE");
  volume.MakeReadOnly();
  const Catalog db(point, false);
  EXPECT_EQ(db.GetPath(), catalog);
  EXPECT_THAT(db.Rows("SELECT a FROM t"), ElementsAre("kept"));
}

TEST_P(ReadOnlyVolumeTest, ACatalogWhoseLogIsAbsentIsRead) {
  WriteCatalog("WAL");
  ASSERT_THAT(FilesIn(home), ElementsAre("orva.db"));
  volume.MakeReadOnly();
  const Catalog db(point, false);
  EXPECT_EQ(db.GetPath(), catalog);
  EXPECT_EQ(db.GetPrefix(), point);
  EXPECT_THAT(db.Rows("SELECT a FROM t"), ElementsAre("kept"));
  EXPECT_THAT(db.Rows("PRAGMA busy_timeout"), ElementsAre("5000"));
}

TEST_P(ReadOnlyVolumeTest, ACatalogWhoseLogIsEmptyIsRead) {
  WriteCatalog("WAL");
  std::ofstream{catalog + "-wal"};
  volume.MakeReadOnly();
  EXPECT_THAT(Catalog(point, false).Rows("SELECT a FROM t"), ElementsAre("kept"));
}

TEST_P(ReadOnlyVolumeTest, ACatalogWithALogToReadIsAnError) {
  {
    Database indexer(catalog, true);
    sqlite3_db_config(indexer.getHandle(), SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
    indexer.exec("PRAGMA journal_mode = WAL; CREATE TABLE t(a); INSERT INTO t VALUES('kept')");
  }
  ASSERT_GT(fs::file_size(catalog + "-wal"), 0U);
  volume.MakeReadOnly();
  EXPECT_THAT(Thrown([&] { Catalog(point, false); }),
              AllOf(HasSubstr(catalog), HasSubstr("write-ahead log")));
}

TEST_P(ReadOnlyVolumeTest, AnAbsentCatalogIsAnError) {
  volume.MakeReadOnly();
  EXPECT_THROW(Catalog(point, false), std::string);
  EXPECT_THROW(Catalog(point, true), std::string);
}

TEST_P(ReadOnlyVolumeTest, AWritableVolumeIsReadAndWritten) {
  WriteCatalog("WAL");
  EXPECT_THAT(Catalog(point, false).Rows("SELECT a FROM t"), ElementsAre("kept"));
  Catalog(point, true).Rows("INSERT INTO t VALUES('more')");
  EXPECT_THAT(Catalog(point, false).Rows("SELECT a FROM t"), ElementsAre("kept", "more"));
}

std::string TestName(const testing::TestParamInfo<std::string>& info) {
  static const std::vector<std::string> names = {"Plain",   "QuestionMark", "NumberSign",
                                                 "Percent", "Ampersand",    "NonAscii"};
  return names.at(info.index);
}

INSTANTIATE_TEST_SUITE_P(Volume, ReadOnlyVolumeTest,
                         testing::Values("Plain", "Que?mode=rwc", "Ha#sh", "Per%41cent", "A b&c=d",
                                         "Caf\xc3\xa9"),
                         TestName);

/// A catalog in WAL mode that the daemon sees on a read-only mount, and its indexer on a writable
/// one. Nothing is in the log before a test.
class ReadOnlyViewTest : public testing::Test {
protected:
  ReadOnlyViewTest() {
    indexer.exec("PRAGMA journal_mode = WAL; CREATE TABLE t(a); INSERT INTO t VALUES('kept')");
    EmptyLog();
    fs::create_directory("/shares/View");
    if (mount("/shares/Vol", "/shares/View", nullptr, MS_BIND, nullptr) != 0 ||
        mount(nullptr, "/shares/View", nullptr, MS_BIND | MS_REMOUNT | MS_RDONLY, nullptr) != 0) {
      throw std::system_error(errno, std::generic_category(), "mount");
    }
  }
  ~ReadOnlyViewTest() override { umount2("/shares/View", MNT_DETACH); }

  void EmptyLog() { indexer.exec("PRAGMA wal_checkpoint(TRUNCATE)"); }

  /// Reads the catalog in one transaction, in which `change` happens. Returns why it fails.
  static std::string ReadDuring(const std::function<void()>& change) {
    const Catalog db("/shares/View", false);
    Transaction transaction(db, 1000);
    EXPECT_THAT(db.Rows("SELECT a FROM t"), ElementsAre("kept"));
    change();
    try {
      transaction.Commit();
    } catch (const std::string& failure) {
      return failure;
    }
    return {};
  }

  const Mount volume{"/shares/Vol"};
  Database indexer{"/shares/Vol/.orva/orva.db", true};
};

TEST_F(ReadOnlyViewTest, AnUnchangedCatalogIsRead) {
  EXPECT_EQ(ReadDuring([] {}), "");
}

TEST_F(ReadOnlyViewTest, ACatalogThatWasWrittenAndCheckpointedIsNotReadAsOneState) {
  EXPECT_THAT(ReadDuring([&] {
                indexer.exec("UPDATE t SET a = 'late'");
                EmptyLog();
              }),
              HasSubstr("'/shares/View/.orva/orva.db' was changed while it was read"));
}

TEST_F(ReadOnlyViewTest, ACatalogWhoseLogWasWrittenIsNotReadAsOneState) {
  EXPECT_THAT(ReadDuring([&] { indexer.exec("UPDATE t SET a = 'late'"); }),
              HasSubstr("was changed while it was read"));
}

TEST_F(ReadOnlyViewTest, ACatalogThatWasReplacedIsNotReadAsOneState) {
  EXPECT_THAT(ReadDuring([&] {
                fs::copy_file("/shares/Vol/.orva/orva.db", "/shares/Vol/.orva/copy");
                fs::rename("/shares/Vol/.orva/copy", "/shares/Vol/.orva/orva.db");
              }),
              HasSubstr("was changed while it was read"));
}

TEST_F(ReadOnlyViewTest, TheNextReadSeesTheChange) {
  ReadDuring([&] {
    indexer.exec("UPDATE t SET a = 'late'");
    EmptyLog();
  });
  EXPECT_THAT(Catalog("/shares/View", false).Rows("SELECT a FROM t"), ElementsAre("late"));
}

} // namespace
} // namespace orva::db

#include "DaemonLayerTest.h"

#include "Database.h"
#include "File.h"
#include "Folder.h"
#include "PhotoDB.h"
#include "Statistics.h"
#include "Tracer.h"

#include "orvadb/File.h"
#include "orvadb/Folder.h"
#include "orvadb/Statement.h"
#include "orvadb/Transaction.h"

#include "orvautil/Exception.h"
#include "orvautil/OwnerVector.h"

#include "support/OtherUsers.h"

#include <sqlite3.h>
#include <sys/fsuid.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdint>
#include <fstream>
#include <functional>

namespace orva::test {
namespace {

using dbmerger::PhotoDB;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::StartsWith;

const std::string LOCATION = "/shares/Vol";
const std::string DIRECTORY = LOCATION + "/.zophotos";
const std::string VOLUME = "/shares/Vol/";

/// An existing location without a database.
class PhotoDBLocationTest : public DaemonLayerTest {
protected:
  PhotoDBLocationTest() { MakeDirectory(LOCATION); }
};

const std::string CHANGE_FAILED =
    "Change permissions failed on dbLocation: '/shares/Vol/.zophotos'";

/// A location where another user exchanges or changes the directory while it is being created.
class PhotoDBNewDirectoryTest : public PhotoDBLocationTest {
protected:
  using Condition = std::function<bool(const SystemCall&)>;

  /// Constructs a PhotoDB in another process as `user`. Calls `interfere` before the first system
  /// call that `holds` accepts. Returns the message of the exception; empty if there is none.
  static std::string Construct(uid_t user, const Condition& holds,
                               const std::function<void()>& interfere) {
    const pid_t child = fork();
    if (child == 0) {
      setfsuid(user);
      raise(SIGSTOP);
      std::string message;
      try {
        const PhotoDB photos(LOCATION);
      } catch (const util::Exception& exception) {
        message = exception.what();
      }
      _exit(message.empty() ? 0 : message == CHANGE_FAILED ? 1 : 2);
    }
    waitpid(child, nullptr, WUNTRACED);
    {
      Tracer tracer(child);
      kill(child, SIGCONT);
      tracer.RunUntil(holds);
      interfere();
    }
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) < 2) << status;
    return status == 0 ? "" : CHANGE_FAILED;
  }

  /// Accepts the first system call after the directory was created.
  static Condition AfterCreation() {
    return [created = false](const SystemCall& call) mutable {
      const bool now = created;
      created = created || call.number == SYS_mkdir || call.number == SYS_mkdirat;
      return now;
    };
  }

  /// Puts the directory `path` in the place of the new one.
  static void Exchange(const std::string& path) {
    std::filesystem::rename(DIRECTORY, "/shares/Vol/created");
    std::filesystem::rename(path, DIRECTORY);
  }
};

/// A new database.
class PhotoDBTest : public PhotoDBLocationTest {
protected:
  PhotoDBTest() : photos(LOCATION) { photos.Init(); }

  Lines Rows(const std::string& sql) const { return MergedRows(LOCATION, sql); }

  void AddFolder(const std::string& path, const std::string& volume = VOLUME,
                 std::time_t modified = 0) const {
    db::Folder folder;
    folder.path = path;
    folder.lastModifiedDate = modified;
    photos.AddFolder(volume, folder);
  }

  void AddFile(const std::string& folder, const std::string& name,
               const std::string& volume = VOLUME, std::time_t modified = 0) const {
    db::File file;
    file.path = folder + name;
    file.name = name;
    file.lastModifiedDate = modified;
    photos.AddFile(volume, file);
  }

  std::string DeleteFolder(const std::string& path, const std::string& volume = VOLUME) const {
    return OutputOf([&] {
      db::Folder folder;
      folder.path = path;
      photos.DeleteFolder(volume, folder);
    });
  }

  std::string DeleteFile(const std::string& folder, const std::string& name,
                         const std::string& volume = VOLUME) const {
    return OutputOf([&] {
      db::File file;
      file.path = folder + name;
      file.name = name;
      photos.DeleteFile(volume, file);
    });
  }

  /// Makes every change fail that would give two rows of `table` the same value in `column`.
  void RefuseDuplicates(const std::string& table, const std::string& column) const {
    Rows("CREATE UNIQUE INDEX refuse ON " + table + "(" + column + ")");
  }

  PhotoDB photos;
};

// The location.

TEST_F(PhotoDBLocationTest, NewDirectoryIsWritableByEverybodyWithAnyUmask) {
  const mode_t mask = umask(0077);
  PhotoDB photos(LOCATION);
  umask(mask);
  EXPECT_EQ(0777U, ModeOf(DIRECTORY));
  EXPECT_FALSE(std::filesystem::exists(MergedDatabasePath(LOCATION))) << "nothing is opened yet";
}

TEST_F(PhotoDBLocationTest, ExistingDirectoryKeepsItsMode) {
  MakeDirectory(DIRECTORY);
  chmod(DIRECTORY.c_str(), 0755);
  PhotoDB(LOCATION).Init();
  EXPECT_EQ(0755U, ModeOf(DIRECTORY));
  EXPECT_TRUE(std::filesystem::exists(MergedDatabasePath(LOCATION)));
}

TEST_F(PhotoDBLocationTest, DifferentPathsOfADirectoryAreOneLocation) {
  std::filesystem::create_directory_symlink(LOCATION, "/shares/Link");
  for (const char* const form : {"/shares/Vol", "/shares/Vol/", "/shares/Vol//", "/shares/./Vol/.",
                                 "/shares/Vol/../Vol", "/shares/Link"}) {
    PhotoDB photos(form);
    photos.Init();
    EXPECT_EQ(MergedDatabasePath(LOCATION), photos.GetPath()) << form;
  }
}

TEST_F(PhotoDBLocationTest, MissingLocationHasItsDatabaseInTheWorkingDirectory) {
  std::filesystem::current_path(MakeDirectory("/tmp/scratch"));
  PhotoDB photos("DUMMY_MOUNT_POINT");
  photos.Init();
  EXPECT_TRUE(std::filesystem::exists("/tmp/scratch/.zophotos/zophotos.db"));
  EXPECT_EQ(0777U, ModeOf("/tmp/scratch/.zophotos"));
}

TEST_F(PhotoDBLocationTest, FileInTheDirectorysPlaceIsAnUnusableLocation) {
  std::ofstream(DIRECTORY) << "in the way";
  EXPECT_EQ("Invalid DB location : '/shares/Vol/.zophotos'",
            Thrown<PhotoDB::Error>([] { PhotoDB photos(LOCATION); }).Message());
}

TEST_F(PhotoDBLocationTest, LinkInTheDirectorysPlaceIsAnUnusableLocation) {
  MakeDirectory("/shares/Elsewhere");
  chmod("/shares/Elsewhere", 0700);
  std::filesystem::create_directory_symlink("/shares/Elsewhere", DIRECTORY);
  EXPECT_EQ("Invalid DB location : '/shares/Vol/.zophotos'",
            Thrown<PhotoDB::Error>([] { PhotoDB photos(LOCATION); }).Message());
  EXPECT_EQ(0700U, ModeOf("/shares/Elsewhere"));
}

TEST_F(PhotoDBLocationTest, DanglingLinkInTheDirectorysPlaceIsAnUnusableLocation) {
  std::filesystem::create_directory_symlink("/shares/Nowhere", DIRECTORY);
  EXPECT_THROW(PhotoDB photos(LOCATION), PhotoDB::Error);
  EXPECT_FALSE(std::filesystem::exists("/shares/Nowhere"));
}

TEST_F(PhotoDBLocationTest, UnusableLocationIsNoStandardException) {
  EXPECT_FALSE((std::is_base_of_v<std::exception, PhotoDB::Error>));
}

TEST_F(PhotoDBLocationTest, DirectoryThatCannotBeCreatedIsAnException) {
  ASSERT_EQ(0, mount("volume", LOCATION.c_str(), "tmpfs", MS_RDONLY, nullptr));
  EXPECT_EQ(CHANGE_FAILED, Thrown<util::Exception>([] { PhotoDB photos(LOCATION); }).what());
}

TEST_F(PhotoDBLocationTest, NewDirectoryNeedsNoProcFileSystem) {
  ASSERT_EQ(0, mount("nothing", "/proc", "tmpfs", 0, nullptr));
  EXPECT_NO_THROW(PhotoDB photos(LOCATION));
  EXPECT_EQ(0, umount("/proc"));
  EXPECT_EQ(0777U, ModeOf(DIRECTORY));
}

TEST_F(PhotoDBNewDirectoryTest, DirectoryWithContentInItsPlaceKeepsItsMode) {
  const std::string other = MakeDirectory("/shares/Vol/private");
  std::ofstream(other + "/letter") << "private";
  chmod(other.c_str(), 0700);
  EXPECT_EQ(CHANGE_FAILED, Construct(0, AfterCreation(), [&] { Exchange(other); }));
  EXPECT_EQ(0700U, ModeOf(DIRECTORY));
  EXPECT_TRUE(std::filesystem::exists(DIRECTORY + "/letter"));
}

TEST_F(PhotoDBNewDirectoryTest, DirectoryOfAnotherUserInItsPlaceKeepsItsMode) {
  SKIP_WITHOUT_OTHER_USERS();
  const std::string other = MakeDirectory("/shares/Vol/private");
  chmod(other.c_str(), 0700);
  ASSERT_EQ(0, chown(other.c_str(), 1000, 1000));
  EXPECT_EQ(CHANGE_FAILED, Construct(0, AfterCreation(), [&] { Exchange(other); }));
  EXPECT_EQ(0700U, ModeOf(DIRECTORY));
}

TEST_F(PhotoDBNewDirectoryTest, LinkInItsPlaceIsNotFollowed) {
  const std::string other = MakeDirectory("/shares/private");
  chmod(other.c_str(), 0700);
  EXPECT_EQ(CHANGE_FAILED, Construct(0, AfterCreation(), [&] {
              std::filesystem::remove(DIRECTORY);
              std::filesystem::create_directory_symlink(other, DIRECTORY);
            }));
  EXPECT_EQ(0700U, ModeOf(other));
  EXPECT_TRUE(std::filesystem::is_symlink(DIRECTORY));
}

TEST_F(PhotoDBNewDirectoryTest, FileSystemMayReportItsOwnOwner) {
  SKIP_WITHOUT_OTHER_USERS();
  ASSERT_EQ(0, chown(LOCATION.c_str(), 1000, 1000));
  // What this user creates has another owner than the effective user, as on such a file system.
  EXPECT_EQ("", Construct(1000, AfterCreation(), [] {}));
  EXPECT_EQ(0777U, ModeOf(DIRECTORY));
}

TEST_F(PhotoDBNewDirectoryTest, DirectoryWhoseModeCannotBeChangedIsRemovedAgain) {
  SKIP_WITHOUT_OTHER_USERS();
  ASSERT_EQ(0, chown(LOCATION.c_str(), 1000, 1000));
  const auto changesTheMode = [](const SystemCall& call) {
    return call.number == SYS_fchmod || call.number == SYS_fchmodat;
  };
  // Only the owner may change the mode.
  EXPECT_EQ(CHANGE_FAILED, Construct(1000, changesTheMode,
                                     [] { ASSERT_EQ(0, chown(DIRECTORY.c_str(), 2000, 2000)); }));
  EXPECT_FALSE(std::filesystem::exists(DIRECTORY));
  EXPECT_NO_THROW(PhotoDB photos(LOCATION));
  EXPECT_EQ(0777U, ModeOf(DIRECTORY));
}

TEST_F(PhotoDBLocationTest, NewDirectoryIsRemovedAgainWhenItCannotBeOpenedOrListed) {
  // A sanitizer opens a pipe to check a type for the first time: let it do so now.
  EXPECT_NE(CHANGE_FAILED, Thrown<util::Exception>([] { PhotoDB photos("/proc"); }).what());
  rlimit unlimited{};
  ASSERT_EQ(0, getrlimit(RLIMIT_NOFILE, &unlimited));
  const int next = dup(STDOUT_FILENO);
  close(next);
  for (const int available : {0, 1}) {
    const rlimit limit{static_cast<rlim_t>(next + available), unlimited.rlim_max};
    ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &limit));
    EXPECT_EQ(CHANGE_FAILED, Thrown<util::Exception>([] { PhotoDB photos(LOCATION); }).what());
    EXPECT_FALSE(std::filesystem::exists(DIRECTORY)) << available << " descriptors";
    ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &unlimited));
  }
  const int same = dup(STDOUT_FILENO);
  close(same);
  EXPECT_EQ(next, same) << "a descriptor has leaked";
  EXPECT_NO_THROW(PhotoDB photos(LOCATION));
}

TEST_F(PhotoDBLocationTest, LinkInTheFilesPlaceIsRefused) {
  MakeDirectory(DIRECTORY);
  std::filesystem::create_symlink("/shares/Elsewhere.db", MergedDatabasePath(LOCATION));
  PhotoDB photos(LOCATION);
  EXPECT_THROW(photos.Init(), std::string);
  EXPECT_FALSE(std::filesystem::exists("/shares/Elsewhere.db"));
}

// Creation and loading.

TEST_F(PhotoDBLocationTest, RecordIsUnsetUntilInit) {
  const PhotoDB photos(LOCATION);
  EXPECT_EQ(-1, photos.status.id);
  EXPECT_EQ("1.0", photos.status.mc_version);
  EXPECT_EQ(0, photos.status.mdate);
  EXPECT_EQ(0, photos.status.etype);
  EXPECT_EQ("", photos.status.desc);
}

TEST_F(PhotoDBTest, SchemaIsExact) {
  // SQLite keeps the statements as they were sent, but for "IF NOT EXISTS".
  EXPECT_THAT(
      Rows("SELECT sql FROM sqlite_master WHERE name != 'sqlite_sequence' ORDER BY rowid"),
      ElementsAre(
          "CREATE TABLE Status(id INTEGER PRIMARY KEY AUTOINCREMENT, mc_version CHAR(16) NOT NULL, "
          "mdate INTEGER NOT NULL, desc CHAR(80), etype INTEGER)",
          "CREATE TABLE Statistics(id INTEGER PRIMARY KEY AUTOINCREMENT, volume TEXT NOT NULL, "
          "photos_xcoded INTEGER NOT NULL, photos_total INTEGER NOT NULL, last_updated_time INTEGER "
          "NOT NULL)",
          "CREATE TABLE Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, parent_folder_id "
          "INTEGER NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT "
          "NULL)",
          "CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER NOT "
          "NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, "
          "created_date INTEGER NOT NULL, FOREIGN KEY(folder_id) REFERENCES Folders(folder_id) ON "
          "DELETE CASCADE)",
          "CREATE INDEX Folders_folderId ON Folders(parent_folder_id)",
          "CREATE INDEX Folders_path ON Folders(name)",
          "CREATE INDEX Files_folderId ON Files(folder_id)",
          "CREATE INDEX Files_name ON Files(name)"));
}

TEST_F(PhotoDBTest, NewDatabaseHasItsStatusRowAndItsRootFolder) {
  EXPECT_THAT(Rows("SELECT id, mc_version, mdate, typeof(desc), desc, etype FROM Status"),
              ElementsAre("1|2.0|1000|text||0"));
  EXPECT_THAT(Rows("SELECT * FROM Folders"), ElementsAre("1|-1|/shares/|0|<DUMMY>"));
  EXPECT_THAT(Rows("SELECT * FROM Files"), IsEmpty());
  EXPECT_THAT(Rows("SELECT * FROM Statistics"), IsEmpty());
}

TEST_F(PhotoDBTest, NewDatabaseLeavesTheRecordWithoutAnId) {
  EXPECT_EQ(-1, photos.status.id);
  EXPECT_EQ("2.0", photos.status.mc_version);
  EXPECT_EQ(1000, photos.status.mdate);
  EXPECT_EQ(0, photos.status.etype);
  EXPECT_EQ("", photos.status.desc);
}

TEST_F(PhotoDBTest, KeepsTheDefaultJournal) {
  EXPECT_THAT(Rows("PRAGMA journal_mode"), ElementsAre("delete"));
}

TEST_F(PhotoDBTest, ExistingDatabaseFillsTheRecord) {
  Rows("UPDATE Status SET mc_version = '3.7', mdate = 123456, desc = 'text', etype = 9");
  PhotoDB again(LOCATION);
  again.Init();
  EXPECT_EQ(1, again.status.id);
  EXPECT_EQ("3.7", again.status.mc_version);
  EXPECT_EQ(123456, again.status.mdate);
  EXPECT_EQ(9, again.status.etype);
  EXPECT_EQ("text", again.status.desc);
}

TEST_F(PhotoDBTest, TimeOfTheStatusIsReadIn32Bits) {
  Rows("UPDATE Status SET mdate = 4294967301");
  PhotoDB again(LOCATION);
  again.Init();
  EXPECT_EQ(5, again.status.mdate);
}

TEST_F(PhotoDBTest, ExistingDatabaseWithoutAStatusRowLeavesTheRecordUnset) {
  Rows("DELETE FROM Status");
  PhotoDB again(LOCATION);
  again.Init();
  EXPECT_EQ(-1, again.status.id);
  EXPECT_EQ("1.0", again.status.mc_version);
  EXPECT_EQ(0, again.status.mdate);
  EXPECT_EQ(0, again.status.etype);
  EXPECT_EQ("", again.status.desc);
  EXPECT_THAT(Rows("SELECT * FROM Status"), IsEmpty());
}

TEST_F(PhotoDBTest, ExistingFileWithoutAStatusTableIsThrown) {
  Rows("DROP TABLE Status");
  PhotoDB again(LOCATION);
  EXPECT_THAT(Thrown([&] { again.Init(); }), HasSubstr("SELECT * FROM Status"));
}

TEST_F(PhotoDBLocationTest, FileThatIsNoDatabaseIsThrown) {
  MakeDirectory(DIRECTORY);
  std::ofstream(MergedDatabasePath(LOCATION)) << std::string(4096, 'x');
  PhotoDB photos(LOCATION);
  EXPECT_THROW(photos.Init(), std::string);
}

TEST_F(PhotoDBTest, SecondInitReloadsTheRecordAndKeepsTheRows) {
  AddFolder("/shares/Vol/");
  photos.Init();
  EXPECT_EQ(1, photos.status.id);
  EXPECT_EQ("2.0", photos.status.mc_version);
  EXPECT_EQ(1000, photos.status.mdate);
  EXPECT_THAT(MergedFolders(LOCATION), ElementsAre("/shares/Vol/|/shares/Vol/"));
  EXPECT_THAT(Rows("SELECT count(*) FROM Status"), ElementsAre("1"));
}

TEST_F(PhotoDBTest, ClearLeavesAnEmptyOpenDatabase) {
  AddFolder("/shares/Vol/");
  photos.Clear();
  EXPECT_EQ(MergedDatabasePath(LOCATION), photos.GetPath());
  EXPECT_THAT(Rows("SELECT * FROM sqlite_master"), IsEmpty());
  EXPECT_EQ("2.0", photos.status.mc_version);
  EXPECT_EQ(1000, photos.status.mdate);
  photos.CreateTables();
  photos.CreateIndices();
  EXPECT_THAT(Rows("SELECT name FROM Folders"), ElementsAre("/shares/"));
}

TEST_F(PhotoDBTest, ClearOfAnUnopenedDatabaseCreatesIt) {
  std::filesystem::remove_all(DIRECTORY);
  PhotoDB fresh(LOCATION);
  fresh.Clear();
  EXPECT_EQ(MergedDatabasePath(LOCATION), fresh.GetPath());
}

TEST_F(PhotoDBTest, DumpChangesAndPrintsNothing) {
  const Lines before = MergedContent(LOCATION);
  EXPECT_EQ("", OutputOf([&] { photos.DumpTable("Folders"); }));
  EXPECT_EQ(before, MergedContent(LOCATION));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, InheritsThePrefixAndTheStatusOfItsLayer) {
  EXPECT_EQ("", photos.GetPrefix());
  const Lines before = MergedContent(LOCATION);
  photos.UpdateStatus("key", "value");
  EXPECT_EQ(before, MergedContent(LOCATION));
}

// Folders.

TEST_F(PhotoDBTest, RootFolderAsARecord) {
  const auto root = photos.GetFolder(1);
  ASSERT_TRUE(root);
  EXPECT_EQ(1, root->folder_id);
  EXPECT_EQ(-1, root->parent_folder_id);
  EXPECT_EQ("/shares/", root->name);
  EXPECT_EQ("shares", root->folder_name);
  EXPECT_EQ(0, root->modified_date);
  EXPECT_EQ("<DUMMY>", root->volume);
}

TEST_F(PhotoDBTest, UnknownFolderIsNull) {
  EXPECT_FALSE(photos.GetFolder(2));
  EXPECT_FALSE(photos.GetFolder("/shares/Vol/", VOLUME));
  EXPECT_FALSE(photos.GetFolder("/shares/", VOLUME)) << "the root is of another volume";
}

TEST_F(PhotoDBTest, TopFolderOfAVolumeIsAChildOfTheRoot) {
  AddFolder("/shares/Vol/", VOLUME, 1234);
  EXPECT_THAT(Rows("SELECT * FROM Folders WHERE folder_id != 1"),
              ElementsAre("2|1|/shares/Vol/|1234|/shares/Vol/"));
}

TEST_F(PhotoDBTest, FolderIsAChildOfItsParent) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Vol/Pictures/", VOLUME, 1234);
  const auto folder = photos.GetFolder("/shares/Vol/Pictures/", VOLUME);
  ASSERT_TRUE(folder);
  EXPECT_EQ(3, folder->folder_id);
  EXPECT_EQ(2, folder->parent_folder_id);
  EXPECT_EQ("/shares/Vol/Pictures/", folder->name);
  EXPECT_EQ("Pictures", folder->folder_name);
  EXPECT_EQ(1234, folder->modified_date);
  EXPECT_EQ(VOLUME, folder->volume);
}

TEST_F(PhotoDBTest, FolderIsAddedOnce) {
  AddFolder("/shares/Vol/", VOLUME, 1);
  AddFolder("/shares/Vol/", VOLUME, 2);
  EXPECT_THAT(Rows("SELECT modified_date FROM Folders WHERE folder_id != 1"), ElementsAre("1"));
}

TEST_F(PhotoDBTest, FolderOfAnotherVolumeIsNotAddedAgain) {
  AddFolder("/shares/Vol/", "/shares/Other/");
  AddFolder("/shares/Vol/", VOLUME);
  EXPECT_THAT(MergedFolders(LOCATION), ElementsAre("/shares/Vol/|/shares/Other/"));
}

TEST_F(PhotoDBTest, ParentIsFoundUnderAnyVolume) {
  AddFolder("/shares/Vol/", "/shares/Other/");
  AddFolder("/shares/Vol/Pictures/", VOLUME);
  EXPECT_THAT(Rows("SELECT parent_folder_id, volume FROM Folders WHERE name LIKE '%Pictures/'"),
              ElementsAre("2|/shares/Vol/"));
}

TEST_F(PhotoDBTest, FolderWithoutItsParentIsSilentlyLeftOut) {
  EXPECT_EQ("", OutputOf([&] { AddFolder("/shares/Vol/Pictures/"); }));
  EXPECT_THAT(MergedFolders(LOCATION), IsEmpty());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, FolderPathsWithoutAParentAreLeftOut) {
  for (const char* const path : {"", "/", "a", "a/", "//"}) {
    AddFolder(path);
    EXPECT_THAT(MergedFolders(LOCATION), IsEmpty()) << '"' << path << '"';
  }
}

TEST_F(PhotoDBTest, FolderPathWithoutATrailingSeparatorHasTheSameParent) {
  AddFolder("/shares/Vol");
  EXPECT_THAT(Rows("SELECT parent_folder_id, name FROM Folders WHERE folder_id != 1"),
              ElementsAre("1|/shares/Vol"));
}

TEST_F(PhotoDBTest, FolderNameIsTheTextBetweenTheLastTwoSeparators) {
  AddFolder("/shares/Vol/");
  const std::vector<std::pair<std::string, std::string>> names{
      {"/shares/Vol/a b/", "a b"}, {"a/", "a"}, {"/", ""}, {"a//", ""}, {"/shares/Vol/a", "Vol"}};
  for (const auto& [path, name] : names) {
    Database(MergedDatabasePath(LOCATION))
        .Run("UPDATE Folders SET name = ? WHERE folder_id = 2", {path});
    const auto folder = photos.GetFolder(2);
    ASSERT_TRUE(folder);
    EXPECT_EQ(path, folder->name);
    EXPECT_EQ(name, folder->folder_name) << path;
  }
}

TEST_F(PhotoDBTest, FolderNamesWithoutASeparatorAreRead) {
  AddFolder("/shares/Vol/");
  for (const char* const path : {"", "a"}) {
    Database(MergedDatabasePath(LOCATION))
        .Run("UPDATE Folders SET name = ? WHERE folder_id = 2", {path});
    const auto folder = photos.GetFolder(2);
    ASSERT_TRUE(folder);
    EXPECT_EQ(path, folder->name);
  }
}

TEST_F(PhotoDBTest, TimeOfAFolderIsStoredIn64BitsAndReadIn32) {
  AddFolder("/shares/Vol/", VOLUME, 4294967301);
  EXPECT_THAT(Rows("SELECT modified_date FROM Folders WHERE folder_id = 2"),
              ElementsAre("4294967301"));
  EXPECT_EQ(5, photos.GetFolder(2)->modified_date);
}

TEST_F(PhotoDBTest, SubfoldersAreThoseOfOneVolume) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Other/", "/shares/Other/");
  AddFolder("/shares/Vol/a/");
  AddFolder("/shares/Third/", VOLUME);
  std::vector<dbmerger::Folder*> found;
  photos.GetFolderFolders(1, VOLUME, found);
  photos.GetFolderFolders(2, VOLUME, found);
  util::OwnerVector<dbmerger::Folder> folders;
  Lines names;
  for (dbmerger::Folder* const folder : found) {
    folders.push_back(std::unique_ptr<dbmerger::Folder>(folder));
    names.push_back(folder->name);
  }
  EXPECT_THAT(names, ElementsAre("/shares/Vol/", "/shares/Third/", "/shares/Vol/a/"));
}

TEST_F(PhotoDBTest, DeletedFolderIsRemovedWithItsFilesButNotItsSubfolders) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Vol/a/");
  AddFolder("/shares/Vol/a/b/");
  AddFile("/shares/Vol/", "keep.jpg");
  AddFile("/shares/Vol/a/", "go.jpg");
  AddFile("/shares/Vol/a/b/", "stay.jpg");
  EXPECT_EQ("Deleting /shares/Vol/a/\nFound folder 3 for /shares/Vol/a/\n",
            DeleteFolder("/shares/Vol/a/"));
  EXPECT_THAT(Rows("SELECT folder_id, parent_folder_id, name FROM Folders WHERE folder_id != 1"),
              ElementsAre("2|1|/shares/Vol/", "4|3|/shares/Vol/a/b/"));
  EXPECT_THAT(MergedFiles(LOCATION),
              ElementsAre("/shares/Vol/a/b/stay.jpg", "/shares/Vol/keep.jpg"));
}

TEST_F(PhotoDBTest, DeletionOfAnUnknownFolderHasNoEffect) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg");
  const Lines before = MergedContent(LOCATION);
  EXPECT_EQ("Deleting /shares/Vol/a/\n", DeleteFolder("/shares/Vol/a/"));
  EXPECT_EQ("Deleting /shares/Vol/\n", DeleteFolder("/shares/Vol/", "/shares/Other/"));
  EXPECT_EQ("Deleting \n", DeleteFolder(""));
  EXPECT_EQ(before, MergedContent(LOCATION));
}

// Files.

TEST_F(PhotoDBTest, CreationDateOfAFileIsItsModificationDate) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg", VOLUME, 1234);
  EXPECT_THAT(Rows("SELECT * FROM Files"), ElementsAre("1|2|a.jpg|1234|/shares/Vol/|1234"));
}

TEST_F(PhotoDBTest, FileAsARecord) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg");
  Rows("UPDATE Files SET modified_date = 4294967301, created_date = 2147483648");
  const auto file = photos.GetFile(1);
  ASSERT_TRUE(file);
  EXPECT_EQ(1, file->file_id);
  EXPECT_EQ(2, file->folder_id);
  EXPECT_EQ("a.jpg", file->name);
  EXPECT_EQ(5, file->modified_date);
  EXPECT_EQ(VOLUME, file->volume);
  EXPECT_EQ(-2147483648L, file->created_date);
}

TEST_F(PhotoDBTest, UnknownFileIsNull) {
  EXPECT_FALSE(photos.GetFile(1));
}

TEST_F(PhotoDBTest, FileIsAddedOnce) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg", VOLUME, 1);
  AddFile("/shares/Vol/", "a.jpg", VOLUME, 2);
  EXPECT_THAT(Rows("SELECT name, modified_date FROM Files"), ElementsAre("a.jpg|1"));
}

TEST_F(PhotoDBTest, SameNameInAnotherFolderIsAnotherFile) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Vol/a/");
  AddFile("/shares/Vol/", "a.jpg");
  AddFile("/shares/Vol/a/", "a.jpg");
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Vol/a.jpg", "/shares/Vol/a/a.jpg"));
}

TEST_F(PhotoDBTest, FileOfAFolderOfAnotherVolumeIsSilentlyLeftOut) {
  AddFolder("/shares/Vol/", "/shares/Other/");
  EXPECT_EQ("", OutputOf([&] { AddFile("/shares/Vol/", "a.jpg", VOLUME); }));
  EXPECT_THAT(MergedFiles(LOCATION), IsEmpty());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, FileWithoutItsFolderIsSilentlyLeftOut) {
  AddFile("/shares/Vol/", "a.jpg");
  AddFile("", "a.jpg");
  AddFile("", "");
  AddFile("/", "a.jpg");
  EXPECT_THAT(MergedFiles(LOCATION), IsEmpty());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, NamesMayContainQuotes) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Vol/it's \"x\"; --/");
  AddFile("/shares/Vol/it's \"x\"; --/", "' OR 1 = 1.jpg");
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Vol/it's \"x\"; --/' OR 1 = 1.jpg"));
}

TEST_F(PhotoDBTest, FilesOfAFolderAreAppended) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Vol/a/");
  AddFile("/shares/Vol/", "one.jpg");
  AddFile("/shares/Vol/", "two.jpg");
  AddFile("/shares/Vol/a/", "three.jpg");
  std::vector<dbmerger::File*> found;
  photos.GetFolderFiles(3, found);
  photos.GetFolderFiles(2, found);
  photos.GetFolderFiles(1, found);
  util::OwnerVector<dbmerger::File> files;
  Lines names;
  for (dbmerger::File* const file : found) {
    files.push_back(std::unique_ptr<dbmerger::File>(file));
    names.push_back(file->name);
  }
  EXPECT_THAT(names, ElementsAre("three.jpg", "one.jpg", "two.jpg"));
}

TEST_F(PhotoDBTest, FileIsDeletedForAnyVolume) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg");
  AddFile("/shares/Vol/", "b.jpg");
  EXPECT_EQ("Deleting /shares/Vol/a.jpg\nFound parent folder 2 for /shares/Vol/a.jpg\n",
            DeleteFile("/shares/Vol/", "a.jpg", "/shares/Other/"));
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Vol/b.jpg"));
}

TEST_F(PhotoDBTest, OnlyTheFileOfThatFolderIsDeleted) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Vol/a/");
  AddFile("/shares/Vol/", "a.jpg");
  AddFile("/shares/Vol/a/", "a.jpg");
  DeleteFile("/shares/Vol/", "a.jpg");
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Vol/a/a.jpg"));
}

TEST_F(PhotoDBTest, DeletionOfAFileInAnUnknownFolderHasNoEffect) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg");
  EXPECT_EQ("Deleting /shares/Gone/a.jpg\n", DeleteFile("/shares/Gone/", "a.jpg"));
  EXPECT_EQ("Deleting a.jpg\n", DeleteFile("", "a.jpg"));
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Vol/a.jpg"));
}

// Volumes.

TEST_F(PhotoDBTest, DeletedVolumeKeepsItsCountsAndItsTimeIsZero) {
  AddFolder("/shares/Vol/");
  AddFolder("/shares/Other/", "/shares/Other/");
  AddFile("/shares/Vol/", "a.jpg");
  AddFile("/shares/Other/", "b.jpg", "/shares/Other/");
  for (const std::string& volume : {VOLUME, std::string("/shares/Other/")}) {
    photos.InsertStatistics(volume);
    photos.UpdateStatistics({volume, 3, 4, 500});
  }
  photos.DeleteVolume(VOLUME);
  EXPECT_THAT(MergedFolders(LOCATION), ElementsAre("/shares/Other/|/shares/Other/"));
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Other/b.jpg"));
  EXPECT_THAT(MergedStatistics(LOCATION),
              ElementsAre("/shares/Other/|3|4|500", "/shares/Vol/|3|4|0"));
}

TEST_F(PhotoDBTest, DeletionOfAllVolumesKeepsTheRootAndTheStatus) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg");
  photos.InsertStatistics(VOLUME);
  const Lines schema = Rows("SELECT sql FROM sqlite_master");
  photos.DeleteVolumes();
  EXPECT_THAT(Rows("SELECT * FROM Folders"), ElementsAre("1|-1|/shares/|0|<DUMMY>"));
  EXPECT_THAT(Rows("SELECT * FROM Files"), IsEmpty());
  EXPECT_THAT(Rows("SELECT * FROM Statistics"), IsEmpty());
  EXPECT_THAT(Rows("SELECT id, mc_version, mdate FROM Status"), ElementsAre("1|2.0|1000"));
  EXPECT_EQ(schema, Rows("SELECT sql FROM sqlite_master"));
}

TEST_F(PhotoDBTest, DeletionOfAllVolumesCompactsTheFile) {
  AddFolder("/shares/Vol/");
  Rows("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 5000) INSERT INTO "
       "Files(folder_id, name, modified_date, volume, created_date) SELECT 2, 'photo' || i, 0, "
       "'/shares/Vol/', 0 FROM n");
  photos.DeleteVolumes();
  EXPECT_THAT(Rows("PRAGMA freelist_count"), ElementsAre("0"));
  EXPECT_LT(std::filesystem::file_size(MergedDatabasePath(LOCATION)), 100'000U);
}

TEST_F(PhotoDBTest, FailedDeletionsAreThrown) {
  AddFolder("/shares/Vol/");
  Rows("DROP TABLE Files");
  EXPECT_THROW(DeleteFile("/shares/Vol/", "a.jpg"), std::string);
  EXPECT_THROW(DeleteFolder("/shares/Vol/"), std::string);
  EXPECT_THAT(Thrown([&] { photos.DeleteVolumes(); }), HasSubstr("no such table: Files"));
}

/// A database with two volumes, whose statements can be watched.
class PhotoDBDeletionTest : public PhotoDBLocationTest {
protected:
  /// Removes volumes.
  using Deletion = std::function<void(const PhotoDB&)>;

  PhotoDBDeletionTest() : photos(LOCATION) {
    photos.Init();
    for (const std::string& volume : {VOLUME, std::string("/shares/Other/")}) {
      db::Folder folder;
      folder.path = volume;
      photos.AddFolder(volume, folder);
      db::File file;
      file.path = volume + "a.jpg";
      file.name = "a.jpg";
      photos.AddFile(volume, file);
      photos.InsertStatistics(volume);
      photos.UpdateStatistics({volume, 3, 4, 500});
    }
  }

  class WatchedPhotoDB : public PhotoDB {
  public:
    using PhotoDB::PhotoDB;

    /// Calls `watch` with each statement that begins. `watch` lives as long as the database is
    /// open.
    void Watch(std::function<void(const std::string&)>& watch) const {
      const auto call = [](unsigned /*event*/, void* place, void* /*statement*/, void* sql) {
        (*static_cast<std::function<void(const std::string&)>*>(place))(
            static_cast<const char*>(sql));
        return 0;
      };
      sqlite3_trace_v2(Handle(), SQLITE_TRACE_STMT, call, &watch);
    }
  };

  Lines StatementsOf(const Deletion& deletion) {
    Lines statements;
    std::function<void(const std::string&)> watch = [&](const std::string& sql) {
      statements.push_back(sql);
    };
    photos.Watch(watch);
    deletion(photos);
    photos.Watch(nothing);
    return statements;
  }

  static void DeleteOne(const PhotoDB& photos) { photos.DeleteVolume(VOLUME); }
  static void DeleteAll(const PhotoDB& photos) { photos.DeleteVolumes(); }

  WatchedPhotoDB photos;
  std::function<void(const std::string&)> nothing = [](const std::string& /*sql*/) {};
};

TEST_F(PhotoDBDeletionTest, DeletionOfAVolumeIsOneTransaction) {
  EXPECT_THAT(StatementsOf(&DeleteOne),
              ElementsAre("BEGIN IMMEDIATE", "DELETE FROM Folders WHERE volume = ?",
                          "DELETE FROM Files WHERE volume = ?",
                          "UPDATE Statistics SET last_updated_time = 0 WHERE volume = ?",
                          "COMMIT"));
}

TEST_F(PhotoDBDeletionTest, DeletionOfAllVolumesIsOneTransactionBeforeTheFileIsCompacted) {
  EXPECT_THAT(StatementsOf(&DeleteAll),
              ElementsAre("BEGIN IMMEDIATE", "DELETE FROM Folders WHERE folder_id != 1",
                          "DELETE FROM Files ", "DELETE FROM Statistics", "COMMIT", "VACUUM"));
}

TEST_F(PhotoDBDeletionTest, OtherConnectionsNeverSeeAPartOfADeletion) {
  for (const Deletion& deletion : {Deletion(&DeleteOne), Deletion(&DeleteAll)}) {
    const Lines first = MergedContent(LOCATION);
    std::vector<Lines> seen;
    std::function<void(const std::string&)> watch = [&](const std::string& /*sql*/) {
      seen.push_back(MergedContent(LOCATION));
    };
    photos.Watch(watch);
    deletion(photos);
    photos.Watch(nothing);
    const Lines last = MergedContent(LOCATION);
    EXPECT_NE(first, last);
    EXPECT_LE(5U, seen.size());
    for (const Lines& content : seen) {
      EXPECT_THAT(content, ::testing::AnyOf(first, last));
    }
  }
}

TEST_F(PhotoDBDeletionTest, FailureInTheMiddleLeavesEverything) {
  for (const Deletion& deletion : {Deletion(&DeleteOne), Deletion(&DeleteAll)}) {
    for (const char* const table : {"Folders", "Files", "Statistics"}) {
      const Lines before = MergedContent(LOCATION);
      const std::string name = table;
      MergedRows(LOCATION, "ALTER TABLE " + name + " RENAME TO Away");
      EXPECT_THAT(Thrown([&] { deletion(photos); }), HasSubstr("no such table: " + name));
      MergedRows(LOCATION, "ALTER TABLE Away RENAME TO " + name);
      EXPECT_EQ(before, MergedContent(LOCATION));
    }
  }
  DeleteAll(photos);
  EXPECT_THAT(MergedFolders(LOCATION), IsEmpty());
}

TEST_F(PhotoDBDeletionTest, ReaderThatHoldsALockMakesItFailWithEverythingLeft) {
  const Lines before = MergedContent(LOCATION);
  for (const Deletion& deletion : {Deletion(&DeleteOne), Deletion(&DeleteAll)}) {
    const Database reader(MergedDatabasePath(LOCATION));
    reader.Run("BEGIN");
    reader.Run("SELECT * FROM Files");
    EXPECT_THAT(Thrown([&] { deletion(photos); }), HasSubstr("database is locked"));
    reader.Run("COMMIT");
    EXPECT_EQ(before, MergedContent(LOCATION));
  }
  DeleteOne(photos);
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Other/a.jpg"));
}

TEST_F(PhotoDBDeletionTest, TakesPartInATransactionOfTheCaller) {
  const Lines before = MergedContent(LOCATION);
  for (const Deletion& deletion : {Deletion(&DeleteOne), Deletion(&DeleteAll)}) {
    const db::Transaction rolledBack(photos, 1'000);
    deletion(photos);
    EXPECT_EQ(before, MergedContent(LOCATION)) << "committed before its caller";
  }
  EXPECT_EQ(before, MergedContent(LOCATION));
  db::Transaction transaction(photos, 1'000);
  DeleteOne(photos);
  transaction.Commit();
  EXPECT_THAT(MergedFiles(LOCATION), ElementsAre("/shares/Other/a.jpg"));
  EXPECT_THAT(MergedStatistics(LOCATION),
              ElementsAre("/shares/Other/|3|4|500", "/shares/Vol/|3|4|0"));
}

TEST_F(PhotoDBDeletionTest, DoesNotCompactTheFileInATransactionOfTheCaller) {
  db::Transaction transaction(photos, 1'000);
  EXPECT_THAT(StatementsOf(&DeleteAll),
              ElementsAre("DELETE FROM Folders WHERE folder_id != 1", "DELETE FROM Files ",
                          "DELETE FROM Statistics"));
  transaction.Commit();
  EXPECT_THAT(MergedFolders(LOCATION), IsEmpty());
}

TEST_F(PhotoDBDeletionTest, FailureIsRolledBackWithATransactionOfTheCaller) {
  const Lines before = MergedContent(LOCATION);
  for (const Deletion& deletion : {Deletion(&DeleteOne), Deletion(&DeleteAll)}) {
    const db::Transaction transaction(photos, 1'000);
    db::Statement(photos, "ALTER TABLE Statistics RENAME TO Away").Execute();
    EXPECT_THAT(Thrown([&] { deletion(photos); }), HasSubstr("no such table: Statistics"));
    EXPECT_TRUE(photos.IsInTransaction());
  }
  EXPECT_EQ(before, MergedContent(LOCATION));
}

TEST_F(PhotoDBTest, FailedAdditionsAreThrown) {
  AddFolder("/shares/Vol/");
  AddFile("/shares/Vol/", "a.jpg");
  RefuseDuplicates("Files", "volume");
  EXPECT_THAT(Thrown([&] { AddFile("/shares/Vol/", "b.jpg"); }),
              HasSubstr("UNIQUE constraint failed"));
}

TEST_F(PhotoDBTest, FailedReadsAreThrown) {
  Rows("ALTER TABLE Folders RENAME TO Stored");
  Rows("CREATE VIEW Folders AS SELECT folder_id, parent_folder_id, name, abs(-9223372036854775807 "
       "- 1) AS modified_date, volume FROM Stored");
  EXPECT_THROW(photos.GetFolder(1), std::string);
  EXPECT_THROW(photos.GetFolder("/shares/", "<DUMMY>"), std::string);
  EXPECT_THROW(AddFolder("/shares/Vol/"), std::string);
}

TEST_F(PhotoDBLocationTest, OperationOnAClosedDatabaseIsThrown) {
  const PhotoDB photos(LOCATION);
  EXPECT_THROW(photos.GetFolder(1), std::string);
}

// Status and statistics.

TEST_F(PhotoDBTest, StatisticsOfAnUnknownVolumeAreNull) {
  const Lines before = MergedContent(LOCATION);
  EXPECT_FALSE(photos.GetStatistics(VOLUME));
  EXPECT_EQ(before, MergedContent(LOCATION));
}

TEST_F(PhotoDBTest, InsertedStatisticsAreZero) {
  photos.InsertStatistics(VOLUME);
  const auto statistics = photos.GetStatistics(VOLUME);
  ASSERT_TRUE(statistics);
  EXPECT_EQ(VOLUME, statistics->volume);
  EXPECT_EQ(0, statistics->photos_xcoded);
  EXPECT_EQ(0, statistics->photos_total);
  EXPECT_EQ(0, statistics->last_updated_time);
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, SecondInsertAddsASecondRowAndTheFirstIsRead) {
  photos.InsertStatistics(VOLUME);
  photos.UpdateStatistics({VOLUME, 1, 2, 3});
  photos.InsertStatistics(VOLUME);
  EXPECT_THAT(Rows("SELECT id, volume, photos_xcoded FROM Statistics"),
              ElementsAre("1|/shares/Vol/|1", "2|/shares/Vol/|0"));
  EXPECT_EQ(2, photos.GetStatistics(VOLUME)->photos_total);
}

TEST_F(PhotoDBTest, StatisticsAreThoseOfTheVolume) {
  photos.InsertStatistics(VOLUME);
  photos.InsertStatistics("/shares/Other/");
  photos.UpdateStatistics({"/shares/Other/", 5, 6, 7});
  EXPECT_THAT(MergedStatistics(LOCATION),
              ElementsAre("/shares/Other/|5|6|7", "/shares/Vol/|0|0|0"));
  const auto statistics = photos.GetStatistics("/shares/Other/");
  ASSERT_TRUE(statistics);
  EXPECT_EQ(5, statistics->photos_xcoded);
  EXPECT_EQ(6, statistics->photos_total);
  EXPECT_EQ(7, statistics->last_updated_time);
}

TEST_F(PhotoDBTest, CountsAreStoredIn64BitsAndReadIn32) {
  photos.InsertStatistics(VOLUME);
  photos.UpdateStatistics({VOLUME, 2147483648, 4294967301, 5'000'000'000});
  EXPECT_THAT(MergedStatistics(LOCATION),
              ElementsAre("/shares/Vol/|2147483648|4294967301|5000000000"));
  const auto statistics = photos.GetStatistics(VOLUME);
  EXPECT_EQ(-2147483648L, statistics->photos_xcoded);
  EXPECT_EQ(5, statistics->photos_total);
  EXPECT_EQ(5'000'000'000, statistics->last_updated_time) << "a time is read in 64 bits";
}

TEST_F(PhotoDBTest, UpdateWithoutARowChangesAndLogsNothing) {
  const Lines before = MergedContent(LOCATION);
  photos.UpdateStatistics({VOLUME, 1, 2, 3});
  EXPECT_EQ(before, MergedContent(LOCATION));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, FailedInsertOfStatisticsIsLoggedOnly) {
  photos.InsertStatistics("/shares/Other/");
  RefuseDuplicates("Statistics", "photos_total");
  photos.InsertStatistics(VOLUME);
  EXPECT_THAT(Logged(), ElementsAre(Error("Could not insert stats for /shares/Vol/ ")));
  EXPECT_THAT(MergedStatistics(LOCATION), ElementsAre("/shares/Other/|0|0|0"));
}

TEST_F(PhotoDBTest, FailedUpdateOfStatisticsIsLoggedOnly) {
  photos.InsertStatistics(VOLUME);
  photos.InsertStatistics("/shares/Other/");
  photos.UpdateStatistics({"/shares/Other/", 1, 2, 3});
  RefuseDuplicates("Statistics", "last_updated_time");
  photos.UpdateStatistics({VOLUME, 1, 2, 3});
  EXPECT_THAT(Logged(),
              ElementsAre(Error("Could not update stats for /shares/Vol/. Return code 19")));
  EXPECT_THAT(MergedStatistics(LOCATION),
              ElementsAre("/shares/Other/|1|2|3", "/shares/Vol/|0|0|0"));
}

TEST_F(PhotoDBTest, StatisticsWithoutATableAreThrown) {
  Rows("DROP TABLE Statistics");
  PhotoDB again(LOCATION);
  again.Init();
  EXPECT_THROW(again.GetStatistics(VOLUME), std::string);
  EXPECT_THROW(again.InsertStatistics(VOLUME), std::string);
  EXPECT_THROW(again.UpdateStatistics({VOLUME, 1, 2, 3}), std::string);
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, StatisticsWithoutATableAreThrownAlsoAfterEarlierUses) {
  photos.InsertStatistics(VOLUME);
  photos.UpdateStatistics({VOLUME, 1, 2, 3});
  ASSERT_TRUE(photos.GetStatistics(VOLUME));
  db::Statement(photos, "DROP TABLE Statistics").Execute();
  EXPECT_THROW(photos.GetStatistics(VOLUME), std::string);
  EXPECT_THROW(photos.InsertStatistics(VOLUME), std::string);
  EXPECT_THROW(photos.UpdateStatistics({VOLUME, 1, 2, 3}), std::string);
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(PhotoDBTest, StatusIsWrittenToTheFirstRowForAnyId) {
  Rows("INSERT INTO Status(mc_version, mdate, desc, etype) VALUES('old', 1, 'second', 2)");
  ASSERT_EQ(-1, photos.status.id);
  photos.status.mdate = 5'000'000'000;
  photos.status.desc = "text";
  photos.status.etype = -3;
  photos.UpdateStatus();
  EXPECT_THAT(Rows("SELECT * FROM Status ORDER BY id"),
              ElementsAre("1|2.0|5000000000|text|-3", "2|old|1|second|2"));
}

TEST_F(PhotoDBTest, FailedUpdateOfTheStatusIsThrownAndNamesThePlaceInThisLayer) {
  Rows("INSERT INTO Status(mc_version, mdate) VALUES('other', 1)");
  RefuseDuplicates("Status", "mc_version");
  photos.status.mc_version = "other";
  EXPECT_THAT(Thrown([&] { photos.UpdateStatus(); }),
              ::testing::AllOf(StartsWith("src/zophotodbmerger/PhotoDB.cpp:"),
                               HasSubstr("UNIQUE constraint failed")));
}

} // namespace
} // namespace orva::test

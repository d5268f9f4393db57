#include "Convergence.h"
#include "Services.h"
#include "Templates.h"
#include "UserFiles.h"

#include "endurance/Random.h"
#include "support/Program.h"
#include "support/TestScale.h"
#include "system/Deadline.h"
#include "transcoder/Photos.h"

#include "CatalogSchema.h"
#include "Indexer.h"
#include "orvadb/VolumeDB.h"

#include <SQLiteCpp/SQLiteCpp.h>
#include <gmock/gmock.h>

#include <fcntl.h>
#include <grp.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <memory>
#include <string>
#include <thread>
#include <vector>

// The steps of a system that is only used after its installation. They run in order, each on what
// the one before has left, and compare everything at their ends.
namespace orva::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using SteadyClock = std::chrono::steady_clock;
using std::chrono::milliseconds;

constexpr char CANARY[] = "/var/tmp/canary";
constexpr char IMAGES[] = "/var/tmp/disks";
constexpr char MODEL[] = "/run/package/model";
const std::string PHOTOS = "/shares/Photos";
const std::string DISK = "/shares/Disk";
const std::string BIG = "/shares/Big";
constexpr uid_t OTHER_USER = 1234;

/// Lines about a volume that was unmounted before it was known to be.
const std::string UNMOUNTED = "nothing is mounted there|unable to open database file";

unsigned long Setting(const char* name, unsigned long standard) {
  const char* const value = std::getenv(name);
  return value == nullptr ? standard : std::stoul(value);
}

const unsigned long SEED = Setting("ORVA_TEST_SEED", 14);
const unsigned long OPERATIONS = Setting("ORVA_TEST_OPERATIONS", TestScale(150UL, 10'000UL));

bool HasLoopDevices() {
  return Run({"losetup", "--find"}).status == 0;
}

bool IsMounted(const std::string& path) {
  return Run({"mountpoint", "--quiet", path}).status == 0;
}

/// Unmounts it as a user does: it fails while the volume is busy, and is tried again.
void Unmount(const std::string& path) {
  const auto end = SteadyClock::now() + DEADLINE;
  while (umount2(path.c_str(), 0) != 0) {
    ASSERT_EQ(errno, EBUSY);
    ASSERT_LT(SteadyClock::now(), end) << path << " stays busy";
    std::this_thread::yield();
  }
}

/// One of the disks that are mounted at /shares/Disk: an image with a real file system, or a folder
/// where the machine has no loop devices.
void MountDisk(const std::string& name) {
  fs::create_directories(DISK);
  fs::create_directories(IMAGES);
  const std::string image = std::string(IMAGES) + "/" + name;
  if (!HasLoopDevices()) {
    fs::create_directories(image);
    ASSERT_EQ(mount(image.c_str(), DISK.c_str(), nullptr, MS_BIND, nullptr), 0);
    return;
  }
  if (!fs::exists(image)) {
    std::ofstream(image).close();
    fs::resize_file(image, 512 << 20);
    RunChecked({"mkfs.ext4", "-q", image});
  }
  RunChecked({"mount", "-o", "loop,nosuid,nodev,noexec", image, DISK});
}

/// The disk that is elected as master. It keeps its content while it is not mounted.
void MountBig() {
  const std::string keeper = std::string(IMAGES) + "/Big";
  fs::create_directories(BIG);
  if (!IsMounted(keeper)) {
    fs::create_directories(keeper);
    ASSERT_EQ(mount("Big", keeper.c_str(), "tmpfs", 0, "size=150g"), 0);
  }
  // A part of the file system, so that a tree can be moved into it.
  fs::create_directories(keeper + "/volume");
  ASSERT_EQ(mount((keeper + "/volume").c_str(), BIG.c_str(), nullptr, MS_BIND, nullptr), 0);
}

std::string DatabasePath() {
  std::ifstream file("/tmp/zophotodbmerger.conf");
  std::string line;
  std::getline(file, line);
  return line.substr(line.find('=') + 1);
}

/// The content and the attributes of everything that no service may touch.
Lines DescribeCanary() {
  Lines lines;
  for (const auto& entry : fs::recursive_directory_iterator(CANARY)) {
    struct stat status {};
    lstat(entry.path().c_str(), &status);
    std::ostringstream line;
    line << entry.path().native() << ' ' << std::oct << status.st_mode << std::dec << ' '
         << status.st_uid << ' ' << status.st_nlink << ' ' << status.st_ctim.tv_sec << '.'
         << status.st_ctim.tv_nsec << ' '
         << (entry.is_regular_file() ? ReadBytes(entry.path()) : std::string());
    lines.push_back(line.str());
  }
  std::ranges::sort(lines);
  return lines;
}

/// What the steps share.
struct System {
  Templates templates{"/var/tmp/templates"};
  Random random{SEED};
  UserFiles photos{PHOTOS, templates};
  UserFiles diskA{DISK, templates};
  UserFiles diskB{DISK, templates};
  UserFiles big{BIG, templates};
  std::vector<UserFiles*> plugged{&photos};
  Services services;
  Lines canary;
};

class Steps : public testing::Test {
protected:
  static void SetUpTestSuite() {
    std::cout << "seed " << SEED << ", " << OPERATIONS << " operations" << std::endl;
    system_ = std::make_unique<System>();
    const std::string canary = CANARY;
    WriteBytes(canary + "/secret.jpg", Photo(system_->templates.Secret()));
    WriteBytes(canary + "/0/1.jpg", "canary");
    WriteBytes(canary + "/renditions/0/1.jpg", "canary");
    WriteBytes(canary + "/victim", "canary");
    fs::create_directory(canary + "/volume");
    catalog::OpenCatalog(canary + "/volume").reset();
    chmod((canary + "/secret.jpg").c_str(), 0600);
    for (const char* const folder : {"", "/0", "/renditions", "/renditions/0", "/volume/.orva"}) {
      chmod((canary + folder).c_str(), 0777); // the mode does not protect it
    }
    system_->canary = DescribeCanary();
  }
  static void TearDownTestSuite() { system_.reset(); }

  void TearDown() override {
    EXPECT_EQ(DescribeCanary(), system_->canary);
    EXPECT_THAT(Sys().services.Problems(), IsEmpty());
  }

  static System& Sys() { return *system_; }
  static std::string Photo(std::size_t index) { return system_->templates.Bytes(index); }

  /// Waits until the condition holds; false after the deadline.
  static bool Await(const std::function<bool()>& condition,
                    std::chrono::seconds deadline = DEADLINE) {
    const auto end = SteadyClock::now() + deadline;
    while (!condition()) {
      if (SteadyClock::now() > end) {
        return condition();
      }
      std::this_thread::sleep_for(milliseconds(50)); // between two looks
    }
    return true;
  }

  /// Waits until everything says what new catalogs and a new merge say. `lines` are expected in the
  /// journal in addition to the usual ones.
  static void ExpectConvergence(const std::string& lines = "",
                                std::chrono::seconds deadline = DEADLINE) {
    std::vector<const UserFiles*> volumes;
    for (const UserFiles* const files : Sys().plugged) {
      EXPECT_THAT(files->Differences(), IsEmpty());
      volumes.push_back(files);
    }
    const Convergence convergence(Sys().templates, volumes);
    Lines differences;
    EXPECT_TRUE(Await(
        [&] {
          differences = convergence.Differences();
          return differences.empty();
        },
        deadline));
    if (differences.size() > 30) {
      differences.resize(30);
    }
    ASSERT_THAT(differences, IsEmpty()) << ReadBytes("/run/orva-indexer/status.json")
                                        << ReadBytes("/run/orva-transcoder/status.json");
    EXPECT_THAT(Sys().services.UnexpectedLines(lines), IsEmpty());
    EXPECT_EQ(test::Run({"zophotos", "check"}).status, 0);
  }

  static void Change(unsigned long count) {
    for (unsigned long i = 0; i < count; ++i) {
      ChangeOnce();
    }
  }
  static void ChangeOnce() {
    UserFiles& files = *Sys().random.Of(Sys().plugged);
    files.Change(Sys().random, *Sys().random.Of(Sys().plugged));
    ++changes_;
  }

  /// Whether the merged database lists the photo.
  static bool IsMerged(const UserFiles& files, const std::string& name) {
    try {
      for (const std::string& row :
           QueryDatabase(DatabasePath(), "SELECT d.name || f.name FROM Files f "
                                         "JOIN Folders d ON d.folder_id = f.folder_id")) {
        if (row == files.At(name)) {
          return true;
        }
      }
    } catch (const SQLite::Exception&) {
      // The daemon is about to make it, or was killed.
    }
    return false;
  }

  static Lines CatalogRows(const UserFiles& files, const std::string& path) {
    return QueryDatabase(files.At(".orva/orva.db"),
                         "SELECT size FROM Files WHERE isDeleted = 0 AND path = '" + path + "'");
  }

  static std::string IndexerState(const std::string& volume) {
    const std::string status = ReadBytes("/run/orva-indexer/status.json");
    const std::size_t begin = status.find('"' + volume + "/\"");
    const std::size_t state = status.find("\"state\":", begin);
    if (begin == std::string::npos || state == std::string::npos) {
      return "absent";
    }
    const std::size_t text = status.find('"', state + 8) + 1;
    return status.substr(text, status.find('"', text) - text);
  }

  static inline std::unique_ptr<System> system_;
  static inline unsigned long changes_ = 0;
};

class Convergent : public Steps {};

// --- Photos ------------------------------------------------------------------------------------

TEST_F(Convergent, TheFirstPhotosAreMerged) {
  ASSERT_TRUE(Await([] { return Sys().services.AreActive(); }));
  for (std::size_t index = 0; index < Sys().templates.Secret(); ++index) {
    Sys().photos.Copy(index, "First/" + std::to_string(index) + ".jpg");
  }
  ExpectConvergence();
}

TEST_F(Convergent, RandomOperationsOnAllVolumes) {
  MountDisk("A");
  MountBig();
  Sys().plugged = {&Sys().photos, &Sys().diskA, &Sys().big};
  const unsigned long round = TestScale(75UL, 250UL);
  for (unsigned long done = 0; done < OPERATIONS; done += round) {
    SCOPED_TRACE("after " + std::to_string(done) + " operations");
    Change(std::min(round, OPERATIONS - done));
    ExpectConvergence();
    if (HasFatalFailure()) {
      return;
    }
  }
  ReportFigure("convergence: random operations", std::to_string(changes_));
}

TEST_F(Convergent, ALargeFileThatIsCopiedSlowlyWaitsUntilItIsClosed) {
  UserFiles& disk = Sys().photos;
  const auto chunk = TestScale<std::size_t>(1 << 20, 128 << 20);
  const int chunks = TestScale(2, 16);
  const std::string zeros(chunk, '\0');
  {
    // A JPEG may be followed by other bytes. One of 2 GiB is too large to be rendered.
    std::ofstream film(disk.At("film.mov"), std::ios::binary);
    std::ofstream photo(disk.At("slow.jpg"), std::ios::binary);
    photo << Photo(0) << std::flush;
    for (int i = 0; i < chunks; ++i) {
      film << zeros << std::flush;
      photo << "more" << std::flush;
      const std::string other = "meanwhile" + std::to_string(i) + ".jpg";
      disk.Copy(static_cast<std::size_t>(i) % 8, other);
      ASSERT_TRUE(Await([&] { return IsMerged(disk, other); }));
      ASSERT_THAT(CatalogRows(disk, "film.mov"), IsEmpty());
      ASSERT_THAT(CatalogRows(disk, "slow.jpg"), IsEmpty());
      ASSERT_FALSE(IsMerged(disk, "slow.jpg"));
    }
  }
  const std::string size = std::to_string(chunk * static_cast<std::size_t>(chunks));
  ASSERT_TRUE(Await([&] { return CatalogRows(disk, "film.mov") == Lines{size}; }));
  ASSERT_TRUE(Await([&] { return IsMerged(disk, "slow.jpg"); }));
  ReportFigure("convergence: largest file that was copied slowly", size + " bytes");
  fs::remove(disk.At("film.mov"));
  fs::remove(disk.At("slow.jpg"));
  ExpectConvergence();
}

TEST_F(Convergent, ATreeOfAThousandFoldersIsMovedInAtOnce) {
  UserFiles& disk = Sys().big;
  const std::string keeper = std::string(IMAGES) + "/Big";
  UserFiles outside(keeper, Sys().templates);
  const int photos = TestScale(8, 1);
  for (int i = 0; i < 1000; ++i) {
    const std::string folder = "Tree/" + std::to_string(i % 10) + "/" +
                               std::to_string(i / 10 % 10) + "/" + std::to_string(i) + "/";
    outside.MakeFolder(folder);
    if (i % photos == 0) {
      outside.Copy(static_cast<std::size_t>(i) % 8, folder + "a.jpg");
    }
  }
  fs::rename(keeper + "/Tree", keeper + "/volume/Tree");
  disk.Load(outside.Save());
  ExpectConvergence();
  // It is watched.
  disk.Copy(3, "Tree/3/4/543/later.jpg");
  disk.Move("Tree/7/", "Tree/6/seven/");
  disk.Copy(4, "Tree/6/seven/8/687/later.jpg");
  ExpectConvergence();
  disk.Remove("Tree/");
  ExpectConvergence();
}

// --- Lost events -------------------------------------------------------------------------------

TEST_F(Convergent, ChangesAreFoundAfterTheQueueOfEventsHasOverflowed) {
  UserFiles& disk = Sys().photos;
  disk.Copy(0, "Overflow/a.jpg");
  disk.Copy(1, "Overflow/b.jpg");
  disk.Copy(6, "Moved/Inside/d.jpg");
  ExpectConvergence();
  const pid_t indexer = Services::MainPid("orva-indexer");
  kill(indexer, SIGSTOP);
  std::ifstream limit("/proc/sys/fs/inotify/max_queued_events");
  int events = 0;
  ASSERT_TRUE(limit >> events);
  // Only an event that is the same as the one before is left out.
  for (int i = 0; i <= events; ++i) {
    chmod(disk.At(i % 2 == 0 ? "Overflow/a.jpg" : "Overflow/b.jpg").c_str(), 0644);
  }
  disk.MakeFolder("Later/Inside/");
  disk.Copy(2, "Later/Inside/c.jpg");
  disk.Remove("Overflow/a.jpg");
  disk.Move("Moved/", "Later/Moved/");
  kill(indexer, SIGCONT);
  ExpectConvergence(PHOTOS + "/: too many changes at once; walking all of it");
  EXPECT_TRUE(Services::HasLogged("orva-indexer", "too many changes at once"));
  disk.Copy(5, "Later/Inside/d.jpg");
  ExpectConvergence();
}

TEST_F(Convergent, ChangesAreFoundAtTheWatchLimit) {
  UserFiles& disk = Sys().photos;
  // The limit of a user namespace counts in addition to that of the system.
  const std::string dropIn = "/run/systemd/system/orva-indexer.service.d/limit.conf";
  WriteBytes(dropIn, "[Service]\nPrivateUsers=yes\n");
  RunChecked({"systemctl", "daemon-reload"});
  Sys().services.Control("restart", "orva-indexer");
  ASSERT_TRUE(Await([] { return IndexerState(PHOTOS) == "watching"; }));
  // The settings of the kernel are read-only in /proc.
  const std::string writable = "/var/tmp/proc";
  fs::create_directory(writable);
  ASSERT_EQ(mount("proc", writable.c_str(), "proc", 0, nullptr), 0);
  const std::string indexer = std::to_string(Services::MainPid("orva-indexer"));
  RunChecked({"nsenter", "--user", "--target", indexer, "sh", "-c",
              "echo 5 >" + writable + "/sys/user/max_inotify_watches"});
  for (int folder = 0; folder < 10; ++folder) {
    disk.Copy(static_cast<std::size_t>(folder % 8), "Limit/" + std::to_string(folder) + "/a.jpg");
  }
  ASSERT_TRUE(
      Await([] { return Services::HasLogged("orva-indexer", "fs.inotify.max_user_watches"); }));
  ExpectConvergence("fs\\.inotify\\.max_user_watches");
  EXPECT_TRUE(Await([] { return IndexerState(PHOTOS) == "timed"; }));
  if (IsExtended()) {
    // It is walked on a timer, a minute later.
    disk.Move("Limit/3/a.jpg", "Limit/4/moved.jpg");
    disk.Remove("Limit/5/");
    ExpectConvergence("", std::chrono::seconds(180));
  }
  // With the usual limit it is watched again.
  fs::remove(dropIn);
  RunChecked({"systemctl", "daemon-reload"});
  Sys().services.Control("restart", "orva-indexer");
  ASSERT_TRUE(Await([] { return IndexerState(PHOTOS) == "watching"; }));
  disk.Remove("Limit/");
  ExpectConvergence();
  Unmount(writable);
}

// --- Killed services and volumes that go -------------------------------------------------------

TEST_F(Convergent, ServicesThatAreKilledAtAnyInstant) {
  const std::vector<std::string> units = {"zophotodbmerger", "orva-indexer", "orva-transcoder"};
  const int rounds = TestScale(2, 50);
  for (int round = 0; round < rounds; ++round) {
    SCOPED_TRACE("round " + std::to_string(round));
    std::multimap<milliseconds, std::string> instants;
    for (const std::string& unit : units) {
      instants.emplace(Sys().random.Below(2000), unit);
    }
    const auto begin = SteadyClock::now();
    for (const auto& [instant, unit] : instants) {
      while (SteadyClock::now() < begin + instant) {
        ChangeOnce();
        std::this_thread::sleep_for(milliseconds(20)); // the pace of the changes
      }
      Sys().services.Kill(unit);
    }
    ASSERT_TRUE(Await([] { return Sys().services.AreActive(); }));
    if (round % 5 == rounds % 5 || round == rounds - 1) {
      ExpectConvergence();
      if (HasFatalFailure()) {
        return;
      }
    }
  }
  ReportFigure("convergence: kills", std::to_string(Sys().services.Kills()));
}

TEST_F(Convergent, TheNotificationServiceIsKilled) {
  Sys().services.Kill("orva-notify");
  Change(20);
  ASSERT_TRUE(Await([] { return Sys().services.AreActive(); }));
  // The daemon ends each time no service listens, and is started again.
  ExpectConvergence("Unable to open socket|NotificationListener exiting|Returning from the wait|"
                    "zophotodbmerger.*(Deactivated|Scheduled|Started|Starting|Stopped)");
  Sys().services.CountFromNow("zophotodbmerger");
}

/// The daemon elects the shares root if the first volume that is announced is small, as the plain
/// directory is. So the disk is announced first.
TEST_F(Convergent, ADiskIsElectedAsMaster) {
  fs::rename(PHOTOS, "/shares/later");
  Sys().services.Control("stop", "zophotodbmerger");
  Sys().services.Control("restart", "orva-notify");
  Sys().services.Control("start", "zophotodbmerger");
  ASSERT_TRUE(Await([] { return DatabasePath().starts_with(BIG); }));
  fs::rename("/shares/later", PHOTOS);
  Change(20);
  ExpectConvergence(UNMOUNTED);
}

TEST_F(Convergent, DisksAreSwappedWhileTheDaemonIsDown) {
  // Its database keeps the rows of the first disk.
  ASSERT_TRUE(DatabasePath().starts_with(BIG)) << DatabasePath();
  Change(20);
  Sys().services.Control("stop", "zophotodbmerger");
  Unmount(DISK);
  MountDisk("B");
  Sys().plugged = {&Sys().photos, &Sys().diskB, &Sys().big};
  // Another photo at the path of one on the first disk.
  Sys().diskB.Copy(1, "same.jpg");
  Change(20);
  Sys().services.Control("start", "zophotodbmerger");
  ExpectConvergence(UNMOUNTED);
  // The other way round, while it was killed.
  Sys().services.Kill("zophotodbmerger");
  Unmount(DISK);
  MountDisk("A");
  Sys().plugged = {&Sys().photos, &Sys().diskA, &Sys().big};
  Sys().diskA.Copy(2, "same.jpg");
  ASSERT_TRUE(Await([] { return Sys().services.AreActive(); }));
  ExpectConvergence(UNMOUNTED);
}

TEST_F(Convergent, ADiskIsRemovedWhileNothingRuns) {
  // The master stays, and its database keeps the rows of the disk.
  ASSERT_TRUE(DatabasePath().starts_with(BIG)) << DatabasePath();
  const std::vector<std::string> units = {"orva-notify", "zophotodbmerger", "orva-indexer",
                                          "orva-transcoder"};
  for (const std::string& unit : std::vector<std::string>(units.rbegin(), units.rend())) {
    Sys().services.Control("stop", unit);
  }
  Unmount(DISK);
  Sys().plugged = {&Sys().photos, &Sys().big};
  for (const std::string& unit : units) {
    Sys().services.Control("start", unit);
  }
  ASSERT_TRUE(Await([] { return Sys().services.AreActive(); }));
  ExpectConvergence(UNMOUNTED);
  ASSERT_TRUE(DatabasePath().starts_with(BIG)) << DatabasePath();
  MountDisk("A");
  Sys().plugged = {&Sys().photos, &Sys().diskA, &Sys().big};
  Change(20);
  ExpectConvergence(UNMOUNTED);
}

TEST_F(Convergent, TheMasterIsPulled) {
  ASSERT_TRUE(DatabasePath().starts_with(BIG)) << DatabasePath();
  Change(20);
  Unmount(BIG);
  Sys().plugged = {&Sys().photos, &Sys().diskA};
  Change(20);
  ExpectConvergence(UNMOUNTED);
  ASSERT_FALSE(DatabasePath().starts_with(BIG)) << DatabasePath();
  MountBig();
  Sys().plugged = {&Sys().photos, &Sys().diskA, &Sys().big};
  Change(20);
  ExpectConvergence(UNMOUNTED);
}

// --- Untrusted volumes -------------------------------------------------------------------------

/// Runs SQL on a catalog.
void ChangeCatalog(const std::string& volume, const std::string& sql) {
  SQLite::Database(volume + "/.orva/orva.db", SQLite::OPEN_READWRITE, 10'000).exec(sql);
}

TEST_F(Convergent, CraftedVolumesDoNoHarm) {
  const std::string victim = std::string(CANARY) + "/victim";
  struct Craft {
    std::string name;
    std::function<void(const std::string&)> change;
  };
  const std::vector<Craft> crafts = {
      {"Trigger",
       [](const std::string& root) {
         ChangeCatalog(root, "CREATE TRIGGER t AFTER INSERT ON Files BEGIN DELETE FROM Files; END");
       }},
      {"View",
       [](const std::string& root) {
         ChangeCatalog(root, "DROP TABLE Removals; CREATE VIEW Removals AS SELECT 1 AS fileId");
       }},
      {"CatalogLink",
       [&](const std::string& root) {
         fs::remove(root + "/.orva/orva.db");
         fs::create_symlink(std::string(CANARY) + "/volume/.orva/orva.db", root + "/.orva/orva.db");
       }},
      {"CatalogFifo",
       [](const std::string& root) {
         fs::remove(root + "/.orva/orva.db");
         ASSERT_EQ(mkfifo((root + "/.orva/orva.db").c_str(), 0666), 0);
       }},
      {"LogLink",
       [&](const std::string& root) { fs::create_symlink(victim, root + "/.orva/orva.db-wal"); }},
      {"RenditionsLink",
       [](const std::string& root) {
         fs::create_directory_symlink(std::string(CANARY) + "/renditions",
                                      root + "/.orva/renditions");
       }},
      {"RenditionsFifo",
       [](const std::string& root) {
         ASSERT_EQ(mkfifo((root + "/.orva/renditions").c_str(), 0666), 0);
       }},
      {"FolderLink",
       [](const std::string& root) {
         fs::create_directory(root + "/.orva/renditions");
         fs::create_directory_symlink(std::string(CANARY) + "/0", root + "/.orva/renditions/0");
       }},
      {"RenditionLinks",
       [&](const std::string& root) {
         fs::create_directories(root + "/.orva/renditions/0");
         for (const char* const name : {"1.jpg", "2.jpg", "1.jpg.new", "2.jpg.new"}) {
           fs::create_symlink(victim, root + "/.orva/renditions/0/" + name);
         }
       }},
      {"OrvaLink",
       [](const std::string& root) {
         fs::remove_all(root + "/.orva");
         fs::create_directory_symlink(std::string(CANARY) + "/volume/.orva", root + "/.orva");
       }},
      {"OrvaFifo",
       [](const std::string& root) {
         fs::remove_all(root + "/.orva");
         ASSERT_EQ(mkfifo((root + "/.orva").c_str(), 0666), 0);
       }},
  };
  std::string crafted = "/shares/("; // what is said about them is not compared
  std::vector<std::unique_ptr<UserFiles>> volumes;
  const auto before = Sys().plugged;
  for (const Craft& craft : crafts) {
    // Prepared elsewhere, as another user's disk is.
    const std::string keeper = std::string(IMAGES) + "/" + craft.name;
    fs::create_directories(keeper);
    ASSERT_EQ(mount("crafted", keeper.c_str(), "tmpfs", 0, "size=64m"), 0);
    UserFiles prepared(keeper, Sys().templates);
    prepared.Copy(1, "a.jpg");
    prepared.Copy(2, "Folder/b.jpg");
    catalog::Indexer(*catalog::OpenCatalog(keeper), keeper, std::time(nullptr)).Run();
    craft.change(keeper);
    fs::create_symlink(std::string(CANARY) + "/secret.jpg", keeper + "/secret.jpg");
    volumes.push_back(std::make_unique<UserFiles>("/shares/" + craft.name, Sys().templates));
    volumes.back()->Load(prepared.Save());
    fs::create_directories(volumes.back()->Root());
    ASSERT_EQ(mount(keeper.c_str(), volumes.back()->Root().c_str(), nullptr, MS_BIND, nullptr), 0);
    fs::remove(keeper + "/secret.jpg");
    Sys().plugged.push_back(volumes.back().get());
    crafted += (volumes.size() > 1 ? "|" : "") + craft.name;
  }
  crafted += ")[/:]";
  // Two of them cannot be used as they are.
  for (const char* const name : {"/shares/OrvaLink", "/shares/OrvaFifo"}) {
    EXPECT_TRUE(Await([name] { return IndexerState(name) == "unusable"; })) << name;
    fs::remove(std::string(name) + "/.orva");
  }
  EXPECT_EQ(DescribeCanary(), Sys().canary);
  // Volumes are looked at again when something is mounted.
  Unmount("/shares/Trigger");
  ASSERT_EQ(mount((std::string(IMAGES) + "/Trigger").c_str(), "/shares/Trigger", nullptr, MS_BIND,
                  nullptr),
            0);
  ExpectConvergence(crafted);
  for (const auto& volume : volumes) {
    Unmount(volume->Root());
    Unmount(std::string(IMAGES) + "/" + fs::path(volume->Root()).filename().native());
  }
  Sys().plugged = before;
  ExpectConvergence(crafted + "|" + UNMOUNTED);
}

/// A process of another user that exchanges files and folders on a volume for links, all the time.
class Swapper {
public:
  explicit Swapper(std::vector<std::pair<std::string, std::string>> pairs) {
    process_ = fork();
    if (process_ == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      if (setgroups(0, nullptr) != 0 || setgid(OTHER_USER) != 0 || setuid(OTHER_USER) != 0) {
        _exit(1);
      }
      for (;;) {
        for (const auto& [path, other] : pairs) {
          for (int i = 0; i < 2; ++i) {
            renameat2(AT_FDCWD, path.c_str(), AT_FDCWD, other.c_str(), RENAME_EXCHANGE);
            usleep(300);
          }
        }
      }
    }
  }
  Swapper(const Swapper&) = delete;
  Swapper& operator=(const Swapper&) = delete;
  ~Swapper() {
    kill(process_, SIGKILL);
    int status = 0;
    waitpid(process_, &status, 0);
    EXPECT_TRUE(WIFSIGNALED(status)) << "the process could not become another user";
  }

private:
  pid_t process_ = -1;
};

/// What vipsheader says about all renditions on a volume, also those that are not listed.
std::string SizesOfRenditions(const std::string& root) {
  std::vector<std::string> command = {"vipsheader"};
  for (auto entry = fs::recursive_directory_iterator(root); entry != fs::end(entry); ++entry) {
    const std::string path = entry->path();
    if (entry->is_regular_file() && !entry->is_symlink() && path.ends_with(".jpg") &&
        path.find("/0/") != std::string::npos) {
      command.push_back(path);
    }
  }
  return test::Run(command).output;
}

TEST_F(Convergent, AVolumeWhoseNamesAreExchangedAllTheTimeLeadsNowhereElse) {
  const std::string root = "/shares/Strange";
  const std::string canary = CANARY;
  fs::create_directory(root);
  ASSERT_EQ(mount("strange", root.c_str(), "tmpfs", 0, "size=64m,mode=777"), 0);
  UserFiles strange(root, Sys().templates);
  for (int i = 0; i < 60; ++i) {
    strange.Copy(static_cast<std::size_t>(i) % 8,
                 (i % 2 == 0 ? "Pictures/" : "") + std::to_string(i) + ".jpg");
  }
  Sys().plugged.push_back(&strange);
  ExpectConvergence();
  // Everything on the volume belongs to another user.
  RunChecked({"chown", "--recursive", "--no-dereference", "1234:1234", root});
  const std::vector<std::pair<std::string, std::string>> links = {
      {"/.orva", canary + "/volume/.orva"},
      {"/.orva/renditions", canary + "/renditions"},
      {"/.orva/renditions/0", canary + "/0"},
      {"/.orva/orva.db", canary + "/volume/.orva/orva.db"},
      {"/Pictures", canary},
      {"/Pictures/0.jpg", canary + "/secret.jpg"},
      {"/1.jpg", canary + "/secret.jpg"}};
  std::vector<std::pair<std::string, std::string>> pairs;
  for (const auto& [path, target] : links) {
    const std::string link = root + "/link" + std::to_string(pairs.size());
    fs::create_symlink(target, link);
    lchown(link.c_str(), OTHER_USER, OTHER_USER);
    pairs.emplace_back(root + path, link);
  }
  {
    const Swapper swapper(pairs);
    for (int i = 0; i < TestScale(4, 30); ++i) {
      const std::string mark = "Marks/" + std::to_string(i) + ".jpg";
      strange.Copy(static_cast<std::size_t>(i) % 8, mark);
      Sys().photos.Copy(static_cast<std::size_t>(i) % 8, mark);
      strange.Copy(static_cast<std::size_t>(i) % 8, std::to_string(100 + i) + ".jpg");
      // The others are merged as ever.
      ASSERT_TRUE(Await([&] { return IsMerged(Sys().photos, mark); }));
    }
  }
  EXPECT_EQ(DescribeCanary(), Sys().canary);
  EXPECT_THAT(SizesOfRenditions(root), Not(HasSubstr("111x77"))); // the secret photo
  for (const auto& [path, link] : pairs) {
    if (fs::is_symlink(path)) {
      EXPECT_EQ(renameat2(AT_FDCWD, path.c_str(), AT_FDCWD, link.c_str(), RENAME_EXCHANGE), 0);
    }
    fs::remove_all(link);
  }
  // Volumes in trouble are looked at again when something is mounted.
  Unmount(DISK);
  MountDisk("A");
  ExpectConvergence(root + "|src/orvadb/|" + UNMOUNTED);
  Unmount(root);
  Sys().plugged.pop_back();
  Sys().photos.Remove("Marks/");
  ExpectConvergence(UNMOUNTED);
}

// --- A reboot ----------------------------------------------------------------------------------

// The last step of the first boot: services are stopped while there is work.
TEST_F(Convergent, TheSystemIsShutDownWhileThereIsWork) {
  Change(30);
  const auto save = [](const UserFiles& files, const std::string& name) {
    WriteBytes(std::string(MODEL) + "/" + name, files.Save());
  };
  Unmount(DISK);
  save(Sys().photos, "Photos");
  save(Sys().diskA, "A");
  save(Sys().diskB, "B");
}

class AfterReboot : public Steps {};

TEST_F(AfterReboot, AnotherDiskThanBeforeIsThere) {
  const auto load = [](UserFiles& files, const std::string& name) {
    files.Load(ReadBytes(std::string(MODEL) + "/" + name));
  };
  load(Sys().photos, "Photos");
  load(Sys().diskA, "A");
  load(Sys().diskB, "B");
  ASSERT_TRUE(Await([] { return Sys().services.AreActive(); }));
  ExpectConvergence();
  MountDisk("B");
  Sys().plugged = {&Sys().photos, &Sys().diskB};
  Change(30);
  ExpectConvergence();
}

} // namespace
} // namespace orva::test

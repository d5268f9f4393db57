#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include "support/Program.h"
#include "support/Programs.h"

#include "orvautil/Core.h"

#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

const Log CONNECTED = {
    Plain("src/zophotodbmerger/NotificationListener:130: Creating the notification socket "
          "/run/orva/notification.sock"),
    Plain("src/zophotodbmerger/NotificationListener:137: Calling ReadMessage()")};

const Log REFUSED = {
    Plain("src/zophotodbmerger/NotificationListener:130: Creating the notification socket "
          "/run/orva/notification.sock"),
    Error("Unable to open socket (/run/orva/notification.sock)"),
    Info("src/zophotodbmerger/NotificationListener:154: NotificationListener exiting."),
    Info("Returning from the wait")};

/// A daemon that reports how often it terminates the XML platform.
class StartUp : public SystemTest {
protected:
  int RunProbed() {
    // The address sanitizer's runtime otherwise requires to be the first library.
    std::string asan = "ASAN_OPTIONS=verify_asan_link_order=0";
    if (const char* options = std::getenv("ASAN_OPTIONS")) {
      asan += std::string(":") + options;
    }
    return appliance.Run({"LD_PRELOAD=" + ProgramPath("libterminate_probe.so"),
                          "TERMINATE_PROBE=/tmp/terminations", asan});
  }

  static int Terminations() {
    std::ifstream file("/tmp/terminations");
    int count = 0;
    for (std::string line; std::getline(file, line);) {
      ++count;
    }
    return count;
  }

  static void MakeFile(const std::string& path, const std::string& content) {
    std::ofstream(path) << content;
  }
};

TEST_F(StartUp, WithoutAServiceTheDaemonLogsItAndExitsWithStatusZero) {
  appliance.Service().Stop();
  EXPECT_EQ(Exited(0), RunProbed());
  EXPECT_EQ(REFUSED, appliance.TakeLog());
  EXPECT_THAT(appliance.TakeOutput(), IsEmpty());
  // The listener's thread, then main.
  EXPECT_EQ(2, Terminations());
}

TEST_F(StartUp, ConnectsToTheService) {
  appliance.Start();
  EXPECT_EQ(CONNECTED, appliance.TakeLog());
}

TEST_F(StartUp, PublishesAnEmptyDatabaseUnderTheSharesRoot) {
  const std::time_t before = std::time(nullptr);
  appliance.Start();
  const std::time_t after = std::time(nullptr);

  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  const MergedDatabase merged("/shares");
  EXPECT_THAT(merged.Folders(), ElementsAre(ROOT_FOLDER));
  EXPECT_THAT(merged.Files(), IsEmpty());
  EXPECT_THAT(merged.Statistics(), IsEmpty());
  EXPECT_THAT(merged.Rows().Run("SELECT id, mc_version, desc, etype, typeof(desc) FROM Status"),
              ElementsAre("1|2.0||0|text"));
  const std::time_t stamp = std::stol(merged.Rows().Run("SELECT mdate FROM Status").at(0));
  EXPECT_LE(before, stamp);
  EXPECT_GE(after, stamp);
}

TEST_F(StartUp, MakesTheDatabaseDirectoryWorldWritableWhateverTheUmask) {
  umask(077);
  appliance.Start();
  EXPECT_EQ(fs::perms::all, fs::status("/shares/.zophotos").permissions());
}

TEST_F(StartUp, LeavesNothingInItsWorkingDirectory) {
  appliance.Start();
  EXPECT_TRUE(fs::is_empty(appliance.Daemon().Directory()));
}

TEST_F(StartUp, EmptiesTheDatabaseOfAnEarlierRun) {
  appliance.Start();
  {
    const MergedDatabase merged("/shares");
    merged.Rows().Run("INSERT INTO Folders(parent_folder_id, name, modified_date, volume) "
                      "VALUES(1, '/shares/Old/', 5, '/shares/Old/')");
    merged.Rows().Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) "
                      "VALUES(2, 'a.jpg', 5, '/shares/Old/', 5)");
    merged.Rows().Run("INSERT INTO Statistics(volume, photos_xcoded, photos_total, "
                      "last_updated_time) VALUES('/shares/Old/', 1, 1, 5)");
    merged.Rows().Run("UPDATE Status SET mdate = 5, mc_version = '1.7', desc = 'kept'");
  }
  ASSERT_EQ(Exited(0), appliance.Shutdown());

  ASSERT_EQ(Exited(0), appliance.Run());
  const MergedDatabase merged("/shares");
  EXPECT_THAT(merged.Folders(), ElementsAre(ROOT_FOLDER));
  EXPECT_THAT(merged.Files(), IsEmpty());
  EXPECT_THAT(merged.Statistics(), IsEmpty());
  EXPECT_THAT(merged.Rows().Run("SELECT mc_version, desc, mdate > 5 FROM Status"),
              ElementsAre("1.7|kept|1"));
}

TEST_F(StartUp, WithoutTheSharesRootTheDatabaseIsInTheWorkingDirectory) {
  fs::remove("/shares");
  appliance.Start();
  EXPECT_EQ(Log{Error("There is no filesystem location for the mountpoint /shares")} + CONNECTED,
            appliance.TakeLog());
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
  EXPECT_TRUE(HasMergedDatabase(appliance.Daemon().Directory()));
  EXPECT_FALSE(fs::exists("/shares"));
}

TEST_F(StartUp, WithAReadOnlySharesRootTheDaemonExitsWithStatusOne) {
  ASSERT_EQ(0, mount("shares", "/shares", "tmpfs", MS_RDONLY, "size=1m"));
  EXPECT_EQ(Exited(1), RunProbed());
  EXPECT_THAT(appliance.TakeLog(), IsEmpty());
  // This exit does not terminate the platform.
  EXPECT_EQ(0, Terminations());
  EXPECT_EQ("(absent)", Appliance::Locator());
}

TEST_F(StartUp, AnUnusableLocationTerminatesTheXmlPlatformAndAbortsTheDaemon) {
  MakeFile("/shares/.zophotos", "no directory");
  EXPECT_EQ(Killed(SIGABRT), RunProbed());
  EXPECT_EQ(1, Terminations());
  EXPECT_THAT(appliance.TakeLog(), IsEmpty());
}

TEST_F(StartUp, ALinkForTheDatabaseDirectoryIsAnUnusableLocation) {
  ASSERT_EQ(0, mkdir("/tmp/elsewhere", 0700));
  fs::create_directory_symlink("/tmp/elsewhere", "/shares/.zophotos");
  EXPECT_EQ(Killed(SIGABRT), RunProbed());
  EXPECT_EQ(1, Terminations());
  EXPECT_EQ(fs::perms::owner_all, fs::status("/tmp/elsewhere").permissions());
  EXPECT_TRUE(fs::is_empty("/tmp/elsewhere"));
}

TEST_F(StartUp, ABrokenDatabaseTerminatesTheXmlPlatformAndAbortsTheDaemon) {
  ASSERT_EQ(0, mkdir("/shares/.zophotos", 0777));
  MakeFile("/shares/.zophotos/zophotos.db", std::string(4096, 'x'));
  EXPECT_EQ(Killed(SIGABRT), RunProbed());
  EXPECT_EQ(1, Terminations());
  EXPECT_THAT(appliance.TakeLog(), IsEmpty());
}

TEST_F(StartUp, ALinkForTheDatabaseFileIsNotFollowed) {
  ASSERT_EQ(0, mkdir("/shares/.zophotos", 0777));
  fs::create_symlink("/tmp/elsewhere.db", "/shares/.zophotos/zophotos.db");
  EXPECT_EQ(Killed(SIGABRT), RunProbed());
  EXPECT_FALSE(fs::exists("/tmp/elsewhere.db"));
}

TEST_F(StartUp, ALinkForTheLocatorIsNotFollowed) {
  MakeFile("/tmp/precious", "precious");
  fs::create_symlink("/tmp/precious", "/tmp/zophotodbmerger.conf");
  appliance.Start();
  EXPECT_EQ(CONNECTED, appliance.TakeLog());
  std::ifstream file("/tmp/precious");
  std::string content;
  std::getline(file, content);
  EXPECT_EQ("precious", content);
}

TEST_F(StartUp, APipeForTheLocatorDoesNotBlockTheDaemon) {
  ASSERT_EQ(0, mkfifo("/tmp/zophotodbmerger.conf", 0666));
  appliance.Start();
  EXPECT_EQ(CONNECTED, appliance.TakeLog());
}

TEST_F(StartUp, TheLocatorOfAnEarlierRunIsReplacedCompletely) {
  MakeFile("/tmp/zophotodbmerger.conf", std::string(4096, 'x'));
  appliance.Start();
  EXPECT_EQ(SHARES_LOCATOR, Appliance::Locator());
}

/// Everything below /shares and the locator, with the time of the last change.
Lines Published() {
  Lines published{Appliance::Locator()};
  for (const std::string& path : PathsBelow("/shares")) {
    const auto changed = fs::last_write_time(path).time_since_epoch().count();
    published.push_back(path + " " + std::to_string(changed));
  }
  return published;
}

TEST_F(StartUp, ASecondDaemonEndsBeforeItTouchesAnything) {
  appliance.Start();
  const Volume a("A", "150g");
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Scanned(a.Path()));
  const Lines published = Published();
  ASSERT_EQ("zophotos_db_path=/shares/A//.zophotos/zophotos.db\n", published[0]);
  appliance.TakeLog();

  ASSERT_EQ(0, mkdir("/tmp/second", 0700));
  Program second({ProgramPath("zophotodbmerger")},
                 {.errors = Program::Errors::Apart, .directory = "/tmp/second"});
  std::string output;
  std::string error;
  second.ReadToEnd(output, error);
  EXPECT_EQ(Exited(1), second.WaitForEnd());

  EXPECT_EQ("", output);
  EXPECT_EQ("zophotodbmerger: another daemon is running: it has locked "
            "/run/zophotodbmerger/lock\n",
            error);
  EXPECT_EQ(Log{Error("Another daemon is running: it has locked /run/zophotodbmerger/lock")},
            appliance.TakeLog());
  EXPECT_EQ(published, Published());
  EXPECT_TRUE(fs::is_empty("/tmp/second"));
  EXPECT_EQ(Log{Info(":: Scanned")}, appliance.Handle(Scanned(a.Path())));
}

TEST_F(StartUp, ADaemonThatWasKilledLeavesNoLock) {
  appliance.Start();
  ASSERT_EQ(0, kill(appliance.Daemon().Pid(), SIGKILL));
  appliance.Daemon().AwaitEnd();
  appliance.Service().CloseClient();
  appliance.Start();
}

TEST_F(StartUp, WithoutAPlaceForTheLockTheDaemonStarts) {
  MakeFile("/run/zophotodbmerger", "no directory");
  appliance.Start();
  EXPECT_EQ(CONNECTED, appliance.TakeLog());
}

/// Runs the program with arguments. It must not become the daemon: it touches nothing.
Outcome RunWith(const Lines& arguments) {
  Lines command{ProgramPath("zophotodbmerger")};
  command.insert(command.end(), arguments.begin(), arguments.end());
  Outcome outcome = Run(command);
  EXPECT_EQ("(absent)", Appliance::Locator());
  EXPECT_THAT(PathsBelow("/shares"), IsEmpty());
  EXPECT_FALSE(fs::exists("/run/zophotodbmerger"));
  return outcome;
}

const char* const USAGE = "usage: zophotodbmerger [--help | --version]\n";

TEST_F(StartUp, HelpAndVersionArePrinted) {
  for (const char* const option : {"--help", "-h"}) {
    const Outcome help = RunWith({option});
    EXPECT_EQ(Exited(0), help.status);
    EXPECT_THAT(help.output, ::testing::StartsWith(USAGE));
    EXPECT_THAT(help.output, ::testing::HasSubstr("See zophotodbmerger(8)."));
    EXPECT_EQ("", help.error);
  }

  const Outcome version = RunWith({"--version"});
  EXPECT_EQ(Exited(0), version.status);
  EXPECT_THAT(version.output, ::testing::MatchesRegex("zophotodbmerger [0-9]+\\.[0-9.]+\n"));
  EXPECT_EQ("", version.error);
  EXPECT_THAT(appliance.TakeLog(), IsEmpty());
}

TEST_F(StartUp, OtherArgumentsAreRefused) {
  const std::vector<std::pair<Lines, std::string>> examples = {
      {{"-x"}, "unknown option: -x"},
      {{"start"}, "unexpected argument: 'start'"},
      {{""}, "unexpected argument: ''"},
      {{"--help", "--help"}, "unexpected argument: '--help'"},
      {{"--version", "x"}, "unexpected argument: 'x'"},
      {{"--"}, "unknown option: --"},
      {{"\x1b[2J\xc3\xa4\n"}, "unexpected argument: '\\x1b[2J\xc3\xa4\\x0a'"}};
  for (const auto& [arguments, message] : examples) {
    const Outcome outcome = RunWith(arguments);
    EXPECT_EQ(Exited(2), outcome.status) << arguments[0];
    EXPECT_EQ("", outcome.output);
    EXPECT_THAT(outcome.error,
                ::testing::StartsWith("zophotodbmerger: " + message +
                                      "\nTry 'zophotodbmerger --help'.\n\n" + USAGE));
  }
  EXPECT_THAT(appliance.TakeLog(), IsEmpty());
}

} // namespace
} // namespace orva::test

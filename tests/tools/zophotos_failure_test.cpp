// Exit statuses and messages of zophotos when it fails, and that it changes nothing.

#include "ZophotosTest.h"

#include "hostile/CraftedLog.h"
#include "support/ThreadState.h"

#include <sys/stat.h>
#include <sys/syscall.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <tuple>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Lt;
using ::testing::Not;
using ::testing::SizeIs;

/// All commands except watch, which does not end by itself.
const std::vector<Arguments> COMMANDS{{},
                                      {"status"},
                                      {"ls"},
                                      {"ls", "-l", "A"},
                                      {"tree"},
                                      {"find", "*"},
                                      {"find", "-0", ""},
                                      {"failed"},
                                      {"check"},
                                      {"export", "--csv"},
                                      {"export", "--jsonl"},
                                      {"export", "--changes", "/run/feed"},
                                      {"status", "--json"},
                                      {"ls", "--json"},
                                      {"tree", "--json"},
                                      {"check", "--json"}};

std::string Text(const Arguments& arguments) {
  return ::testing::PrintToString(arguments);
}

void ExpectFailure(const Outcome& outcome, int status, const std::string& message) {
  ExpectError(outcome, status, "zophotos: " + message + "\n");
}

/// The locator file, without a daemon.
class ZophotosLocator : public ::testing::Test {
protected:
  void SetUp() override { fs::remove_all(LOCATOR); }
  void TearDown() override { fs::remove_all(LOCATOR); }

  static void Write(const std::string& text) { std::ofstream(LOCATOR) << text; }

  static void ExpectNoDatabase(const std::string& reason) {
    for (const Arguments& command : COMMANDS) {
      SCOPED_TRACE(Text(command));
      ExpectFailure(Zophotos(command), 3, "no merged database: " + reason);
    }
  }
};

TEST_F(ZophotosLocator, IsReportedIfMissing) {
  ExpectNoDatabase(LOCATOR + " does not exist; the daemon creates it when it starts");
}

TEST_F(ZophotosLocator, IsReportedIfItNamesNoDatabase) {
  Write("zophotos_db_path=\n");
  ExpectNoDatabase("/tmp/zophotodbmerger.conf names no database at the moment");
}

TEST_F(ZophotosLocator, IsReportedIfMalformed) {
  for (const char* const text : {"", "\n", "nonsense\n", " zophotos_db_path=/x\n", "ZOPHOTOS"}) {
    Write(text);
    ExpectNoDatabase("/tmp/zophotodbmerger.conf does not begin with zophotos_db_path=");
  }
}

TEST_F(ZophotosLocator, IsReportedIfItHasANul) {
  for (const std::string& path : {std::string("\0", 1), std::string("/shares\0/x", 10)}) {
    Write("zophotos_db_path=" + path + "\n");
    ExpectNoDatabase("/tmp/zophotodbmerger.conf has a NUL byte in its first line");
  }
}

TEST_F(ZophotosLocator, IsReportedIfItIsNotARegularFile) {
  const std::string reason =
      "/tmp/zophotodbmerger.conf is not a regular file, so the daemon does not write to it";
  fs::create_directory(LOCATOR);
  ExpectNoDatabase(reason);
  fs::remove(LOCATOR);
  ASSERT_EQ(0, mkfifo(LOCATOR.c_str(), 0666));
  ExpectNoDatabase(reason);
}

TEST_F(ZophotosLocator, MayNameAMissingDatabase) {
  Write("zophotos_db_path=/shares/Gone//.zophotos/zophotos.db\n");
  ExpectNoDatabase("/shares/Gone//.zophotos/zophotos.db does not exist");
}

TEST_F(ZophotosLocator, MayNameADirectoryOrADevice) {
  for (const char* const path : {"/shares", "/dev/null"}) {
    Write("zophotos_db_path=" + std::string(path));
    ExpectFailure(Zophotos({"status"}), 5, std::string(path) + " is not a regular file");
    ExpectFailure(Zophotos({"ls"}), 5, std::string(path) + " is not a regular file");
  }
}

TEST_F(ZophotosLocator, IsEscapedInMessages) {
  Write("zophotos_db_path=/x\x1b[2J\xff\u202e\r\n");
  ExpectNoDatabase(R"(/x\x1b[2J\xff\xe2\x80\xae\x0d does not exist)");
}

TEST_F(ZophotosLocator, IsNotReadToTheEndIfHuge) {
  Write("zophotos_db_path=/" + std::string(1 << 20, 'x'));
  const Outcome outcome = Zophotos({"status"});
  EXPECT_EQ(5, outcome.status);
  EXPECT_THAT(outcome.error, AllOf(HasSubstr("/xxx"), SizeIs(Lt(10000))));
}

TEST(ZophotosUsage, ErrorsHaveAStatusOfTheirOwn) {
  const std::vector<std::pair<Arguments, std::string>> wrong{
      {{"destroy"}, "unknown command: 'destroy'\n"},
      {{"stats", "-l"}, "unknown command: 'stats'; did you mean 'status'?\n"},
      {{"help", "stat"}, "unknown command: 'stat'; did you mean 'status'?\n"},
      {{"help", "ls", "A"}, "unexpected argument: 'A'"},
      {{"ls", "--nonsense"}, "unknown option: --nonsense\n"},
      {{"ls", "--lang"}, "unknown option: --lang; did you mean '--long'?\n"},
      {{"--jsn", "ls"}, "unknown option: --jsn; did you mean '--json'?\n"},
      {{"-f"}, "option -f belongs after the command: zophotos status -f\n"},
      {{"-f", "status"}, "option -f belongs after the command: zophotos status -f\n"},
      {{"--follow", "status"},
       "option --follow belongs after the command: zophotos status --follow\n"},
      {{"-l", "ls"}, "option -l belongs after the command: zophotos ls -l\n"},
      {{"-0", "find", "x"}, "option -0 belongs after the command: zophotos find -0\n"},
      {{"find", "-rf"},
       "unknown option: -rf; to search for a name that begins with a dash: zophotos find -- '-rf'\n"},
      {{"ls", "A", "B"}, "unexpected argument: 'B'"},
      {{"status", "A"}, "unexpected argument: 'A'"},
      {{"tree", "-L", "0"}, "option --level takes a number from 1 to 1000000, not '0'"},
      {{"tree", "-L", "x"}, "not 'x'"},
      {{"find"}, "PATTERN is required"},
      {{"find", "a", "b"}, "unexpected argument: 'b'"},
      {{"find", "--type", "x", "a"}, "option --type takes f or d, not 'x'"},
      {{"export", "--csv", "--jsonl"}, "--csv and --jsonl cannot be combined"},
      {{"--json", "export", "--csv"}, "--csv and --json cannot be combined"},
      {{"find", "-0", "--json", "x"}, "--null and --json cannot be combined"},
      {{"--json", "find", "--null", "x"}, "--null and --json cannot be combined"},
      {{"--database"}, "option --database needs a value"},
      {{"--database", "", "status"}, "option --database must not be empty"},
      {{"--color", "red"}, "option --color takes auto, always or never, not 'red'"},
      {{"status", "check"}, "unexpected argument: 'check'"}};
  for (const auto& [arguments, message] : wrong) {
    SCOPED_TRACE(Text(arguments));
    const Outcome outcome = Zophotos(arguments);
    EXPECT_EQ(2, outcome.status);
    EXPECT_EQ("", outcome.output);
    EXPECT_THAT(outcome.error, HasSubstr(message));
  }
}

TEST(ZophotosUsage, ErrorsNameTheHelpOfTheCommand) {
  for (const auto& [arguments, hint] : std::vector<std::pair<Arguments, std::string>>{
           {{"destroy"}, "zophotos"},
           {{"--nonsense", "ls"}, "zophotos ls"},
           {{"find"}, "zophotos find"},
           {{"export", "--csv", "--jsonl"}, "zophotos export"},
           {{"help", "destroy"}, "zophotos"}}) {
    EXPECT_THAT(Zophotos(arguments).error, EndsWith("\nTry '" + hint + " --help'.\n"))
        << Text(arguments);
  }
}

TEST(ZophotosUsage, HelpNamesAllCommands) {
  for (const Arguments& arguments : {Arguments{"--help"}, Arguments{"-h"}, Arguments{"help"}}) {
    const Outcome help = Zophotos(arguments);
    EXPECT_EQ(0, help.status);
    for (const char* const command :
         {"status", "ls", "tree", "find", "failed", "check", "watch", "export"}) {
      EXPECT_THAT(help.output, HasSubstr("\n  " + std::string(command) + " "));
      const Outcome more = Zophotos({command, "--help"});
      EXPECT_EQ(0, more.status);
      EXPECT_THAT(more.output, AllOf(HasSubstr(command), HasSubstr("zophotos --help")));
      EXPECT_EQ(more.output, Zophotos({"help", command}).output);
    }
  }
}

TEST(ZophotosUsage, VersionIsThatOfTheProject) {
  const Outcome outcome = Zophotos({"--version"});
  EXPECT_EQ(0, outcome.status);
  EXPECT_EQ("zophotos " PROGRAM_VERSION "\n", outcome.output);
}

class ZophotosFailure : public ZophotosTest {
protected:
  /// Expects that all commands fail on the copy.
  static void ExpectAllFail(int status, const std::string& message,
                            const std::string& except = "") {
    for (const Arguments& command : COMMANDS) {
      if (command.empty() || command[0] != except) {
        SCOPED_TRACE(Text(command));
        ExpectFailure(OnCopy(command), status, COPY + message);
      }
    }
  }
};

TEST_F(ZophotosFailure, MissingTableIsReported) {
  for (const char* const table : {"Status", "Statistics", "Folders", "Files"}) {
    Copy().Run("ALTER TABLE " + std::string(table) + " RENAME TO Other");
    ExpectAllFail(5, " is not a merged photo database: it has no table " + std::string(table));
  }
}

TEST_F(ZophotosFailure, ViewInPlaceOfATableIsReported) {
  {
    const Database copy = Copy();
    copy.Run("ALTER TABLE Statistics RENAME TO Other");
    copy.Run("CREATE VIEW Statistics AS SELECT * FROM Other");
  }
  ExpectAllFail(5, " is not a merged photo database: it has no table Statistics");
}

// In UTF-16, half a surrogate pair sorts by other bytes than those that it is read as.
TEST_F(ZophotosFailure, Utf16TextsAreReported) {
  const Database database(COPY, true);
  database.Run("PRAGMA encoding = 'UTF-16le'");
  for (const char* const table : {"Status(id)", "Statistics(id)", "Files(folder_id)",
                                  "Folders(folder_id INTEGER PRIMARY KEY, name TEXT, volume TEXT, "
                                  "modified_date INTEGER)"}) {
    database.Run("CREATE TABLE " + std::string(table));
  }
  // "/shares/" and the second half of a surrogate pair.
  database.Run("INSERT INTO Folders(name) VALUES(CAST(x'2f007300680061007200650073002f0000dc2f00' "
               "AS TEXT))");
  ExpectAllFail(5, " is not a merged photo database: its text encoding is UTF-16le");
}

TEST_F(ZophotosFailure, EmptyFileIsReported) {
  std::ofstream file(COPY);
  ExpectAllFail(5, " is not a merged photo database: it has no table Status");
}

TEST_F(ZophotosFailure, FileThatIsNotADatabaseIsReported) {
  std::ofstream(COPY) << std::string(5000, 'x');
  ExpectAllFail(5, ": file is not a database", "check");
}

TEST_F(ZophotosFailure, MissingColumnIsReported) {
  Copy().Run("ALTER TABLE Files RENAME COLUMN name TO other");
  for (const Arguments& command : {Arguments{"find", "*"}, Arguments{"export", "--csv"},
                                   Arguments{"ls"}, Arguments{"check"}}) {
    const Outcome outcome = OnCopy(command);
    EXPECT_EQ(5, outcome.status) << Text(command);
    EXPECT_THAT(outcome.error, HasSubstr("no such column: f.name"));
  }
}

TEST_F(ZophotosFailure, LongLockIsReported) {
  const Database locked = Copy();
  locked.Run("BEGIN EXCLUSIVE");
  std::vector<std::unique_ptr<Program>> programs;
  for (const Arguments& command : COMMANDS) { // all at once, because each of them waits
    programs.push_back(std::make_unique<Program>(ZophotosCommand(OnCopyArguments(command))));
  }
  for (std::size_t i = 0; i < programs.size(); ++i) {
    EXPECT_EQ("zophotos: " + COPY +
                  " is locked, for example while a large merge commits; try again",
              programs[i]->ReadLine());
    EXPECT_EQ("(end)", programs[i]->ReadLine());
    EXPECT_EQ(4, programs[i]->WaitForEnd()) << Text(COMMANDS[i]);
  }
}

TEST_F(ZophotosFailure, ShortLockIsWaitedFor) {
  const Database locked = Copy();
  for (const char* const command : {"status", "ls"}) {
    locked.Run("BEGIN EXCLUSIVE");
    Program program(ZophotosCommand(OnCopyArguments({command})));
    EXPECT_TRUE(AwaitSystemCall(program.Pid(), SYS_clock_nanosleep));
    locked.Run("COMMIT");
    EXPECT_THAT(program.ReadLineWith("A/"), Not(HasSubstr("(end)")));
    EXPECT_EQ(0, program.WaitForEnd());
  }
}

TEST_F(ZophotosFailure, InterruptedMergeIsReported) {
  constexpr std::uint32_t pageSize = 4096;
  Copy();
  Bytes file = Bytes::Of(COPY);
  ASSERT_EQ(pageSize, file.Read(16, 2));
  CraftedJournal(pageSize, static_cast<std::uint32_t>(file.Size()) / pageSize,
                 {{1, file.Part(0, pageSize)}})
      .Save(COPY + "-journal");
  ExpectAllFail(4, " has an interrupted merge to roll back; the daemon does that when it opens the "
                   "database");
  Program watch(ZophotosCommand(OnCopyArguments({"--json", "watch"})));
  EXPECT_THAT(watch.ReadLine(), HasSubstr(R"("event":"delayed","reason":")" + COPY));
  EXPECT_TRUE(fs::exists(COPY + "-journal"));
  EXPECT_EQ(std::vector<std::string>{"4"}, Database(COPY).Run("SELECT count(*) FROM Files"));
  EXPECT_EQ(0, OnCopy({"status"}).status);
}

TEST_F(ZophotosFailure, WriteAheadLogIsReportedAndNotCreated) {
  Copy().Run("PRAGMA journal_mode = WAL");
  ExpectAllFail(5,
                " uses a write-ahead log, unlike the daemon's databases; reading it would create "
                "files next to it");
  EXPECT_FALSE(fs::exists(COPY + "-wal"));
  EXPECT_FALSE(fs::exists(COPY + "-shm"));
}

TEST_F(ZophotosFailure, UnwritableOutputIsReported) {
  std::vector<Arguments> commands = COMMANDS;
  commands.push_back({"watch"});
  commands.push_back({"status", "-f"});
  commands.push_back({"--help"});
  for (const Arguments& command : commands) {
    SCOPED_TRACE(Text(command));
    ExpectFailure(Zophotos(command, "/dev/full"), 5, "cannot write to standard output");
  }
}

TEST_F(ZophotosFailure, FailedPrivateCopyIsReported) {
  AddFiles(Copy(), 100'000, "1", "i");
  const Volume full("Full", "64k");
  const Volume closed("Closed", "64k,nr_inodes=1");
  for (const auto& [volume, fault] :
       {std::pair(&full, "no space"), std::pair(&closed, "no writable folder")}) {
    setenv("SQLITE_TMPDIR", volume->Path().c_str(), 1);
    for (const Arguments& command : {Arguments{"status"}, Arguments{"tree"}, Arguments{"find", "*"},
                                     Arguments{"check"}, Arguments{"export", "--csv"}}) {
      SCOPED_TRACE(Text(command));
      ExpectFailure(OnCopy(command), 5,
                    std::string(fault) + " for a private copy of " + COPY +
                        "; set SQLITE_TMPDIR to another folder");
    }
  }
  unsetenv("SQLITE_TMPDIR");
}

/// Content, modification time and change time of a file.
using FileState = std::tuple<std::string, long, long, long, long>;

/// The states of a folder and of everything in it.
std::map<std::string, FileState> Snapshot(const std::string& folder) {
  std::map<std::string, FileState> snapshot;
  std::vector<std::string> paths = PathsBelow(folder);
  paths.push_back(folder);
  for (const std::string& path : paths) {
    struct stat status {};
    stat(path.c_str(), &status);
    std::ifstream file(path, std::ios::binary);
    snapshot[path] = {
        S_ISDIR(status.st_mode) ? "" : std::string(std::istreambuf_iterator<char>(file), {}),
        status.st_mtim.tv_sec, status.st_mtim.tv_nsec, status.st_ctim.tv_sec,
        status.st_ctim.tv_nsec};
  }
  return snapshot;
}

TEST_F(ZophotosFailure, NoCommandChangesTheDatabase) {
  const auto before = Snapshot("/shares/A/.zophotos");
  for (const Arguments& command : COMMANDS) {
    EXPECT_EQ(0, Zophotos(command).status);
    EXPECT_EQ(before, Snapshot("/shares/A/.zophotos")) << Text(command);
  }
  Program watch(ZophotosCommand({"watch"}));
  EXPECT_THAT(watch.ReadLine(), HasSubstr("watching"));
  EXPECT_EQ(before, Snapshot("/shares/A/.zophotos"));
  Program follow(ZophotosCommand({"status", "-f"}));
  EXPECT_THAT(follow.ReadLineWith("TOTAL"), HasSubstr("57 %"));
  EXPECT_EQ(before, Snapshot("/shares/A/.zophotos"));
}

TEST_F(ZophotosFailure, NoCommandLeavesTemporaryFiles) {
  const auto before = PathsBelow("/tmp");
  for (const Arguments& command : COMMANDS) {
    Zophotos(command);
  }
  EXPECT_EQ(before, PathsBelow("/tmp"));
}

} // namespace
} // namespace orva::test

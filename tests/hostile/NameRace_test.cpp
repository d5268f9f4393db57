// An untrusted user replaces names on the volumes and in /tmp as fast as possible, while the daemon
// handles events.

#include "Messages.h"
#include "NamesTest.h"

#include "support/OtherUsers.h"
#include "support/Program.h"
#include "support/Programs.h"
#include "support/TestScale.h"

#include <filesystem>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

const std::chrono::seconds DURATION{TestScale(3, 60)};

/// How many hard links to a private file there are for a name.
constexpr int HARD_LINKS = 4;

/// The names on one file system, and a pool directory there for their replacements.
struct Group {
  std::string pool;
  Lines names;
};

class NameRace : public NamesTest {
protected:
  /// Handles events while the names are replaced.
  void Race(const std::vector<Group>& groups) {
    SKIP_WITHOUT_OTHER_USERS();
    Program::Arguments command{ProgramPath("name_racer")};
    for (const Group& group : groups) {
      fs::create_directory(group.pool);
      fs::permissions(group.pool, fs::perms(0777));
      command = command + Lines{FilesFor(group.names.front()).Directory(), group.pool} +
                group.names + Lines{"--"};
    }
    MakeHardLinks(groups);
    Program racer(command, {.input = ""});
    const std::string answer = racer.ReadLine();
    ASSERT_EQ("ready", answer);
    int events = 0;
    try {
      for (const auto end = Clock::now() + DURATION; Clock::now() < end;) {
        HandleEvents(events);
        MakeHardLinks(groups);
        ExchangeFiles();
      }
    } catch (const std::exception& error) {
      ADD_FAILURE() << "event " << events << ": " << error.what();
    }
    racer.CloseInput();
    const std::string changes = racer.ReadLine();
    EXPECT_EQ(0, racer.WaitForEnd());
    EXPECT_GT(std::stol(changes), 1000);
    ReportFigure("replaced names while events are handled",
                 changes + " in " + std::to_string(events) + " events");

    ExpectPrivateFilesUnchanged();
    if (HasFailure()) {
      return;
    }
    for (const Group& group : groups) {
      fs::remove_all(group.pool);
    }
    RestoreFiles();
    ExpectGoodMerge(true);
    ExpectNoMoreDescriptors();
  }

private:
  /// Only root can link to its private files. The daemon may remove the links.
  void MakeHardLinks(const std::vector<Group>& groups) const {
    for (const Group& group : groups) {
      for (const std::string& path : group.names) {
        const std::string name = fs::path(path).filename();
        for (int i = 0; i < HARD_LINKS && IsFor(Replacement::HardLink, name); ++i) {
          try {
            MakeReplacement(Replacement::HardLink, group.pool + "/" + name + std::to_string(i),
                            name, FilesFor(path).Directory());
          } catch (const fs::filesystem_error&) {
            // It is still there.
          }
        }
      }
    }
  }

  /// Has the daemon handle one event of each kind for each volume, and counts them.
  void HandleEvents(int& events) {
    for (const std::string& message :
         {TranscodedBatch(vol.Path()), Purged(vol.Path()), TranscodedBatch(master.Path()),
          Unplugged(vol.Path()), Plugged(vol.Path()), TranscodedBatch(vol.Path()),
          Purged(master.Path())}) {
      ++events;
      const Watchdog watchdog(appliance.Daemon().Pid());
      appliance.Service().Send(message);
      AwaitAnswer(appliance.SendBarrier());
    }
  }

protected:
  const Lines merged = WithLogs(MERGED_FILE) + WithLogs(MERGED_FILE + ".new");
  const Group locator{"/tmp/pool", {LOCATOR_FILE}};
};

TEST_F(NameRace, ForFilesHarmsNothingAndEndsWithIt) {
  Race({{"/shares/Master/pool", merged}, {"/shares/Vol/pool", WithLogs(CATALOG_FILE)}, locator});
}

TEST_F(NameRace, ForDirectoriesHarmsNothingAndEndsWithIt) {
  for (const Volume* const volume : {&master, &vol}) {
    fs::permissions(volume->Path(), fs::perms(0777));
  }
  Race({{"/shares/Master/pool", Lines{MERGED_FOLDER} + merged},
        {"/shares/Vol/pool", Lines{CATALOG_FOLDER} + WithLogs(CATALOG_FILE)},
        locator});
}

} // namespace
} // namespace orva::test

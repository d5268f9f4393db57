#include "ZophotosTest.h"

#include "support/Programs.h"
#include "system/Deadline.h"

#include <sys/mount.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <system_error>
#include <thread>

namespace orva::test {

namespace fs = std::filesystem;

namespace {

/// How many times a process has gone to sleep.
long Waits(pid_t pid) {
  std::ifstream file("/proc/" + std::to_string(pid) + "/status");
  const std::string name = "voluntary_ctxt_switches:";
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with(name)) {
      return std::stol(line.substr(name.size()));
    }
  }
  throw std::runtime_error("no " + name + " of " + std::to_string(pid));
}

} // namespace

Arguments ZophotosCommand(Arguments arguments) {
  arguments.insert(arguments.begin(), ProgramPath("zophotos"));
  return arguments;
}

Outcome Zophotos(Arguments arguments, const std::string& output) {
  return Run(ZophotosCommand(std::move(arguments)), output);
}

Arguments OnCopyArguments(Arguments arguments) {
  arguments.insert(arguments.begin(), {"--database", COPY});
  return arguments;
}

Outcome OnCopy(Arguments arguments) {
  return Zophotos(OnCopyArguments(std::move(arguments)));
}

void ExpectOutput(const Outcome& outcome, const std::string& output, int status) {
  EXPECT_EQ(status, outcome.status);
  EXPECT_EQ(output, outcome.output);
  EXPECT_EQ("", outcome.error);
}

void ExpectError(const Outcome& outcome, int status, const std::string& error) {
  EXPECT_EQ(status, outcome.status);
  EXPECT_EQ("", outcome.output);
  EXPECT_EQ(error, outcome.error);
}

Lines SplitLines(const std::string& text) {
  std::istringstream stream(text);
  Lines lines;
  for (std::string line; std::getline(stream, line);) {
    lines.push_back(line);
  }
  return lines;
}

void AddRows(const Database& copy, const std::string& folder, const std::string& file) {
  copy.Run("INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(1, " +
           folder + ", 0, '/shares/A/')");
  if (!file.empty()) {
    copy.Run("INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
             "max(folder_id), " +
             file + ", 5, '/shares/A/', 6 FROM Folders");
  }
}

void AddFiles(const Database& copy, int count, const std::string& folderId,
              const std::string& name) {
  copy.Run("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < " +
           std::to_string(count) +
           ") INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT " +
           folderId + ", " + name + ", 1, '/shares/A/', 1 FROM n");
}

void AwaitLooks(const Program& program) {
  // It sleeps between two looks, and in a look that waits for a lock.
  const long enough = Waits(program.Pid()) + 8;
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  while (Waits(program.Pid()) < enough) {
    ASSERT_LT(std::chrono::steady_clock::now(), end) << "the program does not look";
    std::this_thread::yield();
  }
}

EmptyStateFolder::EmptyStateFolder() {
  if (mount("state", "/var/lib", "tmpfs", 0, nullptr) != 0) {
    throw std::system_error(errno, std::generic_category(), "/var/lib");
  }
}

EmptyStateFolder::~EmptyStateFolder() {
  umount2("/var/lib", MNT_DETACH);
}

void ZophotosTest::SetUp() {
  setenv("TZ", "UTC", 1);
  fs::remove_all(fs::path(COPY).parent_path());
  fs::create_directory(fs::path(COPY).parent_path());
  onA.AddFolder("Pictures/", 500);
  onA.AddFolder("Pictures/Summer/", 600);
  onA.AddPhoto("top.jpg", 1000, 2000);
  onA.AddPhoto("Pictures/b.jpg", 1001, 2001);
  onA.AddPhoto("Pictures/Summer/a.jpg", 1002, 2002);
  onB.AddFolder("Old/", 700);
  onB.AddPhoto("Old/1.jpg", 86400, 2003);
  AddUntranscoded(onB, "Old/2.jpg");
  AddUntranscoded(onB, "Old/3.jpg");
  AddUntranscoded(onD, "new.jpg");
  appliance.Start();
  for (const Volume* const volume : {&a, &b, &c, &d}) {
    appliance.Handle(Plugged(volume->Path()));
  }
  appliance.Handle(Scanned(a.Path()));
  for (const Volume* const volume : {&a, &b, &c, &d}) {
    Merge(*volume);
  }
}

void ZophotosTest::AddUntranscoded(Catalog& catalog, const std::string& path) {
  catalog.AddPhoto(path, 1, 1);
  catalog.Rows().Run("DELETE FROM Transcodings WHERE sourceId = (SELECT id FROM Files WHERE path = "
                     "?)",
                     {path});
  catalog.Rows().Run("UPDATE Files SET status = 2 WHERE path = ?", {path});
}

Database ZophotosTest::Copy() {
  fs::copy_file(MERGED, COPY, fs::copy_options::overwrite_existing);
  return Database(COPY);
}

} // namespace orva::test

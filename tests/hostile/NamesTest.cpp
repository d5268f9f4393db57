#include "NamesTest.h"

#include "Catalog.h"
#include "Messages.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <condition_variable>
#include <csignal>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <stdexcept>

namespace orva::test {

namespace {

namespace fs = std::filesystem;
using ::testing::IsEmpty;

const LogLine KILLED = Error("killed: it has not answered in time");

} // namespace

Lines WithLogs(const std::string& database) {
  return {database, database + "-journal", database + "-wal", database + "-shm"};
}

Watchdog::Watchdog(pid_t process)
    : thread_([process](const std::stop_token& done) {
        std::mutex mutex;
        std::unique_lock lock(mutex);
        std::condition_variable_any().wait_for(lock, done, LIMIT, [] { return false; });
        if (!done.stop_requested()) {
          kill(process, SIGKILL);
          syslog(LOG_LOCAL1 | LOG_ERR, "%s", KILLED.text.c_str());
        }
      }) {}

void NamesTest::SetUp() {
  Catalog(master).AddPhoto("m.jpg", 1, 1000);
  Catalog catalog(vol);
  catalog.AddFolder("a/", 11);
  catalog.AddPhoto("a/one.jpg", 1, 1000);
  appliance.Start();
  appliance.Handle(Plugged(master.Path()));
  appliance.Handle(Plugged(vol.Path()));
  appliance.Handle(Scanned(master.Path()));
  appliance.Handle(TranscodedBatch(master.Path()));
  appliance.Handle(TranscodedBatch(vol.Path()));
  merged_ = Bytes::Of(MERGED_FILE);
  catalog.AddPhoto("a/two.jpg", 2, 2000);
  catalog_ = Bytes::Of(CATALOG_FILE);
  files_.try_emplace(MERGED_FOLDER, "/shares/Master/spare", std::vector{MERGED_FILE});
  files_.try_emplace(CATALOG_FOLDER, "/shares/Vol/spare", std::vector{CATALOG_FILE});
  files_.try_emplace(LOCATOR_FILE, "/tmp/spare", std::vector<std::string>());

  RestoreFiles();
  appliance.Handle(TranscodedBatch(vol.Path()));
  good_ = MergedDatabase(master.Path()).Content();
  RestoreFiles();
  descriptors_ = Descriptors();
}

void NamesTest::RestoreFiles() const {
  for (const std::string& path : {MERGED_FOLDER, CATALOG_FOLDER, LOCATOR_FILE}) {
    fs::remove_all(path);
  }
  MakeFiles(MERGED_FOLDER, CATALOG_FOLDER, LOCATOR_FILE);
}

void NamesTest::ExchangeFiles() const {
  // No path that another user can change leads to the new files.
  const auto fresh = [this](const std::string& path) {
    return FilesFor(path).Directory() + "/fresh";
  };
  MakeFiles(fresh(MERGED_FOLDER), fresh(CATALOG_FOLDER), fresh(LOCATOR_FILE));
  for (const std::string& path : {MERGED_FOLDER, CATALOG_FOLDER, LOCATOR_FILE}) {
    const std::string made = fresh(path);
    if (renameat2(AT_FDCWD, made.c_str(), AT_FDCWD, path.c_str(), RENAME_EXCHANGE) != 0) {
      renameat2(AT_FDCWD, made.c_str(), AT_FDCWD, path.c_str(), RENAME_NOREPLACE);
    }
    fs::remove_all(made);
  }
}

void NamesTest::MakeFiles(const std::string& folder, const std::string& home,
                          const std::string& locator) const {
  for (const std::string& directory : {folder, home}) {
    fs::create_directory(directory);
    fs::permissions(directory, fs::perms(0777));
  }
  catalog_.Save(home + "/" + fs::path(CATALOG_FILE).filename().string());
  merged_.Save(folder + "/" + fs::path(MERGED_FILE).filename().string());
  std::ofstream(locator).flush();
  static_cast<void>(chown(locator.c_str(), UNTRUSTED_USER, UNTRUSTED_USER) == 0);
}

void NamesTest::AwaitAnswer(const std::string& last) {
  bool killed = false;
  const bool answered = appliance.Log().Await(
      [&, searched = std::size_t{0}](const std::vector<LogLine>& lines) mutable {
        for (; searched < lines.size(); ++searched) {
          killed = killed || lines[searched] == KILLED;
          if (killed || lines[searched] == Error(last)) {
            return true;
          }
        }
        return false;
      });
  if (killed || !answered) {
    throw std::runtime_error("the daemon has not answered");
  }
}

const PrivateFiles& NamesTest::FilesFor(const std::string& path) const {
  for (const auto& [name, files] : files_) {
    if (path.starts_with(name)) {
      return files;
    }
  }
  throw std::runtime_error("no private files for " + path);
}

void NamesTest::ExpectPrivateFilesUnchanged() {
  for (auto& [name, files] : files_) {
    EXPECT_THAT(files.Changes(), IsEmpty());
  }
}

void NamesTest::ExpectGoodMerge(bool replug) {
  appliance.TakeLog();
  Log log;
  if (replug) {
    log = appliance.Handle(Unplugged(vol.Path())) + appliance.Handle(Plugged(vol.Path()));
    EXPECT_EQ("zophotos_db_path=/shares/Master//.zophotos/zophotos.db\n", Appliance::Locator());
  }
  log = log + appliance.Handle(TranscodedBatch(vol.Path()));
  for (const LogLine& line : log) {
    EXPECT_NE(Error("").priority, line.priority) << line.text;
  }
  EXPECT_EQ(good_, MergedDatabase(master.Path()).Content());
  ExpectPrivateFilesUnchanged();
}

void NamesTest::ExpectNoMoreDescriptors() const {
  EXPECT_EQ(descriptors_, Descriptors());
}

std::size_t NamesTest::Descriptors() const {
  const fs::path directory = "/proc/" + std::to_string(appliance.Daemon().Pid()) + "/fd";
  return static_cast<std::size_t>(
      std::distance(fs::directory_iterator(directory), fs::directory_iterator()));
}

} // namespace orva::test

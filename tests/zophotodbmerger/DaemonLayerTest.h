#pragma once

#include "Syslog.h"
#include "VolumeInfo.h"

#include "support/Thrown.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

namespace orva::test {

using Log = std::vector<LogLine>;
using Lines = std::vector<std::string>;

/// A test of the daemon's own classes in this process, which has a private root, and so the
/// singletons and the system log, to itself.
class DaemonLayerTest : public ::testing::Test {
protected:
  /// What the process has logged since the last call. Elapsed times read TIME. The merger
  /// thread's "Iterating over mount point" lines, which come at any time, are left out.
  Log Logged();

  /// The same with the lines of the merger's thread.
  Log LoggedByAllThreads();

private:
  Syslog log_;
  std::size_t taken_ = 0;
  int marks_ = 0;
};

/// What `action` writes to standard output.
template <typename Action>
std::string OutputOf(Action action) {
  ::testing::internal::CaptureStdout();
  try {
    action();
  } catch (...) {
    ::testing::internal::GetCapturedStdout();
    throw;
  }
  return ::testing::internal::GetCapturedStdout();
}

/// Makes a directory, with its parents, and returns its path.
std::string MakeDirectory(const std::string& path);

/// Permission bits of what stands at `path` itself.
unsigned ModeOf(const std::string& path);

/// A record of a volume with `free` bytes.
dbmerger::VolumeInfo Record(const std::string& mountPoint, double capacity, double free,
                            bool readOnly = false);

/// The record that stands for the shares root, as text.
inline const std::string SHARES_MASTER_TEXT = "\nMountPoint: /shares\nCapacity: 1.04858e+11M\n"
                                              "Used: 100M\nPhotoDB size: 1\nReadOnly: 0\n";

/// Content of the locator file, to the last byte; "(absent)" when there is none.
std::string Locator();

const std::string SHARES_LOCATOR = "zophotos_db_path=/shares//.zophotos/zophotos.db\n";

/// The path of the merged database at a location.
std::string MergedDatabasePath(const std::string& location);

/// Rows of the merged database at a location, the columns joined by '|'.
Lines MergedRows(const std::string& location, const std::string& sql);

/// "name|volume" of the folders but the root, by name.
Lines MergedFolders(const std::string& location);
/// Full path of the files, by path.
Lines MergedFiles(const std::string& location);
/// "volume|photos_xcoded|photos_total|last_updated_time", by volume.
Lines MergedStatistics(const std::string& location);
/// Every row of every table.
Lines MergedContent(const std::string& location);

/// The lines of a merge that goes through: `folders` with the root row, `files` as read.
Log MergeLines(const std::string& mountPoint, int folders, int files);

/// Several pieces of a log, one behind the other.
Log Joined(Log first, const Log& second);

} // namespace orva::test

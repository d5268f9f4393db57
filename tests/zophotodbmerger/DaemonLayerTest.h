#pragma once

#include "Expectations.h"
#include "VolumeInfo.h"

#include "support/Thrown.h"

#include <filesystem>
#include <string>

namespace orva::test {

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

} // namespace orva::test

#pragma once

#include "Appliance.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace orva::test {

/// A test of the running daemon. At the end its service is stopped, and a daemon that still runs
/// must exit without an error, which includes those that a sanitizer reports.
class SystemTest : public ::testing::Test {
protected:
  void TearDown() override {
    if (appliance.IsRunning()) {
      EXPECT_EQ(Exited(0), appliance.Shutdown());
    }
  }

  Appliance appliance;
};

using Log = std::vector<LogLine>;
using Lines = std::vector<std::string>;

/// A list that is followed by another one.
template <typename Item>
std::vector<Item> operator+(std::vector<Item> first, const std::vector<Item>& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

/// The texts of a log's error lines.
Lines ErrorTexts(const Log& log);

/// A line of the log with TIME in place of an elapsed time.
std::string MaskTimes(const std::string& text);

/// The text of a master in a log line; sizes in bytes.
std::string MasterText(const std::string& mountPoint, double capacity, double used = 0);

/// The same for a volume whose sizes are still those that the daemon saw when it was plugged.
std::string MasterText(const Volume& volume);

/// The text of the shares root as the master.
inline const std::string SHARES_MASTER_TEXT = "\nMountPoint: /shares\nCapacity: 1.04858e+11M\n"
                                              "Used: 100M\nPhotoDB size: 1\nReadOnly: 0\n";

/// The line of a Plugged notification for a volume that is there.
LogLine PluggedLine(const Volume& volume);

/// The lines that begin a handled batch with the accepted profile.
inline Log BatchLines() {
  return {Info(":: Transcodedbatch "), Info("Profile ==> cb62bbdd389b48898f2e5244977cb2c5 ==> \n")};
}

/// The lines of a merge that succeeds: `folders` with the root row, `files` as read.
Log MergeLines(const std::string& mountPoint, int folders, int files);

/// The locator file's content for the merged database on `mountPoint`.
std::string LocatorOn(const std::string& mountPoint);

const std::string SHARES_LOCATOR = "zophotos_db_path=/shares//.zophotos/zophotos.db\n";

} // namespace orva::test

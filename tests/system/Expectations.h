#pragma once

#include "Appliance.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace orva::test {

/// A test of the running daemon. When the test ends and the daemon still runs, its service is
/// stopped, and the daemon must end well: so every test also checks that nothing was broken on
/// the way (and the sanitizers have their say).
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

/// Several pieces of a log, one behind the other.
inline Log operator+(Log first, const Log& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

/// The text of a volume as the master in a log line. Taken while it stands at what the daemon
/// saw when the volume was plugged.
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

/// The lines of a merge that goes through: `folders` with the root row, `files` as read.
Log MergeLines(const std::string& mountPoint, int folders, int files);

const std::string SHARES_LOCATOR = "zophotos_db_path=/shares//.zophotos/zophotos.db\n";

} // namespace orva::test

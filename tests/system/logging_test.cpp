#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include <algorithm>
#include <regex>

namespace orva::test {
namespace {

using ::testing::ElementsAre;

const LogLine CREATING =
    Plain("src/zophotodbmerger/NotificationListener:130: Creating the notification socket "
          "/run/orva/notification.sock");
const LogLine READING =
    Plain("src/zophotodbmerger/NotificationListener:137: Calling ReadMessage()");

/// All lines of the system log and of standard output, from the plugging of a volume to its
/// unplugging and the end of the daemon.
TEST_F(SystemTest, TheCompleteLogOfAShortRun) {
  Volume a("A", "150g");
  Catalog(a).AddPhoto("a.jpg", 1000, 2000);
  const LogLine plugged = PluggedLine(a);
  const std::string text = MasterText(a);
  appliance.Start();
  for (const std::string& message : {Plugged(a.Path()), Scanned(a.Path()),
                                     TranscodedBatch(a.Path()), Purged(a.Path()), End(a.Path())}) {
    appliance.Service().Send(message);
  }
  appliance.Barrier();
  a.Unmount();
  appliance.Service().Send(Unplugged(a.Path()));
  appliance.Barrier();
  ASSERT_EQ(Exited(0), appliance.Shutdown());

  const std::string merge = ", doing merge for mountPoint /shares/A/ using master volume at "
                            "/shares/A/";
  const Log expected =
      Log{CREATING,
          READING,
          plugged,
          Info("Default:: VolumePlugged "),
          Info("We now have a master volume " + text),
          Info(":: Scanned"),
          Info("MasterVolumePluggedState:: VolumeScanned "),
          Info("Moving to the scanned state since we can safely do so "),
          Info("We now have a master volume " + text)} +
      BatchLines() + Log{Info("MasterVolumeScannedState:: handlePictureTranscoded" + merge)} +
      MergeLines("/shares/A/", 1, 1) +
      Log{Info(":: Purged "), Info("MasterVolumeScannedState:: handleVolumePurged" + merge)} +
      MergeLines("/shares/A/", 1, 1) +
      Log{Info(":: End "), Info("MasterVolumeScannedState:: handlePictureTranscoded" + merge)} +
      MergeLines("/shares/A/", 1, 0) +
      Log{Info("MasterVolumeScannedState:: Volumeunplugged "),
          Info("Moving to the scanned state since we can safely do so "),
          Info("We now have a master volume " + SHARES_MASTER_TEXT + " "),
          CREATING,
          Error("Unable to open socket (/run/orva/notification.sock)"),
          Info("src/zophotodbmerger/NotificationListener:154: NotificationListener exiting."),
          Info("Returning from the wait")};
  EXPECT_EQ(expected, appliance.TakeLog());

  const std::string file = "/shares/A/a.jpg";
  EXPECT_EQ(
      (Lines{"Setting the current to plugged stateADDRESS", "Deleting the default state ADDRESS",
             "Setting the current to scanned stateADDRESS",
             "Processing file " + file + " isdeleted=0 status = 3",
             "Adding file " + file + " for mount /shares/A/",
             "Processing file " + file + " isdeleted=0 status = 3",
             "Adding file " + file + " for mount /shares/A/", "Deleting the plugged state ADDRESS",
             "Setting the current to scanned stateADDRESS"}),
      appliance.TakeOutput());
}

TEST_F(SystemTest, AStateIsDeletedUnderTheAddressItWasSetWith) {
  appliance.Start();
  const Volume a("A", "150g");
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Scanned(a.Path()));
  appliance.Handle(Unplugged("/shares/None"));
  const Lines output = appliance.Daemon().StandardOutput();
  ASSERT_EQ(5U, output.size());
  const std::string set = "Setting the current to plugged state";
  const std::string deleted = "Deleting the plugged state ";
  ASSERT_TRUE(output[0].starts_with(set));
  ASSERT_TRUE(output[3].starts_with(deleted));
  EXPECT_EQ(output[0].substr(set.size()), output[3].substr(deleted.size()));
  EXPECT_TRUE(std::regex_match(output[0].substr(set.size()), std::regex("0x[0-9a-f]+")));
}

TEST_F(SystemTest, EachMergerNamesTheRegisteredVolumes) {
  appliance.Start();
  const Volume a("A", "150g");
  const Volume b("B", "120g");
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(Scanned(a.Path()));
  // The order of registration: A and the shares root before the election, B after it.
  const Log expected{Info("Iterating over mount point /shares/A/\n"),
                     Info("Iterating over mount point /shares\n"),
                     Info("Iterating over mount point /shares/B/\n")};
  const auto iterations = [](const Log& lines) {
    Log found;
    std::copy_if(lines.begin(), lines.end(), std::back_inserter(found), [](const LogLine& line) {
      return line.text.starts_with("Iterating over mount point ");
    });
    return found;
  };
  EXPECT_TRUE(appliance.Log().Await(
      [&](const Log& lines) { return iterations(lines).size() >= expected.size(); }));
  EXPECT_EQ(expected, iterations(appliance.Log().Lines()));
}

TEST_F(SystemTest, TheTimesOfAMergeAreInSecondsWithThreeDigits) {
  appliance.Start();
  const Volume a("A", "1g");
  Catalog catalog(a);
  appliance.Handle(Scanned(a.Path()));
  appliance.Handle(TranscodedBatch(a.Path()));
  const std::regex FORM("Merged 1 folders for /shares/A/ in \\d+\\.\\d{3} W   \\d+\\.\\d{3} U   "
                        "\\d+\\.\\d{3} S   \\d+\\.\\d%\n");
  const Log lines = appliance.Log().Lines();
  EXPECT_EQ(1, std::count_if(lines.begin(), lines.end(), [&](const LogLine& line) {
              return std::regex_match(line.text, FORM);
            }));
}

/// The daemon does not depend on its standard output.
TEST_F(SystemTest, AFullStandardOutputLosesOnlyItsLines) {
  appliance.StartWithOutput("/dev/full");
  const Volume a("A", "150g");
  Catalog(a).AddPhoto("a.jpg", 1000, 2000);
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Scanned(a.Path()));
  appliance.Handle(TranscodedBatch(a.Path()));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ElementsAre("/shares/A/a.jpg|1000|1000|/shares/A/"));
}

} // namespace
} // namespace orva::test

#include "Catalog.h"
#include "Expectations.h"
#include "Messages.h"

#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

namespace orva::test {
namespace {

using ::testing::ElementsAre;

const char* const LOCATOR = "/tmp/zophotodbmerger.conf";

/// Keeps the locator from being written between `begin` and `end`. Meanwhile other programs read
/// `shown`.
struct Obstacle {
  const char* name;
  void (*begin)();
  void (*end)();
  std::string shown;
};

void RemoveLocator() {
  std::filesystem::remove_all(LOCATOR);
}

/// Mounts another file system on the directory of the locator.
void CoverDirectory(unsigned long flags, const char* options) {
  EXPECT_EQ(0, mount("cover", "/tmp", "tmpfs", flags, options));
}
void UncoverDirectory() {
  EXPECT_EQ(0, umount2("/tmp", MNT_DETACH));
}

const std::vector<Obstacle> OBSTACLES{
    {"ADirectoryInItsPlace",
     [] {
       RemoveLocator();
       mkdir(LOCATOR, 0755);
     },
     RemoveLocator, "(absent)"},
    {"ALinkInItsPlace",
     [] {
       RemoveLocator();
       EXPECT_EQ(0, symlink("/tmp/elsewhere", LOCATOR));
     },
     RemoveLocator, "(absent)"},
    {"ASecondName", [] { EXPECT_EQ(0, link(LOCATOR, "/tmp/second")); },
     [] { EXPECT_EQ(0, unlink("/tmp/second")); }, SHARES_LOCATOR},
    {"AReadOnlyFile",
     [] {
       EXPECT_EQ(0, mount(LOCATOR, LOCATOR, nullptr, MS_BIND, nullptr));
       EXPECT_EQ(0, mount(nullptr, LOCATOR, nullptr, MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr));
     },
     [] { EXPECT_EQ(0, umount2(LOCATOR, MNT_DETACH)); }, SHARES_LOCATOR},
    {"AReadOnlyDirectory", [] { CoverDirectory(MS_RDONLY, ""); }, UncoverDirectory, "(absent)"},
    {"AFullDirectory", [] { CoverDirectory(0, "nr_inodes=1"); }, UncoverDirectory, "(absent)"},
    {"AFullDisk",
     [] {
       CoverDirectory(0, "size=4k");
       std::ofstream("/tmp/filler") << std::string(4096, 'x');
     },
     UncoverDirectory, ""},
};

/// Without this function gtest prints the bytes of the object.
void PrintTo(const Obstacle& obstacle, std::ostream* stream) {
  *stream << obstacle.name;
}

class LocatorOutage : public SystemTest, public ::testing::WithParamInterface<Obstacle> {};

TEST_P(LocatorOutage, IsNotLoggedAndAffectsNothingElse) {
  appliance.Start();
  const Volume a("A", "150g");
  const Volume b("B", "1g");
  Catalog(a).AddPhoto("a.jpg", 1000, 2000);
  const std::string master = MasterText(a);
  appliance.Handle(Plugged(a.Path()));
  GetParam().begin();
  EXPECT_EQ((Log{Info(":: Scanned"), Info("MasterVolumePluggedState:: VolumeScanned "),
                 Info("Moving to the scanned state since we can safely do so "),
                 Info("We now have a master volume " + master)}),
            appliance.Handle(Scanned(a.Path())));
  EXPECT_EQ(GetParam().shown, Appliance::Locator());
  EXPECT_EQ(BatchLines() +
                Log{Info("MasterVolumeScannedState:: handlePictureTranscoded, doing merge for "
                         "mountPoint /shares/A/ using master volume at /shares/A/")} +
                MergeLines("/shares/A/", 1, 1),
            appliance.Handle(TranscodedBatch(a.Path())));
  EXPECT_THAT(MergedDatabase(a.Path()).Files(),
              ElementsAre("/shares/A/a.jpg|1000|1000|/shares/A/"));

  GetParam().end();
  appliance.Handle(Unplugged(b.Path())); // renews the state
  EXPECT_EQ("zophotos_db_path=/shares/A//.zophotos/zophotos.db\n", Appliance::Locator());
}

INSTANTIATE_TEST_SUITE_P(By, LocatorOutage, ::testing::ValuesIn(OBSTACLES),
                         [](const auto& tested) { return tested.param.name; });

} // namespace
} // namespace orva::test

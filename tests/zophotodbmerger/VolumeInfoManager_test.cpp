#include "DaemonLayerTest.h"

#include "VolumeInfoManager.h"

#include <climits>

namespace orva::test {
namespace {

using dbmerger::VolumeInfo;
using dbmerger::VolumeInfoManager;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr double THRESHOLD = 209715200.0; // bytes
constexpr double GIB = 1073741824.0;

LogLine NotACandidate(const std::string& mountPoint) {
  return Error(mountPoint + "  ---------  is not a candidate \n");
}

/// A registry of existing directories.
class VolumeInfoManagerTest : public DaemonLayerTest {
protected:
  void Add(VolumeInfo volume) {
    MakeDirectory(volume.mountPoint);
    registry.addVolumeInfo(volume);
  }

  void Remove(const std::string& mountPoint) {
    VolumeInfo volume{.mountPoint = mountPoint};
    registry.removeVolumeInfo(volume);
  }

  Lines MountPoints() const {
    Lines mountPoints;
    for (const VolumeInfo& volume : registry.getVolumes()) {
      mountPoints.push_back(volume.mountPoint);
    }
    return mountPoints;
  }

  std::string Master() const { return registry.getMasterVolume().mountPoint; }

  VolumeInfoManager registry;
};

TEST_F(VolumeInfoManagerTest, InstanceIsCreatedOnceOnFirstUse) {
  EXPECT_EQ(nullptr, VolumeInfoManager::instance);
  VolumeInfoManager* const made = &VolumeInfoManager::Instance();
  EXPECT_EQ(made, VolumeInfoManager::instance);
  EXPECT_EQ(made, &VolumeInfoManager::Instance());
  EXPECT_THAT(made->getVolumes(), IsEmpty());
  EXPECT_EQ("DUMMY_MOUNT_POINT", made->getMasterVolume().mountPoint);
}

TEST_F(VolumeInfoManagerTest, TooManyVolumesAreRefused) {
  std::string mountPoint = "/shares/";
  for (int i = 0; i < 1000; ++i) {
    Add(Record(mountPoint, GIB, GIB));
    mountPoint += "/";
  }
  EXPECT_THAT(Logged(), IsEmpty());
  Add(Record(mountPoint, GIB, GIB));
  EXPECT_EQ(1000U, registry.getVolumes().size());
  EXPECT_THAT(Logged(), ElementsAre(Error("There are too many volumes to register the mountpoint " +
                                          mountPoint)));
  // A registered volume does not count again, and a removed one makes room.
  Add(Record("/shares/", GIB, GIB));
  EXPECT_THAT(Logged(), IsEmpty());
  Remove("/shares/");
  Add(Record(mountPoint, GIB, GIB));
  EXPECT_EQ(mountPoint, MountPoints().back());
}

TEST_F(VolumeInfoManagerTest, TooLongMountPointsAreRefused) {
  const auto mountPoint = [](std::size_t size) { return "/shares" + std::string(size - 7, '/'); };
  std::size_t left = 1U << 20U;
  for (std::size_t size = PATH_MAX - 1; size <= left; --size) {
    Add(Record(mountPoint(size), GIB, GIB));
    left -= size;
  }
  EXPECT_THAT(Logged(), IsEmpty());
  Add(Record(mountPoint(left + 1), GIB, GIB));
  EXPECT_THAT(Logged(), ElementsAre(Error("There are too many volumes to register the mountpoint " +
                                          mountPoint(left + 1))));
  Add(Record(mountPoint(left), GIB, GIB));
  EXPECT_THAT(Logged(), IsEmpty());
  EXPECT_EQ(mountPoint(left), MountPoints().back());
}

TEST_F(VolumeInfoManagerTest, VolumesAreKeptInTheOrderOfTheirAdding) {
  Add(Record("/shares/b/", GIB, GIB));
  Add(Record("/shares/c/", 3 * GIB, GIB));
  Add(Record("/shares/a/", 2 * GIB, GIB));
  EXPECT_THAT(MountPoints(), ElementsAre("/shares/b/", "/shares/c/", "/shares/a/"));
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(VolumeInfoManagerTest, VolumeWithoutADirectoryIsRefused) {
  VolumeInfo volume = Record("/shares/gone/", GIB, GIB);
  registry.addVolumeInfo(volume);
  EXPECT_THAT(registry.getVolumes(), IsEmpty());
  EXPECT_THAT(Logged(), ElementsAre(Error(
                            "There is no filesystem location for the mountpoint /shares/gone/")));
}

TEST_F(VolumeInfoManagerTest, SecondAddOfAMountPointKeepsTheFirstValues) {
  Add(Record("/shares/a/", 1.0, 0.0));
  Add(Record("/shares/a/", GIB, GIB));
  ASSERT_EQ(1U, registry.getVolumes().size());
  EXPECT_EQ(1.0, registry.getVolumes().front().capacity);
  EXPECT_EQ(1.0, registry.getVolumes().front().used);
}

TEST_F(VolumeInfoManagerTest, DoubledSeparatorIsAnotherVolume) {
  Add(Record("/shares/a/", GIB, GIB));
  Add(Record("/shares/a//", GIB, GIB));
  EXPECT_THAT(MountPoints(), ElementsAre("/shares/a/", "/shares/a//"));
}

TEST_F(VolumeInfoManagerTest, RemovalKeepsTheOrderOfTheOthers) {
  Add(Record("/shares/a/", GIB, GIB));
  Add(Record("/shares/b/", GIB, GIB));
  Add(Record("/shares/c/", GIB, GIB));
  Remove("/shares/b/");
  EXPECT_THAT(MountPoints(), ElementsAre("/shares/a/", "/shares/c/"));
}

TEST_F(VolumeInfoManagerTest, RemovalOfAnUnknownVolumeChangesNothing) {
  Add(Record("/shares/a/", GIB, GIB));
  ASSERT_TRUE(registry.reelectMasterVolume());
  Remove("/shares/b/");
  EXPECT_THAT(MountPoints(), ElementsAre("/shares/a/"));
  EXPECT_EQ("/shares/a/", Master());
}

TEST_F(VolumeInfoManagerTest, ElectionWithoutVolumesIsSilent) {
  EXPECT_FALSE(registry.reelectMasterVolume());
  EXPECT_EQ("DUMMY_MOUNT_POINT", Master());
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(VolumeInfoManagerTest, ElectionPrefersTheLargestCapacity) {
  Add(Record("/shares/small/", 2 * GIB, 2 * GIB));
  Add(Record("/shares/large/", 4 * GIB, GIB));
  Add(Record("/shares/middle/", 3 * GIB, 3 * GIB));
  EXPECT_TRUE(registry.reelectMasterVolume());
  EXPECT_EQ("/shares/large/", Master());
  EXPECT_EQ(4 * GIB, registry.getMasterVolume().capacity);
  EXPECT_EQ(3 * GIB, registry.getMasterVolume().used);
  EXPECT_THAT(Logged(), IsEmpty());
}

TEST_F(VolumeInfoManagerTest, ElectionLeavesTheRegistrySortedByCapacity) {
  Add(Record("/shares/small/", 2 * GIB, 2 * GIB));
  Add(Record("/shares/large/", 4 * GIB, GIB));
  Add(Record("/shares/middle/", 3 * GIB, 3 * GIB));
  ASSERT_TRUE(registry.reelectMasterVolume());
  EXPECT_THAT(MountPoints(), ElementsAre("/shares/large/", "/shares/middle/", "/shares/small/"));
}

TEST_F(VolumeInfoManagerTest, FreeSpaceOfExactlyTheThresholdIsTooLittle) {
  Add(Record("/shares/a/", GIB, THRESHOLD));
  EXPECT_FALSE(registry.reelectMasterVolume());
  EXPECT_EQ("DUMMY_MOUNT_POINT", Master());
  EXPECT_THAT(Logged(), ElementsAre(NotACandidate("/shares/a/")));
}

TEST_F(VolumeInfoManagerTest, OneByteMoreThanTheThresholdIsEnough) {
  Add(Record("/shares/a/", GIB, THRESHOLD + 1));
  EXPECT_TRUE(registry.reelectMasterVolume());
  EXPECT_EQ("/shares/a/", Master());
}

TEST_F(VolumeInfoManagerTest, ReadOnlyVolumeIsNeverElected) {
  Add(Record("/shares/locked/", 100 * GIB, 100 * GIB, true));
  EXPECT_FALSE(registry.reelectMasterVolume());
  EXPECT_THAT(Logged(), ElementsAre(NotACandidate("/shares/locked/")));
}

/// The locator file would have two lines.
TEST_F(VolumeInfoManagerTest, VolumeWithALineFeedInItsMountPointIsNeverElected) {
  Add(Record("/shares/a\nb/", 100 * GIB, 100 * GIB));
  EXPECT_FALSE(registry.reelectMasterVolume());
  Add(Record("/shares/a/", GIB, GIB));
  EXPECT_TRUE(registry.reelectMasterVolume());
  EXPECT_EQ("/shares/a/", Master());
  EXPECT_THAT(Logged(),
              ElementsAre(NotACandidate("/shares/a\nb/"), NotACandidate("/shares/a\nb/")));
}

TEST_F(VolumeInfoManagerTest, UnmeasuredVolumeIsNeverElected) {
  Add(VolumeInfo{.mountPoint = "/shares/a/"});
  EXPECT_FALSE(registry.reelectMasterVolume());
  EXPECT_THAT(Logged(), ElementsAre(NotACandidate("/shares/a/")));
}

TEST_F(VolumeInfoManagerTest, EachLargerVolumeThatIsNotElectedIsLogged) {
  Add(Record("/shares/chosen/", 2 * GIB, GIB));
  Add(Record("/shares/full/", 3 * GIB, 0));
  Add(Record("/shares/smaller/", GIB, 0));
  Add(Record("/shares/locked/", 4 * GIB, GIB, true));
  EXPECT_TRUE(registry.reelectMasterVolume());
  EXPECT_EQ("/shares/chosen/", Master());
  EXPECT_THAT(Logged(),
              ElementsAre(NotACandidate("/shares/locked/"), NotACandidate("/shares/full/")));
}

TEST_F(VolumeInfoManagerTest, MasterStaysWhenALargerVolumeAppears) {
  Add(Record("/shares/first/", 2 * GIB, GIB));
  ASSERT_TRUE(registry.reelectMasterVolume());
  Add(Record("/shares/larger/", 4 * GIB, 4 * GIB));
  EXPECT_TRUE(registry.reelectMasterVolume());
  EXPECT_EQ("/shares/first/", Master());
  EXPECT_THAT(MountPoints(), ElementsAre("/shares/first/", "/shares/larger/"));
}

TEST_F(VolumeInfoManagerTest, RemovedMasterIsReplacedInTheNextElection) {
  Add(Record("/shares/large/", 4 * GIB, GIB));
  Add(Record("/shares/small/", 2 * GIB, GIB));
  ASSERT_TRUE(registry.reelectMasterVolume());
  Remove("/shares/large/");
  EXPECT_EQ("DUMMY_MOUNT_POINT", Master());
  EXPECT_EQ(1.0, registry.getMasterVolume().capacity);
  EXPECT_EQ(0, registry.getMasterVolume().photoDbSize);
  EXPECT_TRUE(registry.reelectMasterVolume());
  EXPECT_EQ("/shares/small/", Master());
}

TEST_F(VolumeInfoManagerTest, RemovalOfTheOnlyVolumeLeavesNoneToElect) {
  Add(Record("/shares/a/", GIB, GIB));
  ASSERT_TRUE(registry.reelectMasterVolume());
  Remove("/shares/a/");
  EXPECT_FALSE(registry.reelectMasterVolume());
  EXPECT_THAT(registry.getVolumes(), IsEmpty());
}

} // namespace
} // namespace orva::test

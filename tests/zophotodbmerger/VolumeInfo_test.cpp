#include "VolumeInfo.h"

#include <gtest/gtest.h>

#include <ctime>

namespace orva::test {
namespace {

using dbmerger::VolumeInfo;
using dbmerger::VolumeInfoComp;

TEST(VolumeInfo, DefaultRecordAsText) {
  EXPECT_EQ("\nMountPoint: DUMMY_MOUNT_POINT\nCapacity: 1M\nUsed: 1M\nPhotoDB size: 0\n"
            "ReadOnly: 0\n",
            VolumeInfo().ToString());
}

TEST(VolumeInfo, LargeByteCountsAreTextInExponentForm) {
  const VolumeInfo volume{.mountPoint = "/shares/Vol/",
                          .capacity = 104857600000.0,
                          .used = 1234567.0,
                          .photoDbSize = 5000000000,
                          .timestamp = 7,
                          .readOnly = true};
  EXPECT_EQ("\nMountPoint: /shares/Vol/\nCapacity: 1.04858e+11M\nUsed: 1.23457e+06M\n"
            "PhotoDB size: 5000000000\nReadOnly: 1\n",
            volume.ToString());
}

TEST(VolumeInfo, ByteCountsOfSixDigitsAreNotInExponentForm) {
  const VolumeInfo volume{.mountPoint = "", .capacity = 999999.0, .used = 0.5};
  EXPECT_EQ("\nMountPoint: \nCapacity: 999999M\nUsed: 0.5M\nPhotoDB size: 0\nReadOnly: 0\n",
            volume.ToString());
}

TEST(VolumeInfo, HasTheTimeOfItsCreation) {
  const std::time_t before = std::time(nullptr);
  const VolumeInfo volume;
  EXPECT_GE(volume.timestamp, before);
  EXPECT_LE(volume.timestamp, std::time(nullptr));
}

TEST(VolumeInfo, EqualityIsTheMountPointAlone) {
  const VolumeInfo one{.mountPoint = "/shares/Vol/"};
  const VolumeInfo other{.mountPoint = "/shares/Vol/",
                         .capacity = 2.0,
                         .used = 3.0,
                         .photoDbSize = 4,
                         .timestamp = 5,
                         .readOnly = true};
  EXPECT_TRUE(one == other);
}

TEST(VolumeInfo, MountPointsAreComparedByteForByte) {
  const VolumeInfo volume{.mountPoint = "/shares/Vol/"};
  EXPECT_FALSE(volume == VolumeInfo{.mountPoint = "/shares/Vol//"});
  EXPECT_FALSE(volume == VolumeInfo{.mountPoint = "/shares/Vol"});
  EXPECT_FALSE(volume == VolumeInfo{.mountPoint = "/shares/vol/"});
}

TEST(VolumeInfo, LargerCapacityComesFirstInAnElection) {
  const VolumeInfo small{.capacity = 1.0, .used = 0.0};
  const VolumeInfo large{.capacity = 2.0, .used = 9.0};
  const VolumeInfoComp<VolumeInfo> before;
  EXPECT_TRUE(before(large, small));
  EXPECT_FALSE(before(small, large));
  EXPECT_FALSE(before(small, small));
}

} // namespace
} // namespace orva::test

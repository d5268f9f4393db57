#include "Constants.h"

#include <gtest/gtest.h>

namespace orva::test {
namespace {

using namespace orva::dbmerger;

TEST(Constants, NameTheLocatorFileAndItsKey) {
  EXPECT_EQ("/tmp/zophotodbmerger.conf", ZOPHOTODBMERGER_CONFIG_FILE_NAME);
  EXPECT_EQ("zophotos_db_path", ZOPHOTOS_DB_PATH);
}

TEST(Constants, NameTheMergedDatabaseFile) {
  EXPECT_STREQ("zophotos.db", PHOTO_DB_NAME);
}

TEST(Constants, HaveBothSeparators) {
  EXPECT_EQ("/", NATIVE_PATH_SEPARATOR);
  EXPECT_EQ("\\", OTHER_PATH_SEPARATOR);
}

TEST(Constants, EmptyVolumeIsADefaultRecord) {
  EXPECT_EQ("DUMMY_MOUNT_POINT", EmptyVolumeInfo.mountPoint);
  EXPECT_EQ(1.0, EmptyVolumeInfo.capacity);
  EXPECT_EQ(1.0, EmptyVolumeInfo.used);
  EXPECT_EQ(0, EmptyVolumeInfo.photoDbSize);
  EXPECT_FALSE(EmptyVolumeInfo.readOnly);
  EXPECT_GT(EmptyVolumeInfo.timestamp, 0);
  EXPECT_LE(EmptyVolumeInfo.timestamp, std::time(nullptr));
}

} // namespace
} // namespace orva::test

#include "orvautil/Core.h"
#include "orvautil/Socket.h"

#include <gtest/gtest.h>

#include <filesystem>

namespace orva::core {
namespace {

TEST(Core, NotificationSocketIsAValidAddress) {
  EXPECT_EQ(ORVA_NOTIFICATION_SOCKET, "/run/orva/notification.sock");
  EXPECT_NO_THROW(util::Socket::Address{ORVA_NOTIFICATION_SOCKET});
}

TEST(Core, HomeIsAFolderDirectlyBelowTheMountPoint) {
  EXPECT_EQ(GetORVA_HOME("/shares/Vol"), "/shares/Vol/.orva");
  EXPECT_EQ(GetORVA_HOME("/shares/Vol/"), "/shares/Vol/.orva");
}

TEST(Core, CatalogIsAFileInTheHome) {
  EXPECT_EQ(GetCatalogPath("/shares/Vol"), "/shares/Vol/.orva/orva.db");
  EXPECT_EQ(GetCatalogPath("/shares/Vol/"), "/shares/Vol/.orva/orva.db");
}

TEST(Core, PathsAreNotCreated) {
  std::filesystem::create_directory("/tmp/volume");
  GetORVA_HOME("/tmp/volume");
  GetCatalogPath("/tmp/volume");
  EXPECT_TRUE(std::filesystem::is_empty("/tmp/volume"));
}

} // namespace
} // namespace orva::core

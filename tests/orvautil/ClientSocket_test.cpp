#include "Listener.h"

#include "orvautil/ClientSocket.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>

namespace orva::util {
namespace {

using test::Listener;
using test::PairEnd;

TEST(ClientSocket, ConnectsToAPath) {
  const Listener service = test::ListenAtPath("/run/orva/test.sock");
  ClientSocket client(Socket::Address("/run/orva/test.sock"), false);
  ASSERT_TRUE(client.IsOpen());
  PairEnd peer(service.Accept());
  ASSERT_EQ(peer.Write("hello", 5), 5U);
  char data[6] = {};
  EXPECT_EQ(client.Read(data, 5), 5U);
  EXPECT_STREQ(data, "hello");
  std::filesystem::remove("/run/orva/test.sock");
}

TEST(ClientSocket, ConnectsToAnAbstractName) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::string("\0orva-test", 10).copy(address.sun_path, 10);
  const Listener service(address, offsetof(sockaddr_un, sun_path) + 10);
  const ClientSocket client(Socket::Address("@orva-test"), false);
  EXPECT_TRUE(client.IsOpen());
}

TEST(ClientSocket, IsNotInheritedByPrograms) {
  const Listener service = test::ListenAtPath("/run/orva/inherit.sock");
  const ClientSocket client(Socket::Address("/run/orva/inherit.sock"), false);
  EXPECT_EQ(fcntl(client.Descriptor(), F_GETFD) & FD_CLOEXEC, FD_CLOEXEC);
  std::filesystem::remove("/run/orva/inherit.sock");
}

TEST(ClientSocket, ReadWaitsUnlessTheSocketIsNonBlocking) {
  const Listener service = test::ListenAtPath("/run/orva/block.sock");
  const Socket::Address address("/run/orva/block.sock");
  EXPECT_EQ(fcntl(ClientSocket(address, false).Descriptor(), F_GETFL) & O_NONBLOCK, 0);
  ClientSocket impatient(address, true);
  EXPECT_EQ(fcntl(impatient.Descriptor(), F_GETFL) & O_NONBLOCK, O_NONBLOCK);
  char byte = 0;
  EXPECT_EQ(impatient.Read(&byte, 1), 0U);
  std::filesystem::remove("/run/orva/block.sock");
}

TEST(ClientSocket, IsNotOpenWithoutAService) {
  errno = 0;
  ClientSocket client(Socket::Address("/run/orva/absent.sock"), false);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(client.IsOpen());
  EXPECT_EQ(client.Descriptor(), -1);
  char byte = 0;
  EXPECT_EQ(client.Read(&byte, 1), 0U);
}

TEST(ClientSocket, IsNotOpenAfterTheServiceHasGone) {
  { const Listener service = test::ListenAtPath("/run/orva/left.sock"); }
  errno = 0;
  const ClientSocket client(Socket::Address("/run/orva/left.sock"), false);
  EXPECT_EQ(errno, ECONNREFUSED);
  EXPECT_FALSE(client.IsOpen());
  std::filesystem::remove("/run/orva/left.sock");
}

TEST(ClientSocket, IsNotOpenAtAnythingButAService) {
  std::ofstream("/tmp/no-socket") << "x";
  EXPECT_FALSE(ClientSocket(Socket::Address("/tmp/no-socket"), false).IsOpen());
  EXPECT_FALSE(ClientSocket(Socket::Address("@nobody"), false).IsOpen());
}

TEST(ClientSocket, AFailedConnectionClosesItsDescriptor) {
  const int before = dup(0);
  close(before);
  { const ClientSocket client(Socket::Address("/run/orva/absent.sock"), false); }
  const ClientSocket kept(Socket::Address("/run/orva/absent.sock"), false);
  const int after = dup(0);
  close(after);
  EXPECT_EQ(after, before);
}

} // namespace
} // namespace orva::util

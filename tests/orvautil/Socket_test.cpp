#include "SocketPair.h"

#include "orvautil/Exception.h"
#include "orvautil/Socket.h"

#include "support/ThreadState.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fcntl.h>
#include <pthread.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstring>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

namespace orva::util {
namespace {

using test::PairEnd;
using test::SocketPair;

static_assert(std::is_base_of_v<Stream, Socket>);
static_assert(!std::is_copy_constructible_v<Socket>);

/// An address as the system calls get it.
struct Bytes {
  explicit Bytes(const std::string& text) : address(text) {
    std::memcpy(&system, address.Get(), address.Length());
  }
  std::string Path() const {
    return {system.sun_path, address.Length() - offsetof(sockaddr_un, sun_path)};
  }

  Socket::Address address;
  sockaddr_un system{};
};

TEST(SocketAddress, AnAbsolutePathIncludesItsTerminator) {
  const Bytes bytes("/run/orva/notification.sock");
  EXPECT_EQ(bytes.system.sun_family, AF_UNIX);
  EXPECT_EQ(bytes.Path(), std::string("/run/orva/notification.sock", 28));
}

TEST(SocketAddress, AnAtSignMakesAnAbstractName) {
  const Bytes bytes("@orva");
  EXPECT_EQ(bytes.system.sun_family, AF_UNIX);
  EXPECT_EQ(bytes.Path(), std::string("\0orva", 5));
}

TEST(SocketAddress, TheLongestTextsThatTheSystemAllowsAreTaken) {
  EXPECT_EQ(Bytes('/' + std::string(106, 'p')).Path(),
            '/' + std::string(106, 'p') + std::string(1, '\0'));
  EXPECT_EQ(Bytes('@' + std::string(107, 'n')).Path(),
            std::string(1, '\0') + std::string(107, 'n'));
}

TEST(SocketAddress, LongerTextsAreExceptions) {
  EXPECT_THROW(Socket::Address('/' + std::string(107, 'p')), Exception);
  EXPECT_THROW(Socket::Address('@' + std::string(108, 'n')), Exception);
  EXPECT_THROW(Socket::Address('/' + std::string(100'000, 'p')), Exception);
}

TEST(SocketAddress, TextsThatAreNotAddressesAreExceptions) {
  for (const std::string text : {"", "/", "@", "relative/path", "notification.sock", " /run/x"}) {
    EXPECT_THROW(Socket::Address{text}, Exception) << text;
  }
}

TEST(Socket, IsOpenExactlyWhileItHasADescriptor) {
  SocketPair pair;
  EXPECT_TRUE(pair.near.IsOpen());
  pair.near.Close();
  EXPECT_FALSE(pair.near.IsOpen());
  EXPECT_EQ(pair.near.Descriptor(), -1);
  EXPECT_FALSE(PairEnd(-1).IsOpen());
}

TEST(Socket, CloseMayBeRepeated) {
  SocketPair pair;
  const int descriptor = pair.near.Descriptor();
  pair.near.Close();
  // Another owner of the same number keeps it.
  const int other = dup2(pair.far.Descriptor(), descriptor);
  pair.near.Close();
  EXPECT_NE(fcntl(other, F_GETFD), -1);
  close(other);
}

TEST(Socket, TheDestructorClosesTheDescriptor) {
  int descriptor = -1;
  {
    const SocketPair pair;
    descriptor = pair.near.Descriptor();
    ASSERT_NE(fcntl(descriptor, F_GETFD), -1);
  }
  EXPECT_EQ(fcntl(descriptor, F_GETFD), -1);
}

TEST(Socket, ReadReturnsAvailableBytesUpToItsSize) {
  SocketPair pair;
  ASSERT_EQ(pair.far.Write("abcdef", 6), 6U);
  char data[16] = {};
  EXPECT_EQ(pair.near.Read(data, 4), 4U);
  EXPECT_STREQ(data, "abcd");
  EXPECT_EQ(pair.near.Read(data, sizeof data), 2U);
}

TEST(Socket, ReadAtTheEndOfTheStreamIsZero) {
  SocketPair pair;
  pair.far.Close();
  char byte = 0;
  EXPECT_EQ(pair.near.Read(&byte, 1), 0U);
}

TEST(Socket, ReadAfterAResetByThePeerIsZero) {
  SocketPair pair;
  ASSERT_EQ(pair.near.Write("unread", 6), 6U);
  pair.far.Close(); // with bytes unread, which the system calls a reset
  char byte = 0;
  EXPECT_EQ(pair.near.Read(&byte, 1), 0U);
}

TEST(Socket, ReadFromAClosedSocketIsZero) {
  PairEnd closed(-1);
  char byte = 0;
  EXPECT_EQ(closed.Read(&byte, 1), 0U);
}

TEST(Socket, WriteWritesEverythingToASlowReader) {
  SocketPair pair;
  const std::string sent(4 << 20, 'x'); // more than the system holds
  unsigned written = 0;
  std::jthread writer([&] {
    written = pair.far.Write(sent.data(), static_cast<unsigned>(sent.size()));
    pair.far.Close();
  });
  std::vector<char> chunk(1000);
  std::size_t received = 0;
  while (const unsigned count = pair.near.Read(chunk.data(), static_cast<unsigned>(chunk.size()))) {
    received += count;
  }
  writer.join();
  EXPECT_EQ(written, sent.size());
  EXPECT_EQ(received, sent.size());
}

TEST(Socket, WriteToAClosedPeerIsShortAndRaisesNoSignal) {
  ASSERT_EQ(std::signal(SIGPIPE, SIG_DFL), SIG_DFL) << "the default action ends the process";
  SocketPair pair;
  pair.far.Close();
  EXPECT_EQ(pair.near.Write("abc", 3), 0U);
}

TEST(Socket, WriteToAClosedSocketIsShort) {
  PairEnd closed(-1);
  EXPECT_EQ(closed.Write("abc", 3), 0U);
}

TEST(Socket, DataIsAvailableWhenBytesAreThere) {
  SocketPair pair;
  unsigned long long count = 77;
  EXPECT_FALSE(pair.near.IsDataAvailable(&count));
  ASSERT_EQ(pair.far.Write("abc", 3), 3U);
  EXPECT_TRUE(pair.near.IsDataAvailable(&count));
  EXPECT_EQ(count, 3U);
  EXPECT_TRUE(pair.near.IsDataAvailable(nullptr));
}

TEST(Socket, AtTheEndOfTheStreamZeroBytesAreAvailable) {
  SocketPair pair;
  pair.far.Close();
  unsigned long long count = 77;
  EXPECT_TRUE(pair.near.IsDataAvailable(&count));
  EXPECT_EQ(count, 0U);
}

TEST(Socket, AClosedSocketHasNoDataAvailable) {
  PairEnd closed(-1);
  unsigned long long count = 0;
  EXPECT_FALSE(closed.IsDataAvailable(&count));
}

/// Signals that have interrupted the waiting thread.
std::atomic<int> interruptions = 0;

/// Interrupts system calls of the thread that it is sent to, which are not restarted.
void InstallInterruption() {
  struct sigaction action {};
  action.sa_handler = [](int) { ++interruptions; };
  sigaction(SIGUSR1, &action, nullptr);
}

TEST(Socket, AnInterruptedReadContinues) {
  InstallInterruption();
  interruptions = 0;
  SocketPair pair;
  std::atomic<pid_t> id = 0;
  unsigned count = 0;
  char byte = 0;
  std::jthread reader([&] {
    id = gettid();
    id.notify_one();
    count = pair.near.Read(&byte, 1);
  });
  id.wait(0);
  EXPECT_TRUE(test::AwaitSleeping(id));
  pthread_kill(reader.native_handle(), SIGUSR1);
  while (interruptions == 0) {
    std::this_thread::yield();
  }
  EXPECT_EQ(pair.far.Write("x", 1), 1U);
  reader.join();
  EXPECT_EQ(count, 1U);
  EXPECT_EQ(byte, 'x');
}

TEST(Socket, AnInterruptedWriteContinues) {
  InstallInterruption();
  interruptions = 0;
  SocketPair pair;
  std::vector<char> block(1 << 20);
  while (send(pair.far.Descriptor(), block.data(), block.size(), MSG_DONTWAIT) > 0) {
    // Until nothing more fits: the write has to wait with its first byte.
  }
  std::atomic<pid_t> id = 0;
  unsigned written = 0;
  std::jthread writer([&] {
    id = gettid();
    id.notify_one();
    written = pair.far.Write("abc", 3);
    pair.far.Close();
  });
  id.wait(0);
  EXPECT_TRUE(test::AwaitSleeping(id));
  pthread_kill(writer.native_handle(), SIGUSR1);
  while (interruptions == 0) {
    std::this_thread::yield();
  }
  while (pair.near.Read(block.data(), static_cast<unsigned>(block.size())) != 0) {
  }
  writer.join();
  EXPECT_EQ(written, 3U);
}

} // namespace
} // namespace orva::util

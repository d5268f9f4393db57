#include "DaemonLayerTest.h"

#include "Util.h"

#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <csignal>
#include <fstream>
#include <thread>
#include <utility>

namespace orva::test {
namespace {

using dbmerger::updateLocatorFile;
using dbmerger::writeLine;
using ::testing::IsEmpty;
using util::FileDescriptor;

const std::string LOCATOR_PATH = "/tmp/zophotodbmerger.conf";

class LocatorTest : public DaemonLayerTest {
protected:
  void TearDown() override { EXPECT_THAT(Logged(), IsEmpty()) << "the locator is never logged"; }
};

std::string Content(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

TEST_F(LocatorTest, NamesTheDatabaseOfTheMountPoint) {
  updateLocatorFile("/shares/Vol");
  EXPECT_EQ("zophotos_db_path=/shares/Vol/.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, UsesTheMountPointUnchanged) {
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, EmptyMountPointLeavesOnlyTheKey) {
  updateLocatorFile("");
  EXPECT_EQ("zophotos_db_path=\n", Appliance::Locator());
}

TEST_F(LocatorTest, ShorterLineReplacesALongerOne) {
  updateLocatorFile("/shares/A rather long name of a volume/");
  updateLocatorFile("/shares/V/");
  EXPECT_EQ("zophotos_db_path=/shares/V//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, FileOfAnotherUserIsWritten) {
  std::ofstream(LOCATOR_PATH) << "theirs";
  ASSERT_EQ(0, chown(LOCATOR_PATH.c_str(), 1, 1));
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, LinkInItsPlaceIsNotFollowed) {
  std::ofstream("/tmp/precious") << "keep";
  std::filesystem::create_symlink("/tmp/precious", LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("keep", Content("/tmp/precious"));
  EXPECT_TRUE(std::filesystem::is_symlink(LOCATOR_PATH));
}

TEST_F(LocatorTest, DanglingLinkInItsPlaceCreatesNothing) {
  std::filesystem::create_symlink("/tmp/nowhere", LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_FALSE(std::filesystem::exists("/tmp/nowhere"));
}

TEST_F(LocatorTest, DirectoryInItsPlaceIsIgnored) {
  MakeDirectory(LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_TRUE(std::filesystem::is_empty(LOCATOR_PATH));
}

TEST_F(LocatorTest, PipeWithoutAReaderIsNotWaitedFor) {
  ASSERT_EQ(0, mkfifo(LOCATOR_PATH.c_str(), 0666));
  updateLocatorFile("/shares/Vol/");
  EXPECT_TRUE(std::filesystem::is_fifo(LOCATOR_PATH));
}

TEST_F(LocatorTest, PipeWithAReaderGetsNothing) {
  ASSERT_EQ(0, mkfifo(LOCATOR_PATH.c_str(), 0666));
  const FileDescriptor reader(open(LOCATOR_PATH.c_str(), O_RDONLY | O_NONBLOCK));
  ASSERT_TRUE(reader);
  updateLocatorFile("/shares/Vol/");
  std::array<char, 64> bytes{};
  EXPECT_EQ(0, read(reader.Get(), bytes.data(), bytes.size())) << "nothing was written";
}

/// Standard output as something else for a scope.
class Redirected {
public:
  /// Standard output is closed where there is no `descriptor`.
  explicit Redirected(FileDescriptor descriptor) {
    if (descriptor) {
      dup2(descriptor.Get(), STDOUT_FILENO);
    } else {
      close(STDOUT_FILENO);
    }
  }
  Redirected(const Redirected&) = delete;
  Redirected& operator=(const Redirected&) = delete;
  ~Redirected() { dup2(original_.Get(), STDOUT_FILENO); }

private:
  FileDescriptor original_{dup(STDOUT_FILENO)};
};

struct Pipe {
  Pipe() {
    std::array<int, 2> ends{};
    if (pipe(ends.data()) != 0) {
      throw std::system_error(errno, std::generic_category(), "pipe");
    }
    reader.Reset(ends[0]);
    writer.Reset(ends[1]);
  }

  FileDescriptor reader;
  FileDescriptor writer;
};

/// Everything that can be read until the end.
std::string ReadAll(const FileDescriptor& reader) {
  std::string text;
  std::array<char, 65536> bytes{};
  for (ssize_t count = 0; (count = read(reader.Get(), bytes.data(), bytes.size())) > 0;) {
    text.append(bytes.data(), static_cast<std::size_t>(count));
  }
  return text;
}

/// Everything that can be read without waiting.
std::string Drain(const FileDescriptor& reader) {
  fcntl(reader.Get(), F_SETFL, O_NONBLOCK);
  return ReadAll(reader);
}

TEST(WriteLine, JoinsThePiecesIntoOneLine) {
  EXPECT_EQ("a bc\n\n", OutputOf([] {
              writeLine({"a ", "", "bc"});
              writeLine({});
            }));
}

TEST(WriteLine, ReachesTheReaderOfAPipe) {
  Pipe output;
  {
    const Redirected redirected(std::move(output.writer));
    writeLine({"one"});
    writeLine({"two"});
  }
  EXPECT_EQ("one\ntwo\n", Drain(output.reader));
}

TEST(WriteLine, LineLongerThanAPipeArrivesCompletely) {
  Pipe output;
  const std::string text(1 << 20, 'x');
  std::string received;
  std::thread reader([&] { received = ReadAll(output.reader); });
  {
    const Redirected redirected(std::move(output.writer));
    writeLine({text});
  }
  reader.join();
  EXPECT_EQ(text.size() + 1, received.size());
  EXPECT_EQ(text + "\n", received);
}

TEST(WriteLine, PipeWithoutAReaderLosesOnlyTheLine) {
  std::signal(SIGPIPE, SIG_IGN); // as the daemon does when it starts
  Pipe output;
  output.reader.Reset();
  {
    const Redirected redirected(std::move(output.writer));
    writeLine({"lost"});
  }
  EXPECT_EQ("kept\n", OutputOf([] { writeLine({"kept"}); }));
}

TEST(WriteLine, ClosedOutputLosesOnlyTheLine) {
  {
    const Redirected redirected{FileDescriptor()};
    writeLine({"lost"});
  }
  EXPECT_EQ("kept\n", OutputOf([] { writeLine({"kept"}); }));
}

TEST(WriteLine, FullPipeLosesLinesUntilItIsRead) {
  Pipe output;
  std::size_t filling = 0;
  fcntl(output.writer.Get(), F_SETFL, O_NONBLOCK);
  const std::string filler(PIPE_BUF, '.');
  for (ssize_t count = 0; (count = write(output.writer.Get(), filler.data(), filler.size())) > 0;) {
    filling += static_cast<std::size_t>(count);
  }
  fcntl(output.writer.Get(), F_SETFL, 0);

  std::string lost;
  std::string read;
  {
    const Redirected redirected(std::move(output.writer));
    for (int i = 0; i < 100; ++i) {
      writeLine({"lost"});
    }
    lost = Drain(output.reader);
    writeLine({"after"});
    read = Drain(output.reader);
  }
  EXPECT_EQ(std::string(filling, '.'), lost);
  EXPECT_EQ("after\n", read);
}

} // namespace
} // namespace orva::test

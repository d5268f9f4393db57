#include "DaemonLayerTest.h"

#include "Util.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <csignal>
#include <fstream>
#include <thread>

namespace orva::test {
namespace {

using dbmerger::updateLocatorFile;
using dbmerger::writeLine;
using ::testing::IsEmpty;

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

TEST_F(LocatorTest, TakesTheMountPointAsItStands) {
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("zophotos_db_path=/shares/Vol//.zophotos/zophotos.db\n", Appliance::Locator());
}

TEST_F(LocatorTest, EmptyMountPointLeavesTheKeyAlone) {
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

TEST_F(LocatorTest, LinkInItsPlaceIsLeftAlone) {
  std::ofstream("/tmp/precious") << "keep";
  std::filesystem::create_symlink("/tmp/precious", LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_EQ("keep", Content("/tmp/precious"));
  EXPECT_TRUE(std::filesystem::is_symlink(LOCATOR_PATH));
}

TEST_F(LocatorTest, LinkToNowhereInItsPlaceCreatesNothing) {
  std::filesystem::create_symlink("/tmp/nowhere", LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_FALSE(std::filesystem::exists("/tmp/nowhere"));
}

TEST_F(LocatorTest, DirectoryInItsPlaceIsPassedOver) {
  MakeDirectory(LOCATOR_PATH);
  updateLocatorFile("/shares/Vol/");
  EXPECT_TRUE(std::filesystem::is_empty(LOCATOR_PATH));
}

TEST_F(LocatorTest, PipeThatNobodyReadsIsNotWaitedFor) {
  ASSERT_EQ(0, mkfifo(LOCATOR_PATH.c_str(), 0666));
  updateLocatorFile("/shares/Vol/");
  EXPECT_TRUE(std::filesystem::is_fifo(LOCATOR_PATH));
}

TEST_F(LocatorTest, PipeThatIsReadGetsNothing) {
  ASSERT_EQ(0, mkfifo(LOCATOR_PATH.c_str(), 0666));
  const int reader = open(LOCATOR_PATH.c_str(), O_RDONLY | O_NONBLOCK);
  ASSERT_NE(-1, reader);
  updateLocatorFile("/shares/Vol/");
  std::array<char, 64> bytes{};
  EXPECT_EQ(0, read(reader, bytes.data(), bytes.size())) << "no writer is left, nothing was said";
  close(reader);
}

/// Standard output as something else for a scope.
class Redirected {
public:
  /// Takes over `descriptor`; -1 closes standard output.
  explicit Redirected(int descriptor) {
    if (descriptor == -1) {
      close(STDOUT_FILENO);
    } else {
      dup2(descriptor, STDOUT_FILENO);
      close(descriptor);
    }
  }
  Redirected(const Redirected&) = delete;
  Redirected& operator=(const Redirected&) = delete;
  ~Redirected() {
    dup2(original_, STDOUT_FILENO);
    close(original_);
  }

private:
  int original_ = dup(STDOUT_FILENO);
};

struct Pipe {
  Pipe() {
    std::array<int, 2> ends{};
    if (pipe(ends.data()) != 0) {
      throw std::system_error(errno, std::generic_category(), "pipe");
    }
    reader = ends[0];
    writer = ends[1];
  }

  int reader;
  int writer;
};

/// What can be read without waiting.
std::string Drain(int reader) {
  fcntl(reader, F_SETFL, O_NONBLOCK);
  std::string text;
  std::array<char, 65536> bytes{};
  for (ssize_t count = 0; (count = read(reader, bytes.data(), bytes.size())) > 0;) {
    text.append(bytes.data(), static_cast<std::size_t>(count));
  }
  return text;
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
    const Redirected redirected(output.writer);
    writeLine({"one"});
    writeLine({"two"});
  }
  EXPECT_EQ("one\ntwo\n", Drain(output.reader));
  close(output.reader);
}

TEST(WriteLine, LineLongerThanAPipeArrivesWhole) {
  Pipe output;
  const std::string text(1 << 20, 'x');
  std::string received;
  std::thread reader([&] {
    std::array<char, 65536> bytes{};
    for (ssize_t count = 0; (count = read(output.reader, bytes.data(), bytes.size())) > 0;) {
      received.append(bytes.data(), static_cast<std::size_t>(count));
    }
  });
  {
    const Redirected redirected(output.writer);
    writeLine({text});
  }
  reader.join();
  EXPECT_EQ(text.size() + 1, received.size());
  EXPECT_EQ(text + "\n", received);
  close(output.reader);
}

TEST(WriteLine, PipeThatNobodyHoldsCostsOnlyTheLine) {
  std::signal(SIGPIPE, SIG_IGN); // as the daemon does when it starts
  Pipe output;
  close(output.reader);
  {
    const Redirected redirected(output.writer);
    writeLine({"lost"});
  }
  EXPECT_EQ("kept\n", OutputOf([] { writeLine({"kept"}); }));
}

TEST(WriteLine, ClosedOutputCostsOnlyTheLine) {
  {
    const Redirected redirected(-1);
    writeLine({"lost"});
  }
  EXPECT_EQ("kept\n", OutputOf([] { writeLine({"kept"}); }));
}

TEST(WriteLine, FullPipeCostsLinesUntilItIsReadAgain) {
  Pipe output;
  std::size_t filling = 0;
  fcntl(output.writer, F_SETFL, O_NONBLOCK);
  const std::string filler(PIPE_BUF, '.');
  for (ssize_t count = 0; (count = write(output.writer, filler.data(), filler.size())) > 0;) {
    filling += static_cast<std::size_t>(count);
  }
  fcntl(output.writer, F_SETFL, 0);

  std::string lost;
  std::string read;
  {
    const Redirected redirected(output.writer);
    for (int i = 0; i < 100; ++i) {
      writeLine({"lost"});
    }
    lost = Drain(output.reader);
    writeLine({"after"});
    read = Drain(output.reader);
  }
  EXPECT_EQ(std::string(filling, '.'), lost);
  EXPECT_EQ("after\n", read);
  close(output.reader);
}

} // namespace
} // namespace orva::test

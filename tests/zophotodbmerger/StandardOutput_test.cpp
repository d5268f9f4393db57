#include "DaemonLayerTest.h"

#include "StandardOutput.h"

#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>
#include <csignal>
#include <fstream>
#include <system_error>
#include <thread>
#include <utility>

namespace orva::test {
namespace {

using dbmerger::StandardOutput;
using util::FileDescriptor;

/// Standard output as something else for a scope.
class Redirected {
public:
  /// Standard output is closed where there is no `descriptor`.
  explicit Redirected(FileDescriptor descriptor) { Redirect(std::move(descriptor)); }
  Redirected(const Redirected&) = delete;
  Redirected& operator=(const Redirected&) = delete;
  ~Redirected() {
    dup2(original_.Get(), STDOUT_FILENO);
    StandardOutput::Current(); // closes what it had opened again, so that the reader gets an end
  }

  /// Makes it something else again.
  static void Redirect(FileDescriptor descriptor) {
    if (descriptor) {
      dup2(descriptor.Get(), STDOUT_FILENO);
    } else {
      close(STDOUT_FILENO);
    }
  }

private:
  FileDescriptor original_{dup(STDOUT_FILENO)};
};

/// Two connected descriptors.
struct Channel {
  FileDescriptor reader{};
  FileDescriptor writer{};
};

Channel MakePipe() {
  std::array<int, 2> ends{};
  if (pipe(ends.data()) != 0) {
    throw std::system_error(errno, std::generic_category(), "pipe");
  }
  return {.reader = FileDescriptor(ends[0]), .writer = FileDescriptor(ends[1])};
}

Channel MakeSocket() {
  std::array<int, 2> ends{};
  if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends.data()) != 0) {
    throw std::system_error(errno, std::generic_category(), "socketpair");
  }
  return {.reader = FileDescriptor(ends[0]), .writer = FileDescriptor(ends[1])};
}

FileDescriptor OpenFile(const std::string& path) {
  return FileDescriptor(open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600));
}

std::string Content(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

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

void WriteLine(std::initializer_list<std::string_view> pieces) {
  StandardOutput& output = StandardOutput::Current();
  output.WriteLine(pieces);
  output.Flush();
}

TEST(StandardOutputTest, JoinsThePiecesIntoOneLine) {
  EXPECT_EQ("a bc\n\n", OutputOf([] {
              WriteLine({"a ", "", "bc"});
              WriteLine({});
            }));
}

TEST(StandardOutputTest, ReachesTheReaderOfAPipe) {
  Channel output = MakePipe();
  {
    const Redirected redirected(std::move(output.writer));
    WriteLine({"one"});
    WriteLine({"two"});
  }
  EXPECT_EQ("one\ntwo\n", Drain(output.reader));
}

TEST(StandardOutputTest, LineLongerThanAPipeArrivesCompletely) {
  Channel output = MakePipe();
  const std::string text(1 << 20, 'x');
  std::string received;
  std::thread reader([&] { received = ReadAll(output.reader); });
  {
    const Redirected redirected(std::move(output.writer));
    WriteLine({text});
  }
  reader.join();
  EXPECT_EQ(text.size() + 1, received.size());
  EXPECT_EQ(text + "\n", received);
}

TEST(StandardOutputTest, MegabytesOfLinesArriveCompletely) {
  for (Channel& output : std::array{MakePipe(), MakeSocket()}) {
    std::string received;
    std::thread reader([&] { received = ReadAll(output.reader); });
    std::string written;
    {
      const Redirected redirected(std::move(output.writer));
      StandardOutput& lines = StandardOutput::Current();
      for (int number = 0; written.size() < (8U << 20); ++number) {
        const std::string text =
            std::to_string(number) + std::string(static_cast<std::size_t>(number % 700), '.');
        lines.WriteLine({"Adding file ", text});
        written += "Adding file " + text + "\n";
      }
      lines.Flush();
    }
    reader.join();
    EXPECT_EQ(written.size(), received.size());
    EXPECT_TRUE(written == received);
  }
}

TEST(StandardOutputTest, FewLinesAreWrittenByFlush) {
  Channel output = MakePipe();
  std::string before;
  std::string after;
  {
    const Redirected redirected(std::move(output.writer));
    StandardOutput& lines = StandardOutput::Current();
    lines.WriteLine({"one"});
    lines.WriteLine({"two"});
    before = Drain(output.reader);
    lines.Flush();
    after = Drain(output.reader);
    lines.Flush();
  }
  EXPECT_EQ("", before);
  EXPECT_EQ("one\ntwo\n", after);
  EXPECT_EQ("", Drain(output.reader));
}

TEST(StandardOutputTest, ManyLinesAreWrittenBeforeFlush) {
  const std::string path = "/tmp/output";
  std::string before;
  const std::string text(1000, '.');
  {
    const Redirected redirected(OpenFile(path));
    StandardOutput& lines = StandardOutput::Current();
    for (int number = 0; number < 1000; ++number) {
      lines.WriteLine({text});
    }
    before = Content(path);
    lines.Flush();
  }
  EXPECT_GT(before.size(), 800'000U) << "memory for lines has a bound";
  EXPECT_EQ(1'001'000U, Content(path).size());
}

TEST(StandardOutputTest, PipeWithoutAReaderLosesOnlyTheLine) {
  std::signal(SIGPIPE, SIG_IGN); // as the daemon does when it starts
  Channel output = MakePipe();
  output.reader.Reset();
  {
    const Redirected redirected(std::move(output.writer));
    WriteLine({"lost"});
  }
  EXPECT_EQ("kept\n", OutputOf([] { WriteLine({"kept"}); }));
}

TEST(StandardOutputTest, ClosedSocketLosesOnlyTheLineWithoutASignal) {
  std::signal(SIGPIPE, SIG_DFL);
  Channel output = MakeSocket();
  output.reader.Reset();
  {
    const Redirected redirected(std::move(output.writer));
    WriteLine({"lost"});
  }
  EXPECT_EQ("kept\n", OutputOf([] { WriteLine({"kept"}); }));
}

TEST(StandardOutputTest, ClosedOutputLosesOnlyTheLine) {
  bool isNull = false;
  {
    const Redirected redirected{FileDescriptor()};
    WriteLine({"lost"});
    isNull = StandardOutput::Current().IsNull();
  }
  EXPECT_TRUE(isNull);
  EXPECT_EQ("kept\n", OutputOf([] { WriteLine({"kept"}); }));
}

TEST(StandardOutputTest, NullDeviceDiscardsLines) {
  bool isNull = false;
  {
    const Redirected redirected(FileDescriptor(open("/dev/null", O_WRONLY)));
    WriteLine({"lost"});
    isNull = StandardOutput::Current().IsNull();
  }
  EXPECT_TRUE(isNull);
  EXPECT_EQ("kept\n", OutputOf([] { WriteLine({"kept"}); }));
}

TEST(StandardOutputTest, OtherDevicesAndFilesAreNotTheNullDevice) {
  for (FileDescriptor& descriptor :
       std::array{FileDescriptor(open("/dev/full", O_WRONLY)), OpenFile("/tmp/file"),
                  MakePipe().writer, MakeSocket().writer}) {
    ASSERT_TRUE(descriptor);
    bool isNull = true;
    {
      const Redirected redirected(std::move(descriptor));
      isNull = StandardOutput::Current().IsNull();
    }
    EXPECT_FALSE(isNull);
  }
}

TEST(StandardOutputTest, WhatTheDescriptorIsIsFoundOutAgain) {
  Channel pipe = MakePipe();
  Channel socket = MakeSocket();
  std::vector<bool> isNull;
  {
    const Redirected redirected(FileDescriptor(open("/dev/null", O_WRONLY)));
    const auto write = [&](std::string_view line) {
      WriteLine({line});
      isNull.push_back(StandardOutput::Current().IsNull());
    };
    write("null");
    Redirected::Redirect(std::move(pipe.writer));
    write("pipe");
    Redirected::Redirect(OpenFile("/tmp/first"));
    write("first file");
    Redirected::Redirect(OpenFile("/tmp/second"));
    write("second file");
    Redirected::Redirect(FileDescriptor());
    write("closed");
    Redirected::Redirect(std::move(socket.writer));
    write("socket");
    Redirected::Redirect(OpenFile("/tmp/first"));
    write("first file again");
  }
  EXPECT_EQ((std::vector{true, false, false, false, true, false, false}), isNull);
  EXPECT_EQ("pipe\n", ReadAll(pipe.reader));
  EXPECT_EQ("first file\nfirst file again\n", Content("/tmp/first"));
  EXPECT_EQ("second file\n", Content("/tmp/second"));
  EXPECT_EQ("socket\n", ReadAll(socket.reader));
}

TEST(StandardOutputTest, FullPipeLosesLinesUntilItIsRead) {
  Channel output = MakePipe();
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
      WriteLine({"lost"});
    }
    lost = Drain(output.reader);
    WriteLine({"after"});
    read = Drain(output.reader);
  }
  EXPECT_EQ(std::string(filling, '.'), lost);
  EXPECT_EQ("after\n", read);
}

/// The numbered line as the tests of half lines write it, of a length that no buffer is a multiple
/// of.
std::string NumberedLine(int number) {
  return std::to_string(100'000 + number) + std::string(1'001, '.') + "\n";
}

/// Writes numbered lines to a reader that does not read, until it has lost some. Returns the first
/// number that was not used.
int FillWithLines(int first) {
  constexpr int lines = 3'000;
  StandardOutput& output = StandardOutput::Current();
  for (int number = first; number < first + lines; ++number) {
    const std::string line = NumberedLine(number);
    output.WriteLine({std::string_view(line).substr(0, line.size() - 1)});
  }
  output.Flush();
  return first + lines;
}

/// Expects whole numbered lines in their order. Returns their numbers.
std::vector<int> ExpectWholeLines(std::string_view text) {
  std::vector<int> numbers;
  const std::size_t size = NumberedLine(0).size();
  EXPECT_EQ(0U, text.size() % size) << "the end is half a line";
  for (; text.size() >= size; text.remove_prefix(size)) {
    const int number = std::atoi(std::string(text.substr(0, 6)).c_str()) - 100'000;
    EXPECT_EQ(NumberedLine(number), text.substr(0, size));
    EXPECT_TRUE(numbers.empty() || numbers.back() < number);
    numbers.push_back(number);
    if (testing::Test::HasFailure()) {
      break;
    }
  }
  return numbers;
}

/// A reader of `output` stalls three times, in the middle of a line, and then reads with `read`.
template <typename Read>
void ExpectWholeLinesAfterStalls(FileDescriptor output, Read read) {
  struct Stall {
    std::size_t written = 0;
    std::string before; ///< what the reader gets first
    std::string after;  ///< and after the next line was written
    std::string line;   ///< that line
  };
  std::vector<Stall> stalls;
  {
    const Redirected redirected(std::move(output));
    for (int number = 0; stalls.size() < 3;) {
      const int end = FillWithLines(number);
      Stall& stall = stalls.emplace_back();
      stall.written = static_cast<std::size_t>(end - number) * NumberedLine(0).size();
      stall.before = read();
      stall.line = NumberedLine(end);
      WriteLine({std::string_view(stall.line).substr(0, stall.line.size() - 1)});
      stall.after = read();
      number = end + 1;
    }
  }
  std::string received;
  for (const Stall& stall : stalls) {
    EXPECT_FALSE(stall.before.ends_with('\n')) << "the reader has stalled between two lines";
    EXPECT_LT(stall.before.size(), stall.written);
    received += stall.before + stall.after;
    EXPECT_TRUE(received.ends_with("\n" + stall.line));
  }
  ExpectWholeLines(received);
}

TEST(StandardOutputTest, ReaderOfAPipeThatStallsInALineGetsItsRest) {
  Channel output = MakePipe();
  ExpectWholeLinesAfterStalls(std::move(output.writer), [&] { return Drain(output.reader); });
}

TEST(StandardOutputTest, ReaderOfASocketThatStallsInALineGetsItsRest) {
  Channel output = MakeSocket();
  ExpectWholeLinesAfterStalls(std::move(output.writer), [&] { return Drain(output.reader); });
}

TEST(StandardOutputTest, FullFileSystemLosesWholeLines) {
  MakeDirectory("/tmp/full");
  ASSERT_EQ(0, mount("tmpfs", "/tmp/full", "tmpfs", 0, "size=256k"));
  const std::string path = "/tmp/full/output";
  // What was read is removed, so that there is room again.
  ExpectWholeLinesAfterStalls(OpenFile(path), [&] {
    std::string text = Content(path);
    std::filesystem::resize_file(path, 0);
    return text;
  });
  umount2("/tmp/full", MNT_DETACH);
}

TEST(StandardOutputTest, FifoThatGetsItsReaderLaterIsNotWaitedForPermanently) {
  const char* const path = "/tmp/fifo";
  std::filesystem::remove(path);
  std::signal(SIGPIPE, SIG_IGN); // as the daemon does when it starts
  ASSERT_EQ(0, mkfifo(path, 0600));
  FileDescriptor reader(open(path, O_RDONLY | O_NONBLOCK));
  const Redirected redirected(FileDescriptor(open(path, O_WRONLY)));
  reader.Reset();
  WriteLine({"lost"});
  reader.Reset(open(path, O_RDONLY | O_NONBLOCK));
  const std::string text(1 << 20, 'x');
  WriteLine({text}); // returns, although nobody reads
  EXPECT_THAT(Drain(reader), ::testing::StartsWith("xxx"));
}

TEST(StandardOutputTest, DatagramSocketGetsOneLineAMessage) {
  std::array<int, 2> ends{};
  ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_DGRAM, 0, ends.data()));
  const FileDescriptor reader(ends[0]);
  {
    const Redirected redirected{FileDescriptor(ends[1])};
    StandardOutput& output = StandardOutput::Current();
    output.WriteLine({"one"});
    output.WriteLine({"two"});
  }
  std::array<char, 64> message{};
  EXPECT_EQ(4, recv(reader.Get(), message.data(), message.size(), MSG_DONTWAIT));
  EXPECT_EQ(4, recv(reader.Get(), message.data(), message.size(), MSG_DONTWAIT));
}

TEST(StandardOutputTest, NextOutputGetsNoRestOfALine) {
  Channel output = MakePipe();
  std::string half;
  {
    const Redirected redirected(std::move(output.writer));
    FillWithLines(0);
    half = Drain(output.reader);
    Redirected::Redirect(OpenFile("/tmp/next"));
    WriteLine({"whole"});
  }
  EXPECT_FALSE(half.ends_with('\n'));
  EXPECT_EQ("whole\n", Content("/tmp/next"));
}

} // namespace
} // namespace orva::test

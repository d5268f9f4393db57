#include "transcoder/Photos.h"

#include "orva-transcoder/Sandbox.h"
#include "orvautil/FileDescriptor.h"
#include "orvautil/Socket.h"
#include "support/OtherUsers.h"
#include "support/Program.h"

#include <gmock/gmock.h>

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <csignal>
#include <filesystem>

namespace {

using namespace orva;
using test::ReadBytes;
using test::WriteBytes;
using testing::HasSubstr;
using transcoder::Ending;
using transcoder::Limits;
namespace fs = std::filesystem;

class Sandbox : public testing::Test {
protected:
  void SetUp() override {
    WriteBytes("/tmp/in/file", "content");
    fs::create_directories("/tmp/out");
    // Its own permissions do not protect the input.
    for (const char* const path : {"/tmp/out", "/tmp/in", "/tmp/in/file"}) {
      fs::permissions(path, fs::perms::all);
    }
    WriteBytes("/shares/secret", "secret");
  }

  static Ending Shell(const std::string& script, const Limits& limits = {}) {
    return transcoder::RunInSandbox({"/usr/bin/sh", "-c", script},
                                    {.input = "/tmp/in", .output = "/tmp/out"}, limits);
  }
};

TEST_F(Sandbox, SeesItsInputAndWritesItsOutput) {
  const Ending ending = Shell("cat /in/file >/out/copy; echo said; echo wrong >&2; exit 3");
  EXPECT_EQ(ending.status, 3);
  EXPECT_EQ(ending.output, "said\n");
  EXPECT_EQ(ending.error, "wrong\n");
  EXPECT_EQ(ReadBytes("/tmp/out/copy"), "content");
}

TEST_F(Sandbox, SeesNothingElse) {
  EXPECT_EQ(Shell("ls -A /").output, "bin\nin\nlib\nlib64\nout\ntmp\nusr\n");
  EXPECT_NE(Shell("cat /shares/secret").status, 0);
  EXPECT_EQ(Shell("ls -A /tmp").output, "");
}

TEST_F(Sandbox, CannotWriteElsewhere) {
  for (const char* const path : {"/in/file", "/in/new", "/usr/new", "/usr/bin/sh", "/new"}) {
    // The root itself is memory of the sandbox.
    if (std::string(path) != "/new") {
      EXPECT_NE(Shell(std::string("echo x >>") + path).status, 0) << path;
    }
  }
  EXPECT_EQ(ReadBytes("/tmp/in/file"), "content");
}

TEST_F(Sandbox, HasAnEnvironmentOfItsOwn) {
  setenv("SECRET", "secret", 1);
  const std::string environment = Shell("env").output;
  EXPECT_THAT(environment, Not(HasSubstr("SECRET")));
  EXPECT_THAT(environment, HasSubstr("VIPS_BLOCK_UNTRUSTED=1\n"));
}

TEST_F(Sandbox, InheritsNoOpenFiles) {
  const util::FileDescriptor secret(open("/shares/secret", O_RDONLY)); // not close-on-exec
  ASSERT_TRUE(secret);
  EXPECT_NE(Shell("cat <&" + std::to_string(secret.Get())).output, "secret");
}

TEST_F(Sandbox, HasNoPrivilegesAndOwnsNothing) {
  SKIP_WITHOUT_OTHER_USERS();
  EXPECT_EQ(Shell("id -u; id -g; id -G").output, "65533\n65533\n65533\n");
  Shell("echo x >/out/mine");
  struct stat status {};
  ASSERT_EQ(stat("/tmp/out/mine", &status), 0);
  EXPECT_EQ(status.st_uid, 65533U);
  EXPECT_NE(Shell("chown 0 /out/mine").status, 0);
  EXPECT_NE(Shell("mount -t tmpfs none /tmp").status, 0);
}

TEST_F(Sandbox, HasNoNetworkAndNoOtherProcesses) {
  // A process of the test's user.
  const test::Program other({"sleep", "1000"});
  EXPECT_NE(Shell("kill -0 " + std::to_string(other.Pid())).status, 0);
  // An abstract socket belongs to the network namespace.
  const std::string client = "use Socket;\n"
                             "socket(S, PF_UNIX, SOCK_STREAM, 0) or exit 4;\n"
                             "connect(S, pack_sockaddr_un(\"\\0sandbox_test\")) or exit 5;\n";
  WriteBytes("/tmp/in/client", client);
  const util::FileDescriptor service(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const util::Socket::Address address("@sandbox_test");
  ASSERT_EQ(bind(service.Get(), address.Get(), address.Length()), 0);
  ASSERT_EQ(listen(service.Get(), 1), 0);
  EXPECT_EQ(test::Run({"perl", "/tmp/in/client"}).status, 0);
  EXPECT_EQ(Shell("perl /in/client").status, 5);
}

TEST_F(Sandbox, IsEndedWhenItTakesTooLong) {
  const Ending sleeping = Shell("sleep 1000", {.time = std::chrono::seconds(1)});
  EXPECT_TRUE(sleeping.wasTooSlow);
  const Ending working = Shell("while :; do :; done", {.processorTime = std::chrono::seconds(1),
                                                       .time = std::chrono::seconds(40)});
  EXPECT_TRUE(working.wasTooSlow);
  EXPECT_EQ(working.status, 128 + SIGXCPU);
  EXPECT_TRUE(Shell("sleep 20", {.isOverdue = [] { return true; }}).wasTooSlow);
  // Background processes end with the program.
  const Ending left = Shell("sleep 1000 & exit 0", {.time = std::chrono::seconds(2)});
  EXPECT_NE(test::Run({"pidof", "sleep"}).status, 0) << left.status;
}

TEST_F(Sandbox, AKillFromOutsideIsNotSlowness) {
  const Ending killed = Shell("kill -KILL $$");
  EXPECT_EQ(killed.status, 128 + SIGKILL);
  EXPECT_FALSE(killed.wasTooSlow);
  EXPECT_TRUE(killed.WasKilled());
  EXPECT_FALSE(Shell("sleep 1000", {.time = std::chrono::seconds(1)}).WasKilled());
}

TEST_F(Sandbox, IsLimitedInMemoryAndInTheSizeOfFiles) {
  WriteBytes("/tmp/in/large", "$x = 'x'; $x = 'x' x (300 << 20);\n");
  EXPECT_EQ(Shell("perl /in/large", {.memory = 1U << 30}).status, 0);
  EXPECT_NE(Shell("perl /in/large", {.memory = 200U << 20}).status, 0);
  const Ending file =
      Shell("head -c 2000000 /usr/bin/perl /usr/bin/perl >/out/large", {.fileSize = 1U << 20});
  EXPECT_EQ(file.status, 128 + SIGXFSZ);
  EXPECT_EQ(fs::file_size("/tmp/out/large"), 1U << 20);
  const Ending scratch =
      Shell("for i in $(seq 400); do head -c 1048576 /usr/bin/perl >/tmp/$i || exit 9; done");
  EXPECT_NE(scratch.status, 0);
}

TEST_F(Sandbox, LongOutputIsShortened) {
  const Ending ending = Shell("seq 100000; seq 100000 >&2");
  EXPECT_EQ(ending.status, 0);
  EXPECT_LE(ending.output.size(), 65536U);
  EXPECT_TRUE(ending.output.ends_with("99999\n100000\n"));
  EXPECT_TRUE(ending.error.ends_with("99999\n100000\n"));
}

} // namespace

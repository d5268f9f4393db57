#include "Sandbox.h"

#include "orvautil/Exception.h"
#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <filesystem>
#include <initializer_list>
#include <limits>
#include <system_error>
#include <utility>

namespace orva::transcoder {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::size_t KEPT_OUTPUT = std::size_t{64} * 1024;
constexpr rlim_t MOST_PROCESSES = 1024; // and threads, of all sandboxes
constexpr int CANNOT_START = 127;
constexpr std::chrono::milliseconds OVERDUE_CHECK(200);

/// Hides libvips's loadable modules except the one for HEIF: the formats of the others are no
/// photos, and to load them takes as long as to load the program.
std::vector<std::string> FindLoaders() {
  namespace fs = std::filesystem;
  std::vector<std::string> options;
  std::error_code ignored;
  for (const auto& architecture : fs::directory_iterator("/usr/lib", ignored)) {
    for (const auto& folder : fs::directory_iterator(architecture.path(), ignored)) {
      if (folder.path().filename().native().starts_with("vips-modules-")) {
        options.insert(options.end(), {"--tmpfs", folder.path().native()});
        const std::string heif = folder.path() / "vips-heif.so";
        if (fs::exists(heif, ignored)) {
          options.insert(options.end(), {"--ro-bind", heif, heif});
        }
      }
    }
  }
  return options;
}

const std::vector<std::string>& LoaderOptions() {
  static const std::vector<std::string> options = FindLoaders();
  return options;
}

/// bwrap(1) without the command. There is no /proc, because the kernel does not allow to mount one
/// where a part of /proc is hidden, as in our unit.
std::vector<std::string> SandboxOptions(const SandboxFolders& folders) {
  std::vector<std::string> options = {
      "/usr/bin/bwrap", "--unshare-user", "--unshare-ipc", "--unshare-net", "--unshare-pid",
      "--unshare-uts", "--die-with-parent", "--new-session", "--cap-drop", "ALL", "--clearenv",
      "--setenv", "PATH", "/usr/bin", "--setenv", "LC_ALL", "C",
      // The loaders that libvips itself does not trust with untrusted files are off.
      "--setenv", "VIPS_BLOCK_UNTRUSTED", "1", "--setenv", "VIPS_CONCURRENCY", "1",
      // Images that have to be in memory as a whole stay there. The limit of memory applies.
      "--setenv", "VIPS_DISC_THRESHOLD", "4g", "--ro-bind", "/usr", "/usr", "--symlink", "usr/bin",
      "/bin", "--symlink", "usr/lib", "/lib", "--symlink", "usr/lib64", "/lib64", "--size",
      "268435456", "--tmpfs", "/tmp", "--chdir", "/"};
  for (const std::string& option : LoaderOptions()) {
    options.push_back(option);
  }
  if (!folders.input.empty()) {
    options.insert(options.end(), {"--ro-bind", folders.input, "/in"});
  }
  if (!folders.output.empty()) {
    options.insert(options.end(), {"--bind", folders.output, "/out"});
  }
  options.emplace_back("--");
  return options;
}

struct Pipe {
  util::FileDescriptor reader;
  util::FileDescriptor writer;
};

Pipe MakePipe() {
  std::array<int, 2> ends{};
  if (pipe2(ends.data(), O_CLOEXEC) != 0) {
    throw util::Exception("no pipe: " + std::generic_category().message(errno));
  }
  return {util::FileDescriptor(ends[0]), util::FileDescriptor(ends[1])};
}

void SetLimit(decltype(RLIMIT_AS) resource, rlim_t soft, rlim_t hard) noexcept {
  const rlimit limit{.rlim_cur = soft, .rlim_max = hard};
  setrlimit(resource, &limit);
}

/// Becomes the user of the sandbox. An ordinary user stays what he is, and so does the root of a
/// user namespace that has no such user. With the system calls themselves: the library's functions
/// would change all threads, which a child of fork does not have.
void BecomeSandboxUser() noexcept {
  if (syscall(SYS_setresgid, SANDBOX_USER, SANDBOX_USER, SANDBOX_USER) != 0) {
    return;
  }
  if (syscall(SYS_setgroups, 0, nullptr) != 0 ||
      syscall(SYS_setresuid, SANDBOX_USER, SANDBOX_USER, SANDBOX_USER) != 0) {
    _exit(CANNOT_START);
  }
  SetLimit(RLIMIT_NPROC, MOST_PROCESSES, MOST_PROCESSES);
}

/// The child's part after fork: only what a signal handler may do, too.
[[noreturn]] void Become(char* const* arguments, const Limits& limits, int output,
                         int error) noexcept {
  char* const noEnvironment[] = {nullptr};
  const auto seconds = static_cast<rlim_t>(limits.processorTime.count());
  SetLimit(RLIMIT_CPU, seconds, seconds + 1);
  SetLimit(RLIMIT_AS, limits.memory, limits.memory);
  SetLimit(RLIMIT_FSIZE, limits.fileSize, limits.fileSize);
  SetLimit(RLIMIT_CORE, 0, 0);
  const int input = open("/dev/null", O_RDONLY | O_CLOEXEC);
  if (dup2(input, STDIN_FILENO) == -1 || dup2(output, STDOUT_FILENO) == -1 ||
      dup2(error, STDERR_FILENO) == -1) {
    _exit(CANNOT_START);
  }
  // Another thread may have opened a file that programs inherit.
  close_range(STDERR_FILENO + 1, std::numeric_limits<unsigned>::max(), 0);
  BecomeSandboxUser();
  // As the signals were before this program changed them.
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
  std::signal(SIGPIPE, SIG_DFL);
  execve(arguments[0], arguments, noEnvironment);
  _exit(CANNOT_START);
}

/// A process that is killed with the object.
class Process {
public:
  explicit Process(pid_t id) noexcept : id_(id) {}
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;
  ~Process() {
    if (id_ != -1) {
      Kill();
      Wait();
    }
  }

  void Kill() const noexcept { kill(id_, SIGKILL); }

  /// The status as in Ending.
  int Wait() noexcept {
    int status = 0;
    while (waitpid(id_, &status, 0) == -1 && errno == EINTR) {
    }
    id_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  }

private:
  pid_t id_;
};

/// Reads what is there. Returns false at the end.
bool Read(const util::FileDescriptor& pipe, std::string& text) {
  std::array<char, 16384> chunk;
  const ssize_t count = read(pipe.Get(), chunk.data(), chunk.size());
  if (count > 0) {
    text.append(chunk.data(), static_cast<std::size_t>(count));
    if (text.size() > KEPT_OUTPUT) {
      text.erase(0, text.size() - KEPT_OUTPUT);
    }
  }
  return count > 0 || (count == -1 && errno == EINTR);
}

/// Reads both pipes to their ends, which come when all processes of the sandbox have ended. Returns
/// false when `deadline` has passed or the program is overdue.
bool ReadToEnd(Pipe& output, Pipe& error, Ending& ending, Clock::time_point deadline,
               const std::function<bool()>& isOverdue) {
  std::array<pollfd, 2> pipes{pollfd{output.reader.Get(), POLLIN, 0},
                              pollfd{error.reader.Get(), POLLIN, 0}};
  while (pipes[0].fd != -1 || pipes[1].fd != -1) {
    auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
    if (left.count() <= 0 || (isOverdue && isOverdue())) {
      return false;
    }
    left = isOverdue ? std::min(left, OVERDUE_CHECK) : left;
    if (poll(pipes.data(), pipes.size(), static_cast<int>(left.count())) <= 0) {
      continue;
    }
    if (pipes[0].revents != 0 && !Read(output.reader, ending.output)) {
      pipes[0].fd = -1;
    }
    if (pipes[1].revents != 0 && !Read(error.reader, ending.error)) {
      pipes[1].fd = -1;
    }
  }
  return true;
}

} // namespace

Ending RunInSandbox(const std::vector<std::string>& command, const SandboxFolders& folders,
                    const Limits& limits) {
  std::vector<std::string> words = SandboxOptions(folders);
  words.insert(words.end(), command.begin(), command.end());
  std::vector<char*> arguments;
  arguments.reserve(words.size() + 1);
  for (std::string& word : words) {
    arguments.push_back(word.data());
  }
  arguments.push_back(nullptr);

  Pipe output = MakePipe();
  Pipe error = MakePipe();
  const auto deadline = Clock::now() + limits.time;
  const pid_t id = fork();
  if (id == -1) {
    throw util::Exception("no process: " + std::generic_category().message(errno));
  }
  if (id == 0) {
    Become(arguments.data(), limits, output.writer.Get(), error.writer.Get());
  }
  Process process(id);
  output.writer.Reset();
  error.writer.Reset();

  Ending ending;
  if (!ReadToEnd(output, error, ending, deadline, limits.isOverdue)) {
    ending.wasTooSlow = true;
    process.Kill();
    ReadToEnd(output, error, ending, Clock::now() + std::chrono::seconds(10), {});
  }
  ending.status = process.Wait();
  ending.wasTooSlow = ending.wasTooSlow || ending.status == 128 + SIGXCPU;
  if (ending.status == CANNOT_START) {
    throw util::Exception("cannot start /usr/bin/bwrap, or as user " +
                          std::to_string(SANDBOX_USER));
  }
  return ending;
}

} // namespace orva::transcoder

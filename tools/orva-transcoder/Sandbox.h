#pragma once

#include <sys/types.h>

#include <chrono>
#include <csignal>
#include <cstddef>
#include <functional>
#include <string>
#include <vector>

namespace orva::transcoder {

/// A user and group that owns nothing: Debian reserves the number and gives it to nobody. The
/// programs in a sandbox run as this user.
inline constexpr uid_t SANDBOX_USER = 65533;

/// How much a program in a sandbox may use.
struct Limits {
  std::chrono::seconds processorTime{30};
  std::chrono::seconds time{120};
  std::size_t memory = std::size_t{1} << 30;   ///< bytes of address space of each process
  std::size_t fileSize = std::size_t{4} << 20; ///< bytes of each file that it writes
  std::function<bool()> isOverdue{};           ///< asked some times a second; true ends the program
};

/// How a program in a sandbox has ended.
struct Ending {
  int status = -1; ///< exit status, or 128 and the signal's number
  bool wasTooSlow = false;
  std::string output; ///< its last kibibytes
  std::string error;  ///< the same of standard error

  bool IsSuccess() const noexcept { return status == 0; }
  /// Something else than our limits has ended it: for example, the memory of the machine is used
  /// up.
  bool WasKilled() const noexcept { return status == 128 + SIGKILL && !wasTooSlow; }
};

/// Folders that a program in a sandbox sees.
struct SandboxFolders {
  std::string input{};  ///< seen as /in, read only
  std::string output{}; ///< seen as /out
};

/// Runs `command`, a program below /usr with its arguments, where it sees nothing but /usr, an
/// empty /tmp in memory and `folders`. It has no network, no capabilities, an environment of our
/// own, and sees no other processes. It ends with this thread. Waits for its end. Throws
/// util::Exception when it cannot be started. Any thread.
Ending RunInSandbox(const std::vector<std::string>& command, const SandboxFolders& folders,
                    const Limits& limits);

} // namespace orva::transcoder

#include "Service.h"

#include "commandline/Parse.h"
#include "commandline/UsageError.h"
#include "orvautil/Core.h"
#include "service/Log.h"

#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <string>
#include <vector>

namespace {

using namespace orva;

/// Returns false when the arguments ask for help or the version, which were printed.
bool ParseArguments(const std::vector<std::string>& arguments) {
  CLI::App app{"Keeps the media catalogs of all volumes up to date. A service without a "
               "configuration.",
               "orva-indexer"};
  app.set_version_flag("--version", "orva-indexer " PROGRAM_VERSION);
  app.footer("Exit status: 0 stopped by a signal; 1 failed; 2 wrong command line.\n"
             "See orva-indexer(8).");
  return commandline::Parse(app, arguments, false);
}

/// The directory that systemd names in the environment. It may name several; ours is one.
std::string Directory(const char* variable, const char* standard) {
  const char* const value = std::getenv(variable);
  return value != nullptr && *value == '/' ? value : standard;
}

/// Other programs on the volumes come first. It does no harm if this is refused.
void LowerPriority() {
  constexpr int WHO_PROCESS = 1; // linux/ioprio.h
  constexpr int CLASS_IDLE = 3 << 13;
  setpriority(PRIO_PROCESS, 0, 10);
  syscall(SYS_ioprio_set, WHO_PROCESS, 0, CLASS_IDLE);
}

} // namespace

int main(int count, char* arguments[]) {
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
  try {
    if (ParseArguments({arguments + 1, arguments + count})) {
      LowerPriority();
      umask(022);
      indexer::Service({.notificationSocket = core::ORVA_NOTIFICATION_SOCKET,
                        .stateDirectory = Directory("STATE_DIRECTORY", "/var/lib/orva-indexer"),
                        .runtimeDirectory = Directory("RUNTIME_DIRECTORY", "/run/orva-indexer")})
          .Run();
    }
    return 0;
  } catch (const commandline::UsageError& error) {
    commandline::Report(error);
    return commandline::EXIT_USAGE;
  } catch (const std::exception& error) {
    service::LogError(error.what());
    std::cerr << "orva-indexer: " << error.what() << '\n';
  } catch (const std::string& error) { // the database layer's
    service::LogError(error);
    std::cerr << "orva-indexer: " << error << '\n';
  }
  return 1;
}

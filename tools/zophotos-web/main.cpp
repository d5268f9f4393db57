#include "ListeningSocket.h"
#include "Options.h"
#include "Router.h"
#include "Server.h"
#include "Snapshot.h"
#include "SocketAddress.h"
#include "Updater.h"

#include "zophotos/Locator.h"
#include "zophotos/Text.h"

#include "commandline/UsageError.h"

#include <malloc.h>
#include <sys/stat.h>

#include <csignal>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <mutex>
#include <stdexcept>
#include <string>
#include <utility>

namespace {

using namespace orva;

/// The unit file has this number: another start would end in the same way.
constexpr int EXIT_REFUSED = 3;

/// Writes a line to standard error, which is the journal when systemd runs the program. Any thread.
void Log(const std::string& text) {
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  std::cerr << "zophotos-web: " + zophotos::Printable(text) + '\n' << std::flush;
}

std::string Variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr ? "" : value;
}

/// The directory of the snapshot. systemd names one; the parent of the user's one may not exist
/// yet.
std::string CacheDirectory(const std::string& wanted) {
  if (!wanted.empty()) {
    return wanted;
  }
  if (std::string directory = Variable("CACHE_DIRECTORY"); directory.starts_with('/')) {
    return directory;
  }
  std::string caches = Variable("XDG_CACHE_HOME");
  if (!caches.starts_with('/')) {
    const std::string home = Variable("HOME");
    if (!home.starts_with('/')) {
      throw std::runtime_error("neither CACHE_DIRECTORY nor HOME is set; use --cache DIRECTORY");
    }
    caches = home + "/.cache";
  }
  mkdir(caches.c_str(), 0700);
  return caches + "/zophotos-web";
}

/// The signals that end the program. Blocks them, so that only Wait takes them.
class EndSignals {
public:
  EndSignals() {
    sigemptyset(&signals_);
    sigaddset(&signals_, SIGINT);
    sigaddset(&signals_, SIGTERM);
    sigaddset(&signals_, SIGHUP);
    pthread_sigmask(SIG_BLOCK, &signals_, nullptr);
  }

  void Wait() const {
    int signal = 0;
    sigwait(&signals_, &signal);
  }

private:
  sigset_t signals_{};
};

void Serve(const web::Options& options) {
  const EndSignals signals;
  util::FileDescriptor listener = web::OpenListeningSocket(options);
  const std::string url = web::SocketAddress::Of(listener.Get())->Url();
  web::Snapshot snapshot(CacheDirectory(options.cache), &zophotos::FindDatabase);
  web::Router router(snapshot, &Log);
  web::Server server(
      std::move(listener), web::AllowedHosts(options.hosts),
      {.answer = [&router](const web::Request& request) { return router.Answer(request); },
       .refuse = &web::Router::Refuse,
       .log = &Log});
  const web::Updater updater(snapshot, server.Events(), &Log);
  Log("listening on " + url +
      "; everybody who can connect sees all photos that this user can read");
  signals.Wait();
}

} // namespace

int main(int count, char* arguments[]) {
  std::signal(SIGPIPE, SIG_IGN);
  // The memory of long responses goes back to the system at once.
  mallopt(M_MMAP_THRESHOLD, 1 << 20);
  try {
    zophotos::UseUtf8();
    if (const auto options = web::ParseOptions({arguments + 1, arguments + count})) {
      Serve(*options);
    }
    return EXIT_SUCCESS;
  } catch (const commandline::UsageError& error) {
    commandline::Report(error, zophotos::Printable);
    return commandline::EXIT_USAGE;
  } catch (const web::AddressRefused& error) {
    Log(error.what());
    return EXIT_REFUSED;
  } catch (const std::exception& error) {
    Log(error.what());
    return EXIT_FAILURE;
  }
}

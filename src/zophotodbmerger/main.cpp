#include "stdafx.h"

#include "InstanceLock.h"
#include "NotificationListener.h"
#include "StateMachine.h"

#include "orvautil/Core.h"
#include "orvautil/FormatString.h"
#include "orvautil/LoggerMgr.h"
#include "orvautil/Path.h"
#include "orvautil/Singleton.h"

#include <xercesc/util/PlatformUtils.hpp>

#include <fcntl.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <string_view>

namespace {

using namespace orva;

/// Path of a log file of the daemon's own, which is not written.
const std::string ORVA_LOG_FILE = util::MakePath(
    core::GetORVA_HOME({'.', util::Path::GetNativePathSeparator()}), "zodbmerger.log");

/// Deleted at the end of the process, when its thread has ended.
std::unique_ptr<dbmerger::NotificationListener> notificationListener;

/// A closed pipe as standard output or a limit on the size of files must not end the daemon: only
/// the write fails.
void IgnoreSignalsOfWrites() {
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
}

/// No socket or database file may get the number of a standard descriptor that was closed when the
/// daemon started.
void OpenStandardDescriptors() {
  int descriptor = 0;
  do {
    descriptor = open("/dev/null", O_RDWR);
  } while (descriptor >= STDIN_FILENO && descriptor <= STDERR_FILENO);
  close(descriptor);
}

constexpr const char USAGE[] =
    "usage: zophotodbmerger [--help | --version]\n\n"
    "Without an option, runs as the daemon that merges the photo catalogs of all volumes into\n"
    "one database. See zophotodbmerger(8).\n"
    "  --help, -h  prints this text\n"
    "  --version   prints the version\n";

/// `text` with an escape for each control character, so that it cannot control the terminal.
std::string EscapeControls(std::string_view text) {
  std::string escaped;
  for (const char character : text) {
    const auto byte = static_cast<unsigned char>(character);
    escaped += byte < 0x20 || byte == 0x7F ? util::FormatString("\\x%02x", byte)
                                           : std::string(1, character);
  }
  return escaped;
}

/// Prints the version or the usage, or what is wrong. Returns the exit status.
int AnswerArguments(const std::vector<std::string_view>& arguments) {
  const std::string_view first = arguments.front();
  const bool isVersion = first == "--version";
  const bool isKnown = isVersion || first == "--help" || first == "-h";
  if (isKnown && arguments.size() == 1) {
    std::cout << (isVersion ? "zophotodbmerger " PROGRAM_VERSION "\n" : USAGE);
    return EXIT_SUCCESS;
  }
  std::cerr << "zophotodbmerger: "
            << (!isKnown && first.starts_with('-')
                    ? "unknown option: " + EscapeControls(first)
                    : "unexpected argument: '" + EscapeControls(isKnown ? arguments[1] : first) +
                          "'")
            << "\nTry 'zophotodbmerger --help'.\n\n"
            << USAGE;
  return 2;
}

void ListenUntilTheServiceEnds() {
  dbmerger::StateMachine::Instance();
  auto listener = std::make_unique<dbmerger::NotificationListener>();
  listener->Create(8, 0, false);
  notificationListener = std::move(listener);
  notificationListener->Wait();
  syslog(LOG_LOCAL1 | LOG_INFO, "Returning from the wait");
}

} // namespace

int main(int count, char* arguments[]) {
  IgnoreSignalsOfWrites();
  OpenStandardDescriptors();
  if (count > 1) {
    return AnswerArguments({arguments + 1, arguments + count});
  }
  const dbmerger::InstanceLock lock;
  if (lock.IsHeldByAnother()) {
    const char* const path = dbmerger::InstanceLock::PATH;
    syslog(LOG_LOCAL1 | LOG_ERR, "Another daemon is running: it has locked %s", path);
    std::cerr << "zophotodbmerger: another daemon is running: it has locked " << path << '\n';
    return EXIT_FAILURE;
  }

  xercesc::XMLPlatformUtils::Initialize();
  try {
    ListenUntilTheServiceEnds();
  } catch (const std::exception& exception) {
    const auto* const log = util::Singleton<util::LoggerMgr>::Instance();
    if (log->Level() != 0) {
      log->Log(1, "src/zophotodbmerger/main", 110, "%s.", exception.what());
    }
    std::exit(EXIT_FAILURE);
  } catch (...) {
    // Not a std::exception: terminate the XML platform, then abort.
    xercesc::XMLPlatformUtils::Terminate();
    throw;
  }
  xercesc::XMLPlatformUtils::Terminate();
  return EXIT_SUCCESS;
}

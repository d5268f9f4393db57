#include "Transcoder.h"

#include "commandline/Parse.h"
#include "commandline/UsageError.h"
#include "service/Log.h"

#include <csignal>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <string>
#include <vector>

namespace {

using namespace orva;

/// Returns false when the user has asked for help or the version.
bool ParseArguments(const std::vector<std::string>& arguments) {
  CLI::App app("Makes a rendition of each photo on all volumes: a JPEG of at most 1,024 pixels.",
               "orva-transcoder");
  app.set_version_flag("--version", "orva-transcoder " PROGRAM_VERSION);
  app.footer("A service without options. Runs until a signal ends it. Exit status: 1 failed, 2 "
             "wrong\ncommand line. See orva-transcoder(8).");
  return commandline::Parse(app, arguments, false);
}

/// The working folder: the one that systemd has made, or the one that the user has.
std::string WorkingFolder() {
  const char* const folder = std::getenv("RUNTIME_DIRECTORY");
  return folder != nullptr ? folder : "/run/orva-transcoder";
}

} // namespace

int main(int count, char* arguments[]) {
  std::signal(SIGPIPE, SIG_IGN);
  try {
    if (ParseArguments({arguments + 1, arguments + count})) {
      transcoder::Transcoder(WorkingFolder()).Run();
    }
    return EXIT_SUCCESS;
  } catch (const commandline::UsageError& error) {
    commandline::Report(error);
    return commandline::EXIT_USAGE;
  } catch (const std::exception& error) {
    service::LogError(error.what());
    std::cerr << "orva-transcoder: " << error.what() << '\n';
    return EXIT_FAILURE;
  }
}

#include "commandline/Count.h"
#include "commandline/UsageError.h"
#include "orva-notify/CommandLine.h"
#include "orva-notify/Control.h"
#include "orva-notify/Service.h"
#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/FileDescriptor.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <string>
#include <vector>

namespace {

using namespace orva::notify;
using orva::core::ORVA_NOTIFICATION_SOCKET;

/// The content of the file; "-" is standard input.
std::string ReadFile(const std::string& name) {
  const bool isInput = name == "-";
  const orva::util::FileDescriptor file(isInput ? dup(STDIN_FILENO)
                                                : open(name.c_str(), O_RDONLY | O_CLOEXEC));
  const auto fail = [&] {
    throw orva::util::Exception("cannot read " + (isInput ? "standard input" : name) + ": " +
                                std::strerror(errno));
  };
  if (!file) {
    fail();
  }
  std::string content;
  std::vector<char> chunk(std::size_t{64} * 1024);
  ssize_t count = 0;
  do {
    count = read(file.Get(), chunk.data(), chunk.size());
    if (count > 0) {
      content.append(chunk.data(), static_cast<std::size_t>(count));
    }
  } while (count > 0 || (count == -1 && errno == EINTR));
  if (count == -1) {
    fail();
  }
  return content;
}

std::string MessageOf(const CommandLine& command) {
  return command.event ? Compose(*command.event, command.mountPoint) : ReadFile(command.rawFile);
}

void Serve(const CommandLine& command) {
  const char* const state = std::getenv("STATE_DIRECTORY"); // set by systemd
  Service(ORVA_NOTIFICATION_SOCKET, command.watch, command.directories,
          state != nullptr ? state : "")
      .Run();
}

void PrintClients(const char* what, std::size_t count) {
  std::cout << what << ' ' << orva::commandline::Count(static_cast<long long>(count), "client")
            << '\n';
}

void Send(const CommandLine& command) {
  const Request request{.kind = Request::Kind::Send,
                        .clients = command.clients,
                        .message = MessageOf(command),
                        .handled = command.handled,
                        .raw = !command.event};
  PrintClients(command.handled ? "handled by" : "sent to",
               Ask(ORVA_NOTIFICATION_SOCKET, request, command.wait));
}

void Drop(const CommandLine& command) {
  const Request request{.kind = Request::Kind::Drop, .clients = command.clients};
  PrintClients("dropped", Ask(ORVA_NOTIFICATION_SOCKET, request, command.wait));
}

void Execute(const CommandLine& command) {
  switch (command.action) {
  case CommandLine::Action::Serve:
    Serve(command);
    break;
  case CommandLine::Action::Send:
    Send(command);
    break;
  case CommandLine::Action::Drop:
    Drop(command);
    break;
  }
}

} // namespace

int main(int count, char* arguments[]) {
  // The service continues when its standard output is a pipe that was closed.
  std::signal(SIGPIPE, SIG_IGN);
  try {
    if (const auto command = ParseCommandLine({arguments + 1, arguments + count})) {
      Execute(*command);
    }
    return EXIT_SUCCESS;
  } catch (const orva::commandline::UsageError& error) {
    orva::commandline::Report(error);
    return orva::commandline::EXIT_USAGE;
  } catch (const std::exception& error) {
    std::cerr << "orva-notify: " << error.what() << '\n';
    return EXIT_FAILURE;
  }
}

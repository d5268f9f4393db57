#include "commandline/UsageError.h"
#include "orva-notify/CommandLine.h"
#include "orva-notify/Control.h"
#include "orva-notify/Service.h"
#include "orvautil/Core.h"
#include "orvautil/Exception.h"

#include <csignal>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <iterator>

namespace {

using namespace orva::notify;
using orva::core::ORVA_NOTIFICATION_SOCKET;

constexpr int EXIT_USAGE = 2;

std::string ReadAll(std::istream& stream) {
  return {std::istreambuf_iterator<char>(stream), std::istreambuf_iterator<char>()};
}

std::string ReadFile(const std::string& name) {
  if (name == "-") {
    return ReadAll(std::cin);
  }
  std::ifstream file(name, std::ios::binary);
  std::string content = ReadAll(file);
  if (!file) {
    throw orva::util::Exception("Cannot read '" + name + "'");
  }
  return content;
}

std::string MessageOf(const CommandLine& command) {
  return command.event ? Compose(*command.event, command.mountPoint) : ReadFile(command.rawFile);
}

void Serve(const CommandLine& command) {
  Service(ORVA_NOTIFICATION_SOCKET, command.watch, command.directories).Run();
}

void PrintCount(const char* what, std::size_t count) {
  std::cout << what << ' ' << count << (count == 1 ? " client\n" : " clients\n");
}

void Send(const CommandLine& command) {
  const Request request{.kind = Request::Kind::Send,
                        .clients = command.clients,
                        .message = MessageOf(command),
                        .handled = command.handled,
                        .raw = !command.event};
  PrintCount(command.handled ? "handled by" : "sent to",
             Ask(ORVA_NOTIFICATION_SOCKET, request, command.wait));
}

void Drop(const CommandLine& command) {
  const Request request{.kind = Request::Kind::Drop, .clients = command.clients};
  PrintCount("dropped", Ask(ORVA_NOTIFICATION_SOCKET, request, command.wait));
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
    std::cerr << "orva-notify: " << error.what() << "\nTry 'orva-notify --help'.\n";
    return EXIT_USAGE;
  } catch (const std::exception& error) {
    std::cerr << "orva-notify: " << error.what() << '\n';
    return EXIT_FAILURE;
  }
}

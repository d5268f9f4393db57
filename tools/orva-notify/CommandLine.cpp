#include "orva-notify/CommandLine.h"

#include <algorithm>
#include <charconv>
#include <deque>

namespace orva::notify {
namespace {

using Action = CommandLine::Action;

/// The arguments that are still to be read.
class Arguments {
public:
  explicit Arguments(const std::vector<std::string>& arguments)
      : rest_(arguments.begin(), arguments.end()) {}

  bool Empty() const { return rest_.empty(); }

  /// The next one; `what` names it for the message when there is none.
  std::string Take(const std::string& what) {
    if (rest_.empty()) {
      throw UsageError("missing " + what);
    }
    std::string argument = rest_.front();
    rest_.pop_front();
    return argument;
  }

private:
  std::deque<std::string> rest_;
};

Action ActionFromWord(const std::string& word) {
  if (word == "serve") {
    return Action::Serve;
  }
  if (word == "send") {
    return Action::Send;
  }
  if (word == "drop") {
    return Action::Drop;
  }
  throw UsageError("unknown command '" + word + "'");
}

unsigned Number(const std::string& option, const std::string& text) {
  constexpr unsigned MAXIMUM = 100'000;
  unsigned number = 0;
  const char* const end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, number);
  if (error != std::errc() || stop != end || number > MAXIMUM) {
    throw UsageError(option + " takes a number up to " + std::to_string(MAXIMUM) + ", not '" +
                     text + "'");
  }
  return number;
}

void ReadOption(CommandLine& command, const std::string& option, Arguments& arguments) {
  const bool asks = command.action == Action::Send || command.action == Action::Drop;
  if (option == "--watch" && command.action == Action::Serve) {
    command.watch = true;
  } else if (option == "--clients" && asks) {
    command.clients = Number(option, arguments.Take("number after " + option));
  } else if (option == "--wait" && asks) {
    command.wait = std::chrono::seconds(Number(option, arguments.Take("number after " + option)));
  } else if (option == "--raw" && command.action == Action::Send) {
    command.rawFile = arguments.Take("file after --raw");
  } else {
    throw UsageError("unknown option '" + option + "'");
  }
}

void ReadOperands(CommandLine& command, std::deque<std::string> operands) {
  if (command.action == Action::Send && command.rawFile.empty()) {
    if (operands.size() < 2) {
      throw UsageError("send takes an event and a mount point, or --raw FILE");
    }
    command.event = EventFromWord(operands[0]);
    if (!command.event) {
      throw UsageError("unknown event '" + operands[0] + "'");
    }
    command.mountPoint = operands[1];
    operands.erase(operands.begin(), operands.begin() + 2);
  }
  if (!operands.empty()) {
    throw UsageError("unexpected argument '" + operands.front() + "'");
  }
}

bool IsHelp(const std::string& argument) {
  return argument == "--help" || argument == "-h";
}

} // namespace

CommandLine ParseCommandLine(const std::vector<std::string>& arguments) {
  CommandLine command;
  if (std::any_of(arguments.begin(), arguments.end(), IsHelp)) {
    return command;
  }
  Arguments rest(arguments);
  command.action = ActionFromWord(rest.Take("command"));
  std::deque<std::string> operands;
  while (!rest.Empty()) {
    const std::string argument = rest.Take("argument");
    if (argument.starts_with("-")) {
      ReadOption(command, argument, rest);
    } else {
      operands.push_back(argument);
    }
  }
  ReadOperands(command, std::move(operands));
  return command;
}

const char* const HELP =
    "The appliance's notification service, for machines without the appliance.\n"
    "\n"
    "  orva-notify serve [--watch]\n"
    "      Listens on the notification socket and sends every client what the\n"
    "      commands below hand in, until SIGINT or SIGTERM. Prints a line for\n"
    "      whatever happens.\n"
    "      --watch      also announces mounts and unmounts directly below /shares; a\n"
    "                   new client first hears of the volumes that are there\n"
    "\n"
    "  orva-notify send [OPTIONS] EVENT MOUNT\n"
    "      Announces an event of the volume at MOUNT to every client. EVENT is one of\n"
    "      plugged, unplugged, scanned, transcoded, end, purged.\n"
    "\n"
    "  orva-notify send [OPTIONS] --raw FILE\n"
    "      Sends the bytes of FILE (\"-\": standard input) as one message.\n"
    "\n"
    "  orva-notify drop [OPTIONS]\n"
    "      Closes the clients' connections; the service goes on listening. Messages\n"
    "      that a client was too slow to take are lost to it.\n"
    "\n"
    "send and drop print how many clients they reached, once each has the message\n"
    "queued or is closed.\n"
    "      --clients N  first waits until at least N clients are connected\n"
    "      --wait S     gives up after S seconds (10)\n"
    "\n"
    "Exit status: 0 done, 1 failed (no service listens, too few clients), 2 wrong usage.\n";

} // namespace orva::notify

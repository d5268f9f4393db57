#include "orva-notify/CommandLine.h"

#include "commandline/Parse.h"
#include "commandline/Suggestion.h"
#include "orva-notify/MountInfo.h"

#include <filesystem>

namespace orva::notify {
namespace {

using Action = CommandLine::Action;
using commandline::UsageError;

constexpr long long MAXIMUM_NUMBER = 100'000;

/// Why `directory` cannot be a volume; empty if it can.
std::string WhyNoVolume(const std::string& directory) {
  const std::filesystem::path path(directory);
  if (!path.is_absolute()) {
    return "must be an absolute path, not '" + directory + "'";
  }
  if (path.lexically_normal().native() != directory ||
      (directory.size() > 1 && directory.ends_with('/'))) {
    return "must not contain '.', '..', '//' or a '/' at the end: '" + directory + "'";
  }
  return IsDirectlyBelowShares(directory)
             ? ""
             : "must be directly below /shares, not '" + directory + "'";
}

class Parser {
public:
  Parser() {
    commandline::SetUp(app_);
    app_.footer("Exit status: 0 done; 1 failed (no service listens, too few clients); 2 wrong "
                "command line.\nSee orva-notify(1).");
    AddServe();
    AddSend();
    AddDrop();
  }

  std::optional<CommandLine> Parse(const std::vector<std::string>& arguments) {
    if (!commandline::Parse(app_, arguments)) {
      return std::nullopt;
    }
    if (send_->parsed()) {
      command_.action = Action::Send;
      command_.event = EventFromWord(event_);
    } else if (drop_->parsed()) {
      command_.action = Action::Drop;
    }
    command_.wait = std::chrono::seconds(seconds_);
    return command_;
  }

private:
  void AddServe() {
    CLI::App* const serve =
        app_.add_subcommand("serve", "Listen on the notification socket and send every client the "
                                     "messages of\n'send', until SIGINT or SIGTERM");
    serve->add_flag("--watch", command_.watch,
                    "Also announce mounts and unmounts directly below /shares");
    serve
        ->add_option("--volume", command_.directories,
                     "Announce DIR, a plain directory directly below /shares,\n"
                     "as a volume while it exists; may be repeated")
        ->type_name("DIR")
        ->allow_extra_args(false)
        ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll)
        ->check(WhyNoVolume);
    serve->footer("A new client first receives what was announced of the volumes.\n"
                  "Prints a line for each event.");
  }

  void AddSend() {
    send_ = app_.add_subcommand("send", "Announce an event of a volume to every client");
    CLI::Option* const event =
        send_->add_option("EVENT", event_, "plugged, unplugged, scanned, transcoded, end or purged")
            ->type_name("");
    CLI::Option* const mountPoint =
        send_->add_option("MOUNT", command_.mountPoint, "Mount point of the volume, absolute")
            ->type_name("")
            ->check([](const std::string& path) {
              return path.starts_with('/')
                         ? std::string()
                         : "must be an absolute path such as /shares/Photos, not '" + path + "'";
            });
    CLI::Option* const rawFile =
        send_
            ->add_option("--raw", command_.rawFile,
                         "Send the bytes of FILE (-: standard input) as one message instead")
            ->type_name("FILE")
            ->check(commandline::NotEmpty());
    send_->callback([this, event, mountPoint, rawFile] {
      const bool isRaw = rawFile->count() > 0;
      const bool hasEvent = event->count() > 0;
      if (isRaw && hasEvent) {
        throw UsageError("EVENT and --raw cannot be combined");
      }
      if (!isRaw && !hasEvent) {
        throw UsageError("EVENT and MOUNT are required, or --raw FILE");
      }
      if (hasEvent && !EventFromWord(event_)) {
        throw UsageError("unknown event: '" + event_ + "'" +
                         commandline::DidYouMean(event_, EventWords()));
      }
      if (hasEvent && mountPoint->count() == 0) {
        throw UsageError("MOUNT is required");
      }
    });
    send_->add_flag("--handled", command_.handled,
                    "Return only when every client has handled the message");
    AddRequestOptions(*send_);
    send_->footer("Returns when the message is queued for every client, and prints the number of "
                  "clients.\nObservers are not counted.");
  }

  void AddDrop() {
    drop_ =
        app_.add_subcommand("drop", "Close the connections of all clients; the service continues "
                                    "to listen");
    AddRequestOptions(*drop_);
    drop_->footer("Returns when all connections are closed, and prints the number of clients.\n"
                  "Observers are not counted.");
  }

  void AddRequestOptions(CLI::App& request) {
    request
        .add_option("--clients", command_.clients,
                    "First wait until at least NUMBER clients are "
                    "connected")
        ->type_name("NUMBER")
        ->transform(commandline::Decimal(0, MAXIMUM_NUMBER));
    request.add_option("--wait", seconds_, "Give up after this time")
        ->type_name("SECONDS")
        ->capture_default_str()
        ->transform(commandline::Decimal(0, MAXIMUM_NUMBER));
  }

  CLI::App app_{"Stands in for the appliance's notification service on machines without the "
                "appliance.",
                "orva-notify"};
  CLI::App* send_ = nullptr; // they belong to app_
  CLI::App* drop_ = nullptr;
  CommandLine command_;
  std::string event_;
  long long seconds_ = command_.wait.count();
};

} // namespace

std::optional<CommandLine> ParseCommandLine(const std::vector<std::string>& arguments) {
  return Parser().Parse(arguments);
}

} // namespace orva::notify

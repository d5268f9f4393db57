#include "commandline/Parse.h"

#include "commandline/Suggestion.h"

#include <algorithm>
#include <charconv>
#include <iostream>
#include <system_error>
#include <utility>

namespace orva::commandline {
namespace {

/// The command on the command line; null if there is none.
const CLI::App* CommandOf(const CLI::App& app) {
  const auto commands = app.get_subcommands();
  return commands.empty() ? nullptr : commands.front();
}

/// The names of the options that the command line may have.
std::vector<std::string> OptionNames(const CLI::App& app) {
  std::vector<std::string> names;
  for (const CLI::App* const part : {CommandOf(app), &app}) {
    if (part != nullptr) {
      for (const CLI::Option* const option : part->get_options()) {
        for (const std::string& name : option->get_lnames()) {
          names.push_back("--" + name);
        }
      }
    }
  }
  return names;
}

/// Adds the command help.
CLI::App* AddHelp(CLI::App& app) {
  CLI::App* const help = app.add_subcommand("help", "Print help, or the help of a command");
  help->add_option("COMMAND")->description("The command");
  help->footer("Options of all commands: " + app.get_name() + " --help");
  return help;
}

/// The help of `app`, or of its command `topic`. Throws UsageError.
std::string HelpText(const CLI::App& app, const std::string& topic) {
  if (topic.empty()) {
    return app.get_formatter()->make_help(&app, app.get_name(), CLI::AppFormatMode::Normal);
  }
  const auto commands = app.get_subcommands(
      [&topic](const CLI::App* command) { return command->get_name() == topic; });
  if (commands.empty()) {
    throw UsageError(UnknownCommand(app, topic), app.get_name());
  }
  return commands.front()->help(app.get_name());
}

/// The message for an unknown option, command or operand; otherwise that of `error`.
std::string Explain(const CLI::App& app, const CLI::ParseError& error) {
  const std::vector<std::string> rest = app.remaining(true);
  if (!rest.empty() && rest.front().starts_with('-')) {
    const std::string option = rest.front().substr(0, rest.front().find('='));
    return "unknown option: " + option + DidYouMean(option, OptionNames(app));
  }
  if (!rest.empty() && CommandOf(app) == nullptr && !app.get_subcommands({}).empty()) {
    return UnknownCommand(app, rest.front());
  }
  std::string message = error.what();
  if (dynamic_cast<const CLI::ExtrasError*>(&error) != nullptr) {
    // CLI11 would name all that follows, too, in reverse.
    return "unexpected argument: '" + rest.front() + "'";
  }
  if (dynamic_cast<const CLI::ArgumentMismatch*>(&error) != nullptr) {
    // "--wait: 1 required SECONDS missing", "watch was given a disallowed flag override"
    const std::string name = message.substr(0, message.find_first_of(": "));
    return message.ends_with(" missing") ? "option " + name + " needs a value"
                                         : "option --" + name + " takes no value";
  }
  if (dynamic_cast<const CLI::ValidationError*>(&error) != nullptr) {
    // "--wait: takes ...", "MOUNT: must ..."
    const auto colon = message.find(':');
    return (message.starts_with('-') ? "option " : "") + message.substr(0, colon) +
           message.substr(colon + 1);
  }
  return message;
}

} // namespace

CLI::Validator Decimal(long long minimum, long long maximum) {
  return {[minimum, maximum](std::string& text) {
            long long number = 0;
            const char* const end = text.data() + text.size();
            const auto [stop, error] = std::from_chars(text.data(), end, number);
            if (error != std::errc() || stop != end || number < minimum || number > maximum) {
              return "takes a number from " + std::to_string(minimum) + " to " +
                     std::to_string(maximum) + ", not '" + text + "'";
            }
            text = std::to_string(number);
            return std::string();
          },
          ""};
}

CLI::Validator OneOf(std::vector<std::string> words) {
  return {[words = std::move(words)](const std::string& text) {
            if (std::ranges::find(words, text) != words.end()) {
              return std::string();
            }
            std::string all = words.front();
            for (std::size_t i = 1; i < words.size(); ++i) {
              all += (i + 1 == words.size() ? " or " : ", ") + words[i];
            }
            return "takes " + all + ", not '" + text + "'";
          },
          ""};
}

CLI::Validator NotEmpty() {
  return {[](const std::string& text) {
            return text.empty() ? std::string("must not be empty") : std::string();
          },
          ""};
}

void SetUp(CLI::App& app) {
  // With a minimum of one, CLI11 would not name an unknown command.
  app.require_subcommand(0, 1);
  app.fallthrough();
  app.set_version_flag("--version", app.get_name() + " " PROGRAM_VERSION);
  app.option_defaults()
      ->multi_option_policy(CLI::MultiOptionPolicy::TakeLast)
      ->disable_flag_override();
}

bool Parse(CLI::App& app, std::vector<std::string> arguments, bool needsCommand) {
  const CLI::App* const help = app.get_subcommands({}).empty() ? nullptr : AddHelp(app);
  const auto fail = [&app](const std::string& message) {
    const CLI::App* const command = CommandOf(app);
    throw UsageError(message,
                     app.get_name() + (command == nullptr ? "" : ' ' + command->get_name()));
  };
  // For "--name=" CLI11 would take the next argument as the value.
  const auto end = std::ranges::find(arguments, "--");
  const auto empty = std::find_if(arguments.begin(), end, [](const std::string& argument) {
    return argument.starts_with("--") && argument.find('=') == argument.size() - 1;
  });
  if (empty != end) {
    fail("option " + empty->substr(0, empty->size() - 1) + " needs a value");
  }
  try {
    std::ranges::reverse(arguments); // as CLI11 takes them
    app.parse(std::move(arguments));
    if (needsCommand && CommandOf(app) == nullptr) {
      fail("a command is required");
    }
  } catch (const CLI::Success& request) {
    app.exit(request);
    return false;
  } catch (const CLI::ParseError& error) {
    fail(Explain(app, error));
  } catch (const UsageError& error) {
    fail(error.what());
  }
  if (help != nullptr && help->parsed()) {
    const auto topic = help->get_option("COMMAND")->results();
    std::cout << HelpText(app, topic.empty() ? "" : topic.front());
    return false;
  }
  return true;
}

std::string UnknownCommand(const CLI::App& app, const std::string& word) {
  std::vector<std::string> names;
  for (const CLI::App* const command : app.get_subcommands({})) {
    names.push_back(command->get_name());
  }
  return "unknown command: '" + word + "'" + DidYouMean(word, names);
}

} // namespace orva::commandline

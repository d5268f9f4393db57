#include "Activity.h"
#include "Commands.h"
#include "Locator.h"
#include "MergedDatabase.h"
#include "Text.h"

#include "commandline/Parse.h"

#include <SQLiteCpp/Exception.h>

#include <unistd.h>

#include <cstdlib>
#include <exception>
#include <iostream>
#include <limits>
#include <string>
#include <utility>
#include <vector>

namespace {

using namespace orva::zophotos;
using orva::commandline::UsageError;

/// The command line.
class Options {
public:
  Options() {
    orva::commandline::SetUp(app_);
    app_.add_option("--database", database_,
                    "Read this database instead of the one named by the daemon's locator file")
        ->type_name("FILE")
        ->check(orva::commandline::NotEmpty());
    app_.add_flag("--json", json_, "Print JSON: one object, or one object per line");
    app_.add_flag("--escape", escape_,
                  "Escape the names that ls, find, failed and export print also if the output is "
                  "not a terminal");
    app_.add_option("--color", color_, "Print folders in a colour; auto: on a terminal")
        ->type_name("auto|always|never")
        ->check(orva::commandline::OneOf({"auto", "always", "never"}));
    app_.footer(
        "Without a command, zophotos shows the status.\n"
        "Exit status: 0 success; 1 damaged, incomplete or not found; 2 wrong command line;\n3 no "
        "database now; 4 locked, try again; 5 any other error. See zophotos(1).");
    AddCommands();
  }

  /// Returns false when the arguments ask for help or the version, which are then on standard
  /// output. Throws UsageError.
  bool Parse(std::vector<std::string> arguments) {
    try {
      if (!orva::commandline::Parse(app_, std::move(arguments), false)) {
        return false;
      }
    } catch (const UsageError& error) {
      const std::string hint = PlaceHint();
      throw UsageError(hint.empty() ? error.what() + DashHint() : hint, error.Command());
    }
    return true;
  }

  /// Runs the command. Throws Failure.
  ExitStatus Run() const {
    if (watch_->parsed()) {
      return WatchDatabase([this] { return FindPath(); }, OutputForm());
    }
    if (follow_) {
      return FollowStatus([this] { return FindPath(); },
                          {.services = database_.empty(), .redraws = IsCapableTerminal()},
                          OutputForm());
    }
    if (failed_->parsed()) {
      return ListFailedPhotos([this] { return FindPath(); }, Services(), path_, Escapes(),
                              OutputForm());
    }
    const std::string path = FindPath();
    try {
      return RunOn(path);
    } catch (const SQLite::Exception& error) {
      throw Failure(IsLocked(error) ? ExitStatus::Locked : ExitStatus::Failed,
                    orva::zophotos::Explain(error, path));
    }
  }

private:
  std::string FindPath() const { return database_.empty() ? FindDatabase() : database_; }

  /// What the services of this machine are doing; nothing for another machine's database.
  Activity Services() const { return database_.empty() ? ReadActivity() : Activity(); }

  Form OutputForm() const { return json_ ? Form::JsonText : Form::Text; }

  /// Whether to escape names where each is a line of its own.
  bool Escapes() const { return escape_ || Colors() || IsTerminal(); }

  static std::string Variable(const char* name) {
    const char* const value = std::getenv(name);
    return value == nullptr ? "" : value;
  }

  /// Whether the output is a terminal with colours and a cursor that moves.
  static bool IsCapableTerminal() {
    const std::string terminal = Variable("TERM");
    return IsTerminal() && !terminal.empty() && terminal != "dumb";
  }

  /// Whether to print folders in a colour.
  bool Colors() const {
    return color_ == "always" ||
           (color_ == "auto" && IsCapableTerminal() && Variable("NO_COLOR").empty());
  }

  /// The command on the command line; null if there is none.
  const CLI::App* Command() const {
    const auto commands = app_.get_subcommands();
    return commands.empty() ? nullptr : commands.front();
  }

  /// The message for an option of a command that is before the command, or without one; otherwise
  /// empty.
  std::string PlaceHint() const {
    const std::vector<std::string> rest = app_.remaining(true);
    if (rest.empty() || rest.front() == "--") {
      return "";
    }
    const CLI::App* command = Command();
    if (command == nullptr) {
      command = status_;
    }
    const std::string option = rest.front().substr(0, rest.front().find('='));
    return option.starts_with('-') && command->get_option_no_throw(option) != nullptr
               ? "option " + option + " belongs after the command: zophotos " +
                     command->get_name() + " " + option
               : "";
  }

  /// How to search for a name that was taken for an unknown option; otherwise empty.
  std::string DashHint() const {
    const std::vector<std::string> rest = app_.remaining(true);
    if (!find_->parsed() || rest.empty() || !rest.front().starts_with('-')) {
      return "";
    }
    return "; to search for a name that begins with a dash: zophotos find -- '" + rest.front() +
           "'";
  }

  ExitStatus RunOn(const std::string& path) const {
    const Form form = OutputForm();
    if (Command() == nullptr || status_->parsed()) {
      return ShowStatus(path, Services(), form);
    }
    if (ls_->parsed()) {
      return List(path, {.path = path_, .isLong = long_, .escapes = Escapes(), .colors = Colors()},
                  form);
    }
    if (tree_->parsed()) {
      return ShowTree(path, path_, levels_, Colors(), form);
    }
    if (find_->parsed()) {
      Search search = search_;
      search.escapes = Escapes();
      search.colors = Colors();
      search.hints = isatty(STDERR_FILENO) != 0;
      return FindItems(path, search, form);
    }
    if (check_->parsed()) {
      return CheckDatabase(path, form);
    }
    const ExportFormat format = jsonLines_ || json_ ? ExportFormat::JsonLines : ExportFormat::Csv;
    const bool escapes = escape_ || IsTerminal();
    return changes_.state.empty() ? ExportFiles(path, format, escapes)
                                  : ExportChanges(path, changes_, format, escapes);
  }

  void AddCommands() {
    status_ = app_.add_subcommand("status", "Show the database and the progress of each volume");
    status_->add_flag("-f,--follow", follow_,
                      "Show the progress again after each change until interrupted");
    ls_ = app_.add_subcommand("ls", "List a folder, or show a file");
    ls_->add_flag("-l,--long", long_, "Add times, numbers of files and volumes");
    ls_->add_flag_callback(
        "-1", [] {}, "Print one name per line, which is the default");
    ls_->add_option("PATH", path_, "The folder or file, absolute or relative to /shares")
        ->default_str("/shares");
    tree_ =
        app_.add_subcommand("tree", "Show all folders below a folder, with their numbers of files");
    tree_->add_option("-L,--level", levels_, "Show only so many levels of folders")
        ->type_name("NUMBER")
        ->transform(orva::commandline::Decimal(1, 1'000'000));
    tree_->add_option("FOLDER", path_, "The folder, absolute or relative to /shares")
        ->default_str("/shares");
    find_ = app_.add_subcommand("find", "Find files and folders by name");
    find_
        ->add_option("PATTERN", search_.pattern,
                     "Shell pattern for the name, or for the whole path if it has a /, absolute or "
                     "relative to /shares; without wildcards: text that the name or path contains")
        ->required();
    find_->add_flag("-i,--ignore-case", search_.ignoreCase, "Ignore case");
    find_->add_flag("-0,--null", search_.nullTerminated,
                    "Print paths unescaped, each followed by a NUL");
    find_
        ->add_option_function<std::string>(
            "--type",
            [this](const std::string& type) {
              search_.folders = type != "f";
              search_.files = type != "d";
            },
            "Find only files (f) or only folders (d)")
        ->type_name("f|d")
        ->check(orva::commandline::OneOf({"f", "d"}));
    find_->callback([this] {
      if (search_.nullTerminated && json_) {
        throw UsageError("--null and --json cannot be combined");
      }
    });
    failed_ = app_.add_subcommand("failed",
                                  "List the photos that could not be rendered, with the reasons");
    failed_->add_option("PATH", path_,
                        "Only photos of this volume or in this folder, absolute or relative to "
                        "/shares");
    check_ = app_.add_subcommand("check", "Check the database for damage");
    watch_ = app_.add_subcommand("watch", "Print a line for each change until interrupted");
    AddExport();
    for (CLI::App* const command : app_.get_subcommands({})) {
      command->footer("Options of all commands: zophotos --help");
    }
  }

  void AddExport() {
    export_ = app_.add_subcommand("export", "Print every file with its full path");
    export_->add_flag("--csv", csv_,
                      "Print comma-separated values with a line of headings (the default)");
    export_->add_flag("--jsonl", jsonLines_, "Print one JSON object per line, like --json");
    export_
        ->add_option("--changes", changes_.state,
                     "Print only the files that were added and removed since the last export with "
                     "this file, which is created or replaced")
        ->type_name("STATE")
        ->check(orva::commandline::NotEmpty());
    export_->add_flag("--whole", changes_.whole,
                      "With --changes: print all files, for a reader that has missed changes");
    export_->callback([this] {
      if (changes_.whole && changes_.state.empty()) {
        throw UsageError("--whole needs --changes");
      }
      if (csv_ && (jsonLines_ || json_)) {
        throw UsageError(std::string("--csv and ") + (jsonLines_ ? "--jsonl" : "--json") +
                         " cannot be combined");
      }
    });
  }

  CLI::App app_{"Shows what is in the merged photo database. Never changes it.", "zophotos"};
  CLI::App* status_ = nullptr; // all of these are owned by app_
  CLI::App* ls_ = nullptr;
  CLI::App* tree_ = nullptr;
  CLI::App* find_ = nullptr;
  CLI::App* failed_ = nullptr;
  CLI::App* check_ = nullptr;
  CLI::App* watch_ = nullptr;
  CLI::App* export_ = nullptr;
  std::string database_;
  std::string color_ = "auto";
  std::string path_; ///< of ls, tree and failed
  std::size_t levels_ = std::numeric_limits<std::size_t>::max();
  Search search_;
  Changes changes_;
  bool follow_ = false;
  bool json_ = false;
  bool escape_ = false;
  bool long_ = false;
  bool csv_ = false;
  bool jsonLines_ = false;
};

int Finish(ExitStatus status) {
  if (!std::cout.flush()) {
    std::cerr << "zophotos: cannot write to standard output\n";
    return static_cast<int>(ExitStatus::Failed);
  }
  return static_cast<int>(status);
}

ExitStatus Run(std::vector<std::string> arguments) {
  try {
    Options options;
    return options.Parse(std::move(arguments)) ? options.Run() : ExitStatus::Success;
  } catch (const UsageError& error) {
    orva::commandline::Report(error, Printable);
    return ExitStatus::Usage;
  } catch (const Failure& failure) {
    std::cerr << "zophotos: " << Printable(failure.what()) << '\n';
    return failure.Status();
  }
}

} // namespace

int main(int argc, char** argv) {
  std::ios::sync_with_stdio(false);
  try {
    return Finish(Run({argv + 1, argv + argc}));
  } catch (const std::exception& error) {
    std::cerr << "zophotos: " << Printable(error.what()) << '\n';
    return static_cast<int>(ExitStatus::Failed);
  }
}

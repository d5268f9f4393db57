#include "Commands.h"
#include "Locator.h"
#include "MergedDatabase.h"
#include "Text.h"

#include <CLI/CLI.hpp>
#include <SQLiteCpp/Exception.h>

#include <exception>
#include <iostream>
#include <string>

namespace {

using namespace orva::zophotos;

/// The command line.
class Options {
public:
  Options() {
    app_.require_subcommand(0, 1); // none is an error of ours, so that an unknown one is named
    app_.fallthrough();
    app_.set_version_flag("--version", "zophotos " ZOPHOTOS_VERSION);
    app_.add_option("--database", database_,
                    "Read this database instead of the one that the daemon's locator file names")
        ->type_name("FILE")
        ->check([](const std::string& path) {
          return path.empty() ? std::string("it is empty") : std::string();
        });
    app_.add_flag("--json", json_, "Print JSON: one object, or one a line from a list");
    app_.failure_message([](const CLI::App* /*app*/, const CLI::Error& error) {
      return std::string("zophotos: ") + error.what() + "\nTry 'zophotos --help'.\n";
    });
    app_.footer("Exit status: 0 all right; 1 damaged, or nothing found; 2 wrong command line; 3 no "
                "database now;\n4 locked, try again; 5 anything else. See zophotos(1).");
    AddCommands();
  }

  /// Throws CLI::ParseError, for help, too.
  void Parse(int argc, char** argv) {
    app_.parse(argc, argv);
    if (app_.get_subcommands().empty()) {
      throw CLI::RequiredError::Subcommand(1);
    }
  }

  /// Prints what a failed Parse is about; returns the exit status.
  ExitStatus Explain(const CLI::ParseError& error) const {
    return app_.exit(error) == 0 ? ExitStatus::Success : ExitStatus::Usage;
  }

  /// Runs the command. Throws what it throws.
  ExitStatus Run() const {
    if (watch_->parsed()) {
      return WatchDatabase([this] { return FindPath(); }, OutputForm());
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

  Form OutputForm() const { return json_ ? Form::Json : Form::Text; }

  ExitStatus RunOn(const std::string& path) const {
    const Form form = OutputForm();
    if (status_->parsed()) {
      return ShowStatus(path, form);
    }
    if (ls_->parsed()) {
      return ListFolder(path, folder_, long_, form);
    }
    if (tree_->parsed()) {
      return ShowTree(path, folder_, form);
    }
    if (find_->parsed()) {
      return FindItems(path, search_, form);
    }
    if (check_->parsed()) {
      return CheckDatabase(path, form);
    }
    return ExportFiles(path, csv_ ? ExportFormat::Csv : ExportFormat::JsonLines);
  }

  void AddCommands() {
    status_ = app_.add_subcommand("status", "Where the database is, and how far each volume is");
    ls_ = app_.add_subcommand("ls", "What is in a folder");
    ls_->add_flag("-l,--long", long_, "With times, numbers of files and volumes");
    tree_ = app_.add_subcommand("tree", "All folders below one, with their numbers of files");
    for (CLI::App* const command : {ls_, tree_}) {
      command->add_option("FOLDER", folder_, "The folder, from /shares on")->default_str("/shares");
    }
    find_ = app_.add_subcommand("find", "Files and folders by name");
    find_
        ->add_option("PATTERN", search_.pattern,
                     "A shell pattern for the name, or for the whole path when it has a /; without "
                     "wildcards, a part of it")
        ->required();
    find_->add_flag("-i,--ignore-case", search_.ignoreCase, "Take A for a");
    find_->add_flag("-0,--null", search_.nullTerminated,
                    "Print paths as they are, each with a NUL behind it");
    find_->callback([this] {
      if (search_.nullTerminated && json_) {
        throw CLI::ValidationError("find", "takes one of --null and --json");
      }
    });
    check_ = app_.add_subcommand("check", "What is wrong with the database");
    watch_ = app_.add_subcommand("watch", "A line for each change, until interrupted");
    AddExport();
    for (CLI::App* const command : app_.get_subcommands({})) {
      command->footer("Options of every command: zophotos --help");
    }
  }

  void AddExport() {
    export_ = app_.add_subcommand("export", "Every file with its full path");
    export_->add_flag("--csv", csv_, "Comma-separated values with a heading");
    export_->add_flag("--jsonl", jsonLines_, "One JSON object a line; the same as --json");
    export_->callback([this] {
      if (csv_ == (jsonLines_ || json_)) {
        throw CLI::ValidationError("export", "takes one of --csv and --jsonl");
      }
    });
  }

  CLI::App app_{"Looks into the merged photo database. Only reads."};
  CLI::App* status_ = nullptr; // they belong to app_
  CLI::App* ls_ = nullptr;
  CLI::App* tree_ = nullptr;
  CLI::App* find_ = nullptr;
  CLI::App* check_ = nullptr;
  CLI::App* watch_ = nullptr;
  CLI::App* export_ = nullptr;
  std::string database_;
  std::string folder_;
  Search search_;
  bool json_ = false;
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

ExitStatus Run(int argc, char** argv) {
  Options options;
  try {
    options.Parse(argc, argv);
    return options.Run();
  } catch (const CLI::ParseError& error) {
    return options.Explain(error);
  } catch (const Failure& failure) {
    std::cerr << "zophotos: " << Printable(failure.what()) << '\n';
    return failure.Status();
  }
}

} // namespace

int main(int argc, char** argv) {
  std::ios::sync_with_stdio(false);
  try {
    return Finish(Run(argc, argv));
  } catch (const std::exception& error) {
    std::cerr << "zophotos: " << Printable(error.what()) << '\n';
    return static_cast<int>(ExitStatus::Failed);
  }
}

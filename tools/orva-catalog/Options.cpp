#include "Options.h"

#include "commandline/Parse.h"

namespace orva::catalog {
namespace {

using commandline::Decimal;

// More would overflow the arithmetic; no volume has so many files.
constexpr long long MAXIMUM_COUNT = 1'000'000'000;

class Parser {
public:
  Parser() {
    commandline::SetUp(app_);
    app_.footer(
        "Exit status: 0 done; 1 failed, the catalog's content is unchanged; 2 wrong command "
        "line.\nSee orva-catalog(1).");
    AddIndex();
    AddGenerate();
  }

  std::optional<Options> Parse(const std::vector<std::string>& arguments) {
    if (!commandline::Parse(app_, arguments)) {
      return std::nullopt;
    }
    if (generate_->parsed()) {
      options_.command = restamp_ ? Command::Restamp : Command::Generate;
      options_.plan.names = names_ == "camera" ? Names::Camera : Names::Unique;
      options_.plan.tree = tree_ == "deep" ? Tree::Deep : Tree::Flat;
    }
    return options_;
  }

private:
  void AddIndex() {
    CLI::App* const index =
        app_.add_subcommand("index", "Bring the catalog up to date with the files on the volume");
    AddMountPoint(*index);
    index->footer(
        "New and changed photos get a finished transcoding. Files that are gone are marked "
        "deleted.\nLinks are not followed. What is mounted below MOUNT belongs to the "
        "volume.");
  }

  void AddGenerate() {
    generate_ =
        app_.add_subcommand("generate", "Replace the catalog's content with made-up photos");
    AddMountPoint(*generate_);
    const std::vector<CLI::Option*> plan{
        generate_->add_option("--files", options_.plan.files, "Number of photos")
            ->type_name("NUMBER")
            ->transform(Decimal(0, MAXIMUM_COUNT)),
        generate_->add_option("--per-folder", options_.plan.perFolder, "Photos in each folder")
            ->type_name("NUMBER")
            ->transform(Decimal(1, MAXIMUM_COUNT)),
        generate_
            ->add_option("--names", names_,
                         "unique: every photo has its own name;\n"
                         "camera: every folder has the same names, IMG_0001.JPG and so on")
            ->type_name("unique|camera")
            ->check(commandline::OneOf({"unique", "camera"})),
        generate_
            ->add_option("--tree", tree_,
                         "flat: all folders are directly in the volume;\n"
                         "deep: every folder contains eight more")
            ->type_name("flat|deep")
            ->check(commandline::OneOf({"flat", "deep"}))};
    generate_->add_flag("--restamp", restamp_,
                        "Keep the content; give every transcoding a new stamp");
    generate_->footer("Without --restamp, all other options are required.");
    generate_->callback([this, plan] {
      const auto missing = std::ranges::find_if(
          plan, [](const CLI::Option* option) { return option->count() == 0; });
      if (!restamp_ && missing != plan.end()) {
        throw CLI::RequiredError((*missing)->get_name());
      }
    });
  }

  void AddMountPoint(CLI::App& command) {
    command.add_option("MOUNT", options_.mountPoint, "Mount point of the volume")
        ->required()
        ->type_name("")
        ->check(commandline::NotEmpty());
  }

  CLI::App app_{
      "Fills the media catalog of a volume, as the appliance's indexer and transcoder do.",
      "orva-catalog"};
  CLI::App* generate_ = nullptr; // belongs to app_
  Options options_;
  std::string names_;
  std::string tree_;
  bool restamp_ = false;
};

} // namespace

std::optional<Options> ParseOptions(const std::vector<std::string>& arguments) {
  return Parser().Parse(arguments);
}

} // namespace orva::catalog

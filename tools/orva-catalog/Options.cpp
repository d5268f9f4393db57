#include "Options.h"

#include <algorithm>
#include <charconv>
#include <utility>

namespace orva::catalog {
namespace {

// More would only overflow the arithmetic; no volume comes near.
constexpr long long MAXIMUM_COUNT = 1'000'000'000;

long long ParseCount(const std::string& option, const std::string& text, long long minimum) {
  long long count = 0;
  const char* const end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, count);
  if (error != std::errc() || stop != end || count < minimum || count > MAXIMUM_COUNT) {
    throw UsageError(option + " takes a number from " + std::to_string(minimum) + " to " +
                     std::to_string(MAXIMUM_COUNT) + ", not \"" + text + "\"");
  }
  return count;
}

template <typename Choice>
Choice ParseChoice(const std::string& option, const std::string& text,
                   std::pair<const char*, Choice> first, std::pair<const char*, Choice> second) {
  if (text == first.first) {
    return first.second;
  }
  if (text == second.first) {
    return second.second;
  }
  throw UsageError(option + " takes " + first.first + " or " + second.first + ", not \"" + text +
                   "\"");
}

void SetGenerateOption(GeneratorPlan& plan, const std::string& option, const std::string& value) {
  if (option == "--files") {
    plan.files = ParseCount(option, value, 0);
  } else if (option == "--per-folder") {
    plan.perFolder = ParseCount(option, value, 1);
  } else if (option == "--names") {
    plan.names =
        ParseChoice<Names>(option, value, {"unique", Names::Unique}, {"camera", Names::Camera});
  } else if (option == "--tree") {
    plan.tree = ParseChoice<Tree>(option, value, {"flat", Tree::Flat}, {"deep", Tree::Deep});
  } else {
    throw UsageError("unknown option \"" + option + "\"");
  }
}

/// Reads the options of generate, which follow the mount point.
void ParseGenerate(const std::vector<std::string>& arguments, Options& options) {
  std::vector<std::string> missing = {"--files", "--per-folder", "--names", "--tree"};
  for (std::size_t i = 2; i < arguments.size(); ++i) {
    const std::string& option = arguments[i];
    if (option == "--restamp") {
      options.command = Command::Restamp;
      continue;
    }
    if (!option.starts_with("--")) {
      throw UsageError("unexpected argument \"" + option + "\"");
    }
    if (i + 1 == arguments.size()) {
      throw UsageError(option + " needs a value");
    }
    SetGenerateOption(options.plan, option, arguments[++i]);
    std::erase(missing, option);
  }
  if (options.command == Command::Generate && !missing.empty()) {
    throw UsageError("generate needs " + missing.front());
  }
}

} // namespace

const char* const HELP =
    R"(Usage: orva-catalog index MOUNT
       orva-catalog generate MOUNT --files N --per-folder M
                    --names unique|camera --tree flat|deep
       orva-catalog generate MOUNT --restamp
       orva-catalog --help

Fills the media catalog of the volume mounted at MOUNT, as the appliance's indexer and
transcoder do.

index     walks the volume and brings the catalog up to date: new and changed photos
          are entered with a finished transcoding, vanished ones are marked deleted.
          Links are not followed; what is mounted below MOUNT belongs to the volume.
generate  replaces the catalog's content by N photos that need not exist, M to a folder.
  --names unique   every photo has a name of its own
  --names camera   the same names in every folder: IMG_0001.JPG, IMG_0002.JPG, ...
  --tree flat      all folders lie directly in the volume
  --tree deep      every folder holds eight further ones
  --restamp        leaves the content alone and stamps every transcoding anew

Exit status: 0 when done, 1 after a failure, which leaves the catalog's content as it was,
2 when the arguments make no sense.
)";

Options ParseOptions(const std::vector<std::string>& arguments) {
  Options options;
  if (std::find(arguments.begin(), arguments.end(), "--help") != arguments.end()) {
    return options;
  }
  if (arguments.empty()) {
    throw UsageError("index or generate?");
  }

  if (arguments[0] == "index") {
    options.command = Command::Index;
  } else if (arguments[0] == "generate") {
    options.command = Command::Generate;
  } else {
    throw UsageError("unknown command \"" + arguments[0] + "\"");
  }

  if (arguments.size() < 2 || arguments[1].empty() || arguments[1].starts_with("--")) {
    throw UsageError(arguments[0] + " needs the mount point of a volume");
  }
  options.mountPoint = arguments[1];

  if (options.command == Command::Generate) {
    ParseGenerate(arguments, options);
  } else if (arguments.size() > 2) {
    throw UsageError("unexpected argument \"" + arguments[2] + "\"");
  }
  return options;
}

} // namespace orva::catalog

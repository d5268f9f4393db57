#include "Options.h"

#include "commandline/Parse.h"

#include <algorithm>
#include <cstddef>
#include <limits>
#include <string>
#include <utility>

namespace orva::bench {

namespace {

/// The items of a comma-separated list; one empty item for an empty list.
std::vector<std::string> Split(const std::string& list) {
  std::vector<std::string> items;
  std::size_t begin = 0;
  for (std::size_t end = list.find(','); end != std::string::npos; end = list.find(',', begin)) {
    items.push_back(list.substr(begin, end - begin));
    begin = end + 1;
  }
  items.push_back(list.substr(begin));
  return items;
}

/// For Option::check: takes a comma-separated list of what `item` takes. CLI11's own lists drop
/// empty items, and a repeated option adds to the list.
CLI::Validator ListOf(CLI::Validator item) {
  return {[item = std::move(item)](const std::string& list) {
            for (const std::string& text : Split(list)) {
              std::string error = text.empty() ? "has an empty item" : item(text);
              if (!error.empty()) {
                return error;
              }
            }
            return std::string();
          },
          ""};
}

} // namespace

std::optional<Options> ParseOptions(const std::vector<std::string>& arguments) {
  constexpr int MAXIMUM = std::numeric_limits<int>::max();
  Options options;
  bool quick = false;
  long long limit = options.limit.count();
  std::string sizes;
  std::string shapes;

  CLI::App app("Compares the daemon with the floor and the horizon; doc/performance.md explains "
               "the figures.",
               "bench");
  app.set_version_flag("--version", "bench " PROGRAM_VERSION);
  app.option_defaults()->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
  app.add_flag("--quick", quick, "Leave out the catalogs of 1,000,000 files");
  app.add_option("--sizes", sizes,
                 "Files of the catalogs (10000,100000,1000000); the shapes folders, same-names and "
                 "covers have fixed sizes")
      ->type_name("N,...")
      ->check(ListOf(commandline::Decimal(1, MAXIMUM)));
  app.add_option("--shapes", shapes,
                 "Shapes of the catalogs "
                 "(unique,camera,flat,deep,restamped,folders,same-names,covers)")
      ->type_name("NAME,...")
      ->check(ListOf(CLI::IsMember(options.shapes)));
  app.add_option("--pairs", options.pairs, "How often each measurement is made")
      ->type_name("N")
      ->capture_default_str()
      ->transform(commandline::Decimal(1, MAXIMUM));
  app.add_option("--limit", limit, "Give up a merge after this time; checked about once a minute")
      ->type_name("SECONDS")
      ->capture_default_str()
      ->transform(commandline::Decimal(1, MAXIMUM));
  if (!commandline::Parse(app, arguments, false)) {
    return std::nullopt;
  }

  if (!sizes.empty()) {
    options.sizes.clear();
    for (const std::string& size : Split(sizes)) {
      options.sizes.push_back(std::stoll(size));
    }
  }
  if (!shapes.empty()) {
    options.shapes = Split(shapes);
  }
  if (quick) {
    std::erase_if(options.sizes, [](long long size) { return size >= 1'000'000; });
  }
  std::ranges::sort(options.sizes);
  options.limit = std::chrono::seconds(limit);
  return options;
}

} // namespace orva::bench

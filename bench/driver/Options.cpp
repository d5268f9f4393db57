#include "Options.h"

#include "commandline/Parse.h"

#include <algorithm>
#include <limits>

namespace orva::bench {

std::optional<Options> ParseOptions(const std::vector<std::string>& arguments) {
  constexpr int MAXIMUM = std::numeric_limits<int>::max();
  Options options;
  bool quick = false;
  long long limit = options.limit.count();

  CLI::App app("Compares the daemon with the floor and the horizon; doc/performance.md explains "
               "the figures.",
               "bench");
  app.set_version_flag("--version", "bench " PROGRAM_VERSION);
  app.add_flag("--quick", quick, "Leave out the catalogs of 1,000,000 files");
  app.add_option("--sizes", options.sizes, "Files of the catalogs (10000,100000,1000000)")
      ->option_text("N,...")
      ->delimiter(',')
      ->allow_extra_args(false)
      ->transform(commandline::Decimal(1, MAXIMUM));
  app.add_option("--shapes", options.shapes,
                 "Shapes of the catalogs (unique,camera,flat,deep,restamped,folders)")
      ->option_text("NAME,...")
      ->delimiter(',')
      ->allow_extra_args(false)
      ->check(CLI::IsMember(options.shapes));
  app.option_defaults()->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
  app.add_option("--pairs", options.pairs, "How often each measurement is made")
      ->type_name("N")
      ->capture_default_str()
      ->transform(commandline::Decimal(1, MAXIMUM));
  app.add_option("--limit", limit, "Give up a merge that takes longer, in steps of a minute")
      ->type_name("SECONDS")
      ->capture_default_str()
      ->transform(commandline::Decimal(1, MAXIMUM));
  if (!commandline::Parse(app, arguments)) {
    return std::nullopt;
  }

  if (quick) {
    std::erase_if(options.sizes, [](long long size) { return size >= 1'000'000; });
  }
  std::ranges::sort(options.sizes);
  options.limit = std::chrono::seconds(limit);
  return options;
}

} // namespace orva::bench

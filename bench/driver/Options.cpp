#include "Options.h"

#include <algorithm>
#include <sstream>

namespace orva::bench {

const char* const HELP =
    R"(usage: bench [--quick] [--sizes N,...] [--shapes NAME,...] [--pairs N] [--limit SECONDS]

Measures the daemon beside the floor and the horizon; doc/performance.md says what the figures mean.
  --quick            leaves out the catalogs of 1,000,000 files
  --sizes N,...      files of the catalogs (10000,100000,1000000)
  --shapes NAME,...  unique, camera, flat, deep, restamped, folders (all)
  --pairs N          how often each measurement is made (5)
  --limit SECONDS    gives up a merge that takes longer, in steps of a minute (120)
)";

namespace {

std::vector<std::string> Split(const std::string& list) {
  std::vector<std::string> items;
  std::istringstream stream(list);
  for (std::string item; std::getline(stream, item, ',');) {
    items.push_back(item);
  }
  return items;
}

long long PositiveNumber(const std::string& text) {
  std::size_t end = 0;
  long long number = 0;
  try {
    number = std::stoll(text, &end);
  } catch (const std::exception&) {
    end = 0;
  }
  if (end != text.size() || number < 1) {
    throw std::invalid_argument("'" + text + "' is not a positive number");
  }
  return number;
}

std::vector<long long> Sizes(const std::string& list) {
  std::vector<long long> sizes;
  for (const std::string& item : Split(list)) {
    sizes.push_back(PositiveNumber(item));
  }
  std::sort(sizes.begin(), sizes.end());
  return sizes;
}

std::vector<std::string> Shapes(const std::string& list, const std::vector<std::string>& known) {
  std::vector<std::string> shapes = Split(list);
  for (const std::string& shape : shapes) {
    if (std::find(known.begin(), known.end(), shape) == known.end()) {
      throw std::invalid_argument("there is no shape '" + shape + "'");
    }
  }
  return shapes;
}

} // namespace

Options ParseOptions(const std::vector<std::string>& arguments) {
  Options options;
  for (auto argument = arguments.begin(); argument != arguments.end(); ++argument) {
    const std::string& name = *argument;
    const auto value = [&]() -> const std::string& {
      if (++argument == arguments.end()) {
        throw std::invalid_argument(name + " wants a value");
      }
      return *argument;
    };
    if (name == "--help") {
      options.help = true;
    } else if (name == "--quick") {
      std::erase_if(options.sizes, [](long long size) { return size >= 1'000'000; });
    } else if (name == "--sizes") {
      options.sizes = Sizes(value());
    } else if (name == "--shapes") {
      options.shapes = Shapes(value(), Options().shapes);
    } else if (name == "--pairs") {
      options.pairs = static_cast<int>(PositiveNumber(value()));
    } else if (name == "--limit") {
      options.limit = std::chrono::seconds(PositiveNumber(value()));
    } else {
      throw std::invalid_argument("what is '" + name + "'?");
    }
  }
  return options;
}

} // namespace orva::bench

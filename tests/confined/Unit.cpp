#include "Unit.h"

#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>

namespace orva::test {

Unit::Unit(const std::string& path) {
  std::ifstream file(path);
  bool isService = false;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with('[')) {
      isService = line == "[Service]";
    } else if (const auto end = line.find('=');
               isService && !line.starts_with('#') && end != std::string::npos) {
      settings_[line.substr(0, end)].push_back(line.substr(end + 1));
    }
  }
  if (settings_.empty()) {
    throw std::runtime_error("no service is described in " + path);
  }
}

std::vector<std::string> Unit::All(const std::string& name) const {
  const auto found = settings_.find(name);
  return found == settings_.end() ? std::vector<std::string>() : found->second;
}

std::vector<std::string> Unit::Words(const std::string& name) const {
  const std::vector<std::string> values = All(name);
  if (values.size() > 1) {
    throw std::runtime_error(name + " stands there more than once");
  }
  std::istringstream words(values.empty() ? "" : values[0]);
  return {std::istream_iterator<std::string>(words), {}};
}

bool Unit::Is(const std::string& name) const {
  return Words(name) == std::vector<std::string>{"yes"};
}

std::vector<std::string> Unit::Names() const {
  std::vector<std::string> names;
  names.reserve(settings_.size());
  for (const auto& [name, values] : settings_) {
    names.push_back(name);
  }
  return names;
}

} // namespace orva::test

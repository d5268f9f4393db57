#include "MicroResults.h"

#include <fstream>
#include <map>
#include <sstream>

namespace orva::bench {

std::vector<MicroResult> ReadMicroResults(const std::string& path) {
  const std::string ours = "/ours_median";
  const std::string theirs = "/theirs_median";
  std::map<std::string, MicroResult> byName;
  std::ifstream file(path);
  // "name",iterations,real_time,cpu_time,...: the processor time does not depend on the machine's
  // load.
  for (std::string line; std::getline(file, line);) {
    std::istringstream fields(line);
    std::string name;
    std::string iterations;
    std::string realTime;
    double nanoseconds = 0;
    if (!std::getline(fields, name, ',') || !std::getline(fields, iterations, ',') ||
        !std::getline(fields, realTime, ',') || !(fields >> nanoseconds)) {
      continue;
    }
    std::erase(name, '"');
    for (const auto& [suffix, side] :
         {std::pair{ours, &MicroResult::ours}, std::pair{theirs, &MicroResult::theirs}}) {
      if (name.ends_with(suffix)) {
        const std::string what = name.substr(0, name.size() - suffix.size());
        byName[what].what = what;
        byName[what].*side = nanoseconds;
      }
    }
  }
  std::vector<MicroResult> results;
  for (const auto& [name, result] : byName) {
    if (result.ours > 0 && result.theirs > 0) {
      results.push_back(result);
    }
  }
  return results;
}

} // namespace orva::bench

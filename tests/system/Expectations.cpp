#include "Expectations.h"

#include "orvautil/FormatString.h"

#include <regex>
#include <sstream>

namespace orva::test {

Lines ErrorTexts(const Log& log) {
  Lines errors;
  for (const LogLine& line : log) {
    if (line.priority == Error("").priority) {
      errors.push_back(line.text);
    }
  }
  return errors;
}

std::string MaskTimes(const std::string& text) {
  static const std::regex TIME(R"(\d+\.\d{3} W   \d+\.\d{3} U   \d+\.\d{3} S   \d+\.\d%)");
  return std::regex_replace(text, TIME, "TIME");
}

std::string MasterText(const std::string& mountPoint, double capacity, double used) {
  std::ostringstream text;
  text << "\nMountPoint: " << mountPoint << "\nCapacity: " << capacity << "M\nUsed: " << used
       << "M\nPhotoDB size: 1\nReadOnly: 0\n";
  return text.str();
}

std::string MasterText(const Volume& volume) {
  return MasterText(volume.MountPoint(), volume.Capacity(), volume.Used());
}

LogLine PluggedLine(const Volume& volume) {
  return Info(util::FormatString("The volume is plugged and capacity is %lf and capacity_used is "
                                 "%lf for mountPoint %s",
                                 volume.Capacity(), volume.Used(), volume.MountPoint().c_str()));
}

Log MergeLines(const std::string& mountPoint, int folders, int files) {
  const std::string place = mountPoint + " in TIME\n";
  return {Info("Retrieved changed folders list for " + place),
          Info("Retrieved " + std::to_string(files) + " changed files list for " + place),
          Info("Retrieved counts from the orva db for mountPoint " + place),
          Info("Merged " + std::to_string(folders) + " folders for " + place),
          Info("Merged " + std::to_string(files) + " files for " + place)};
}

std::string LocatorOn(const std::string& mountPoint) {
  return "zophotos_db_path=" + mountPoint + "/.zophotos/zophotos.db\n";
}

} // namespace orva::test

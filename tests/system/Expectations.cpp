#include "Expectations.h"

#include "orvautil/FormatString.h"

#include <sstream>

namespace orva::test {

std::string MasterText(const Volume& volume) {
  std::ostringstream text;
  text << "\nMountPoint: " << volume.MountPoint() << "\nCapacity: " << volume.Capacity()
       << "M\nUsed: " << volume.Used() << "M\nPhotoDB size: 1\nReadOnly: 0\n";
  return text.str();
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

} // namespace orva::test

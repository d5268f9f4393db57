#include "VolumeInfo.h"

#include <sstream>

namespace orva::dbmerger {

std::string VolumeInfo::ToString() const {
  std::ostringstream text;
  // The "M" behind the byte counts is part of the text that log readers know.
  text << "\nMountPoint: " << mountPoint << "\nCapacity: " << capacity << "M\nUsed: " << used
       << "M\nPhotoDB size: " << photoDbSize << "\nReadOnly: " << readOnly << "\n";
  return text.str();
}

} // namespace orva::dbmerger

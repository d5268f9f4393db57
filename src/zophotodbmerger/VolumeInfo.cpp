#include "VolumeInfo.h"

#include <sstream>

namespace orva::dbmerger {

std::string VolumeInfo::ToString() const {
  std::ostringstream text;
  // Log readers rely on the "M" after the byte counts.
  text << "\nMountPoint: " << mountPoint << "\nCapacity: " << capacity << "M\nUsed: " << used
       << "M\nPhotoDB size: " << photoDbSize << "\nReadOnly: " << readOnly << "\n";
  return text.str();
}

} // namespace orva::dbmerger

#pragma once

#include <fstream>
#include <string>

namespace orva::test {

/// Whether the private root has users other than root. For an ordinary user it is a user namespace,
/// where only one user is known: no file can belong to another one.
inline bool HasOtherUsers() {
  std::ifstream map("/proc/self/uid_map");
  unsigned long inside = 0;
  unsigned long outside = 0;
  unsigned long count = 0;
  return map >> inside >> outside >> count && count > 1;
}

/// Why a test is skipped there.
inline const std::string NO_OTHER_USERS = "a private root of an ordinary user has only one user";

} // namespace orva::test

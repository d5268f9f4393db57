#pragma once

#include <gtest/gtest.h>

#include <fstream>

namespace orva::test {

/// Whether the private root has users other than root. For an ordinary user it is a user namespace
/// with one user: the system lets only root map more of them, so no file can belong to another one.
inline bool HasOtherUsers() {
  std::ifstream map("/proc/self/uid_map");
  unsigned long inside = 0;
  unsigned long outside = 0;
  unsigned long count = 0;
  return map >> inside >> outside >> count && count > 1;
}

} // namespace orva::test

/// Skips a test about files and programs of other users where there are none. A macro, because it
/// returns from the test. As root, and so in continuous integration, the test always runs.
#define SKIP_WITHOUT_OTHER_USERS()                                                                 \
  if (!::orva::test::HasOtherUsers())                                                              \
  GTEST_SKIP() << "needs a second user, and only root can map one into a private root; as root, "  \
                  "scripts/test runs this test"

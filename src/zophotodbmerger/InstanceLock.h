#pragma once

#include "orvautil/FileDescriptor.h"

namespace orva::dbmerger {

/// Keeps a second daemon from running on the appliance, for as long as the object lives. The lock
/// is on a file that other users can neither lock nor replace. If there can be no such file, there
/// is no lock, and every daemon runs. A file of root that the daemon may not open counts as locked.
class InstanceLock {
public:
  static constexpr const char* PATH = "/run/zophotodbmerger/lock";

  /// Takes the lock, if no other daemon has it.
  InstanceLock();

  bool IsHeldByAnother() const noexcept { return isHeldByAnother_; }

private:
  util::FileDescriptor file_;
  bool isHeldByAnother_ = false;
};

} // namespace orva::dbmerger

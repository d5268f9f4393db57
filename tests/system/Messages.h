#pragma once

#include <string>

namespace orva::test {

/// The one profile of which the daemon accepts batches.
inline const std::string PROFILE = "cb62bbdd389b48898f2e5244977cb2c5";

/// A notification named `name`, whatever that is, for a mount point that needs no escaping.
inline std::string Notification(const std::string& name, const std::string& mountPoint,
                                const std::string& children = "") {
  return R"(<?xml version="1.0" encoding="UTF-8"?><ORVANotification Name=")" + name +
         R"(" MountPoint=")" + mountPoint + "\">" + children + "</ORVANotification>";
}

inline std::string ProfileElement(const std::string& profile) {
  return "<profile>" + profile + "</profile>";
}

inline std::string Plugged(const std::string& mountPoint) {
  return Notification("Plugged", mountPoint);
}
inline std::string Unplugged(const std::string& mountPoint) {
  return Notification("Unplugged", mountPoint);
}
inline std::string Scanned(const std::string& mountPoint) {
  return Notification("Scanned", mountPoint);
}
inline std::string TranscodedBatch(const std::string& mountPoint) {
  return Notification("TranscodedBatch", mountPoint, ProfileElement(PROFILE));
}
inline std::string End(const std::string& mountPoint) { return Notification("End", mountPoint); }
inline std::string Purged(const std::string& mountPoint) {
  return Notification("Purged", mountPoint);
}

} // namespace orva::test

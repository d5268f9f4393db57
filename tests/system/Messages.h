#pragma once

#include "orva-notify/Notification.h"

#include <string>

namespace orva::test {

/// A notification as the service composes it.
inline std::string Plugged(const std::string& mountPoint) {
  return notify::Compose(notify::Event::Plugged, mountPoint);
}
inline std::string Unplugged(const std::string& mountPoint) {
  return notify::Compose(notify::Event::Unplugged, mountPoint);
}
inline std::string Scanned(const std::string& mountPoint) {
  return notify::Compose(notify::Event::Scanned, mountPoint);
}
inline std::string TranscodedBatch(const std::string& mountPoint) {
  return notify::Compose(notify::Event::TranscodedBatch, mountPoint);
}
inline std::string End(const std::string& mountPoint) {
  return notify::Compose(notify::Event::End, mountPoint);
}
inline std::string Purged(const std::string& mountPoint) {
  return notify::Compose(notify::Event::Purged, mountPoint);
}

/// A notification with any name, attribute text and children, as no service composes it.
inline std::string Notification(const std::string& name, const std::string& mountPoint,
                                const std::string& children = "") {
  return R"(<?xml version="1.0" encoding="UTF-8"?><ORVANotification Name=")" + name +
         R"(" MountPoint=")" + mountPoint + "\">" + children + "</ORVANotification>";
}

inline std::string ProfileElement(const std::string& profile) {
  return "<profile>" + profile + "</profile>";
}

} // namespace orva::test

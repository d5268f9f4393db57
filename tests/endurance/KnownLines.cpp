#include "KnownLines.h"

#include <syslog.h>

#include <algorithm>
#include <string>
#include <string_view>
#include <vector>

namespace orva::test {

namespace {

/// A line's priority and its format, as the daemon's sources have it. "%s" stands for any text.
struct Format {
  int priority;
  std::string_view text;
};

const std::vector<Format>& Formats() {
  constexpr int info = LOG_LOCAL1 | LOG_INFO;
  constexpr int error = LOG_LOCAL1 | LOG_ERR;
  constexpr int plain = LOG_USER | LOG_INFO;
  static const std::vector<Format> formats{
      {plain, "src/zophotodbmerger/NotificationListener:130: Creating the notification socket "
              "/run/orva/notification.sock"},
      {plain, "src/zophotodbmerger/NotificationListener:137: Calling ReadMessage()"},
      {info, "src/zophotodbmerger/NotificationListener:154: NotificationListener exiting."},
      {error, "Unable to open socket (/run/orva/notification.sock)"},
      {info, "Returning from the wait"},
      {error, "ERROR ! Node name = %s"},
      {error, "MessageProcessor:: %s"},
      {info, "The volume is plugged and capacity is %f and capacity_used is %f for mountPoint %s/"},
      {info, ":: Scanned"},
      {info, ":: Transcodedbatch "},
      {info, "Profile ==> cb62bbdd389b48898f2e5244977cb2c5 ==> \n"},
      {info, ":: End "},
      {info, ":: Purged "},
      {error, "There is no filesystem location for the mountpoint %s"},
      {error, "%s  ---------  is not a candidate \n"},
      {info, "Default:: VolumePlugged "},
      {info, "Default:: Volumeunplugged, ignoring! "},
      {info, "Default:: Volume Scanned "},
      {info, "Default:: Volume purged - ignored! "},
      {info, "DefaultState:: We DO NOT have a master volume "},
      {info, "Staying in the Default state "},
      {info, "We now have a master volume \nMountPoint: %s\nCapacity: %sM\nUsed: %sM\n"
             "PhotoDB size: 1\nReadOnly: 0\n"},
      {info, "We now have a master volume \nMountPoint: %s\nCapacity: %sM\nUsed: %sM\n"
             "PhotoDB size: 1\nReadOnly: 0\n "},
      {info, "Moving to the scanned state since we can safely do so "},
      {info, "MasterVolumePluggedState:: VolumePlugged, ignoring! "},
      {info, "MasterVolumePluggedState:: Volumeunplugged "},
      {info, "MasterVolumePluggedState:: VolumeScanned "},
      {info, "MasterVolumePluggedState:: Transcoded batch "},
      {info, "We do NOT have a master volume so we can go back to the Default State "},
      {info, "MasterVolumePluggedState:: We do not have a Master Volume, so Volume Scanned - "
             "ignored "},
      {info, "MasterVolumePluggedState:: We do not have a Master Volume, so picture transcoded - "
             "ignored "},
      {info, "MasterVolumePluggedState:: We do not have a Master Volume, so volume purged - "
             "ignored "},
      {info, "MasterVolumeScannedState:: VolumePlugged, ignoring! "},
      {info, "MasterVolumeScannedState:: Volumeunplugged "},
      {info, "We do NOT have a master volume, so going back to the Default State "},
      {info, "MasterVolumeScannedState:: handlePictureTranscoded, doing merge for mountPoint %s/ "
             "using master volume at %s"},
      {info, "MasterVolumeScannedState:: handleVolumePurged, doing merge for mountPoint %s/ using "
             "master volume at %s"},
      {info, "Iterating over mount point %s\n"},
      {info, "Retrieved changed folders list for %s/ in %f W   %f U   %f S   %f%\n"},
      {info, "Retrieved %d changed files list for %s/ in %f W   %f U   %f S   %f%\n"},
      {info, "Retrieved counts from the orva db for mountPoint %s/ in %f W   %f U   %f S   %f%\n"},
      {info, "Merged %d folders for %s/ in %f W   %f U   %f S   %f%\n"},
      {info, "Merged %d files for %s/ in %f W   %f U   %f S   %f%\n"},
      {error, "Error that we will ignore %s\n"},
      {error, "Could not insert stats for %s/ "},
      {error, "Could not update stats for %s/. Return code %d"},
  };
  return formats;
}

bool Makes(std::string_view format, std::string_view text);

/// Whether `rest` goes on behind a piece of `text` that is made of the given characters only.
bool MakesBehind(std::string_view rest, std::string_view text, std::string_view characters) {
  const std::size_t length = std::min(text.find_first_not_of(characters), text.size());
  return length > 0 && Makes(rest, text.substr(length));
}

bool Makes(std::string_view format, std::string_view text) {
  if (format.empty()) {
    return text.empty();
  }
  if (format.starts_with("%f")) {
    return MakesBehind(format.substr(2), text, "0123456789.");
  }
  if (format.starts_with("%d")) {
    return MakesBehind(format.substr(2), text, "0123456789");
  }
  if (format.starts_with("%s")) {
    for (std::size_t length = 0; length <= text.size(); ++length) {
      if (Makes(format.substr(2), text.substr(length))) {
        return true;
      }
    }
    return false;
  }
  return text.starts_with(format.front()) && Makes(format.substr(1), text.substr(1));
}

} // namespace

bool IsKnown(const LogLine& line) {
  return std::any_of(Formats().begin(), Formats().end(), [&](const Format& format) {
    return format.priority == line.priority && Makes(format.text, line.text);
  });
}

} // namespace orva::test

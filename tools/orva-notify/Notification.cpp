#include "orva-notify/Notification.h"

#include "orvautil/Decodestring.h"

#include <algorithm>
#include <array>
#include <string_view>

namespace orva::notify {
namespace {

struct EventText {
  Event event;
  std::string_view word; ///< on the command line
  std::string_view name; ///< in the notification
};

constexpr std::array<EventText, 6> EVENT_TEXTS = {{
    {Event::Plugged, "plugged", "Plugged"},
    {Event::Unplugged, "unplugged", "Unplugged"},
    {Event::Scanned, "scanned", "Scanned"},
    {Event::TranscodedBatch, "transcoded", "TranscodedBatch"},
    {Event::End, "end", "End"},
    {Event::Purged, "purged", "Purged"},
}};

constexpr std::string_view START = "<ORVANotification Name=\"";
constexpr std::string_view MOUNT_POINT = "\" MountPoint=\"";
constexpr std::string_view DIRECTORY = " Kind=\"directory\"";

std::string_view NameOf(Event event) {
  return std::ranges::find(EVENT_TEXTS, event, &EventText::event)->name;
}

/// The text up to the mount point.
std::string StartOf(std::string_view name) {
  return std::string(START).append(name).append(MOUNT_POINT);
}

bool IsPlain(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '/' ||
         c == '-' || c == '.' || c == '_' || c == '~';
}

// The result contains no character that is special in XML and needs no escapes in an attribute.
std::string PercentEncode(const std::string& text) {
  constexpr char DIGITS[] = "0123456789ABCDEF";
  std::string encoded;
  for (const char c : text) {
    if (IsPlain(c)) {
      encoded += c;
      continue;
    }
    const auto byte = static_cast<unsigned char>(c);
    encoded += {'%', DIGITS[byte >> 4], DIGITS[byte & 0x0F]};
  }
  return encoded;
}

} // namespace

std::optional<Event> EventFromWord(const std::string& word) {
  const auto* const text = std::ranges::find(EVENT_TEXTS, word, &EventText::word);
  return text == EVENT_TEXTS.end() ? std::nullopt : std::optional(text->event);
}

std::vector<std::string> EventWords() {
  std::vector<std::string> words;
  words.reserve(EVENT_TEXTS.size());
  for (const EventText& text : EVENT_TEXTS) {
    words.emplace_back(text.word);
  }
  return words;
}

std::string Compose(Event event, const std::string& mountPoint) {
  return Compose({.event = event, .mountPoint = mountPoint});
}

std::string Compose(const Announcement& announcement) {
  const auto& [event, mountPoint, kind] = announcement;
  const std::string start = StartOf(NameOf(event)) + PercentEncode(mountPoint) + '"';
  if (event == Event::TranscodedBatch) {
    return start + "><profile>" + TRANSCODING_PROFILE + "</profile></ORVANotification>";
  }
  const bool isDirectory = event == Event::Plugged && kind == VolumeKind::Directory;
  return start + std::string(isDirectory ? DIRECTORY : "") + "/>";
}

std::optional<Announcement> Recognize(const std::string& message) {
  for (const auto& text : EVENT_TEXTS) {
    const std::string start = StartOf(text.name);
    if (!message.starts_with(start)) {
      continue;
    }
    const auto end = message.find('"', start.size());
    Announcement announcement{
        .event = text.event,
        .mountPoint = util::Decodestring(message.substr(start.size(), end - start.size()))};
    for (const auto kind : {VolumeKind::Mount, VolumeKind::Directory}) {
      announcement.kind = kind;
      if (Compose(announcement) == message) {
        return announcement;
      }
    }
  }
  return std::nullopt;
}

std::string Frame(const std::string& message) {
  return message + std::string(4, '\0');
}

} // namespace orva::notify

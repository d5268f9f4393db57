#include "orva-notify/Notification.h"

#include <algorithm>
#include <array>

namespace orva::notify {
namespace {

struct EventText {
  Event event;
  const char* word; ///< on the command line
  const char* name; ///< in the notification
};

constexpr std::array<EventText, 6> EVENT_TEXTS = {{
    {Event::Plugged, "plugged", "Plugged"},
    {Event::Unplugged, "unplugged", "Unplugged"},
    {Event::Scanned, "scanned", "Scanned"},
    {Event::TranscodedBatch, "transcoded", "TranscodedBatch"},
    {Event::End, "end", "End"},
    {Event::Purged, "purged", "Purged"},
}};

const char* NameOf(Event event) {
  return std::find_if(EVENT_TEXTS.begin(), EVENT_TEXTS.end(),
                      [event](const EventText& text) { return text.event == event; })
      ->name;
}

bool IsPlain(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '/' ||
         c == '-' || c == '.' || c == '_' || c == '~';
}

// Nothing that is left plain means anything to XML, so that the result can stand in an attribute
// as it is.
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
  for (const auto& text : EVENT_TEXTS) {
    if (word == text.word) {
      return text.event;
    }
  }
  return std::nullopt;
}

std::string Compose(Event event, const std::string& mountPoint) {
  const std::string start = std::string("<ORVANotification Name=\"") + NameOf(event) +
                            "\" MountPoint=\"" + PercentEncode(mountPoint) + "\"";
  if (event == Event::TranscodedBatch) {
    return start + "><profile>" + TRANSCODING_PROFILE + "</profile></ORVANotification>";
  }
  return start + "/>";
}

std::string Frame(const std::string& message) {
  return message + std::string(4, '\0');
}

} // namespace orva::notify

#include "orva-notify/Notification.h"

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

std::string_view NameOf(Event event) {
  return std::ranges::find(EVENT_TEXTS, event, &EventText::event)->name;
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
  const std::string start = "<ORVANotification Name=\"" + std::string(NameOf(event)) +
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

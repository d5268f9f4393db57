#pragma once

#include <optional>
#include <string>
#include <vector>

namespace orva::notify {

/// The events of a volume that the appliance announces.
enum class Event { Plugged, Unplugged, Scanned, TranscodedBatch, End, Purged };

/// What a volume is: something mounted, or a plain directory.
enum class VolumeKind { Mount, Directory };

/// An event of the volume at `mountPoint`, which may contain any bytes.
struct Announcement {
  Event event = Event::Plugged;
  std::string mountPoint{};
  VolumeKind kind = VolumeKind::Mount; ///< counts only for Plugged
};

/// Identifier of the only transcoding profile whose batches are announced.
const std::string TRANSCODING_PROFILE = "cb62bbdd389b48898f2e5244977cb2c5";

/// The event for `word` of the command line ("plugged", "transcoded"); nothing for an unknown word.
std::optional<Event> EventFromWord(const std::string& word);

/// The words of the command line for all events.
std::vector<std::string> EventWords();

/// The XML document that announces `event` of the volume at `mountPoint`, without the delimiter.
/// The mount point may contain any bytes.
std::string Compose(Event event, const std::string& mountPoint);

/// The same for `announcement`.
std::string Compose(const Announcement& announcement);

/// The announcement in a message exactly as Compose writes it; nothing for any other message.
std::optional<Announcement> Recognize(const std::string& message);

/// `message` as it is sent over the socket: followed by the delimiter, four zero bytes.
std::string Frame(const std::string& message);

} // namespace orva::notify

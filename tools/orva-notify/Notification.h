#pragma once

#include <optional>
#include <string>

namespace orva::notify {

/// What the appliance tells about a volume.
enum class Event { Plugged, Unplugged, Scanned, TranscodedBatch, End, Purged };

/// Identifier of the one transcoding profile that batches are announced for.
const std::string TRANSCODING_PROFILE = "cb62bbdd389b48898f2e5244977cb2c5";

/// The event that a command line calls `word` ("plugged", "transcoded"); nothing for any other.
std::optional<Event> EventFromWord(const std::string& word);

/// The XML document that announces `event` for the volume at `mountPoint`, any bytes, without
/// the delimiter.
std::string Compose(Event event, const std::string& mountPoint);

/// `message` as it goes over the socket: followed by the delimiter, four zero bytes.
std::string Frame(const std::string& message);

} // namespace orva::notify

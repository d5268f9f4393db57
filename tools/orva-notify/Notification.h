#pragma once

#include <optional>
#include <string>
#include <vector>

namespace orva::notify {

/// The events of a volume that the appliance announces.
enum class Event { Plugged, Unplugged, Scanned, TranscodedBatch, End, Purged };

/// Identifier of the only transcoding profile whose batches are announced.
const std::string TRANSCODING_PROFILE = "cb62bbdd389b48898f2e5244977cb2c5";

/// The event for `word` of the command line ("plugged", "transcoded"); nothing for an unknown word.
std::optional<Event> EventFromWord(const std::string& word);

/// The words of the command line for all events.
std::vector<std::string> EventWords();

/// The XML document that announces `event` of the volume at `mountPoint`, without the delimiter.
/// The mount point may contain any bytes.
std::string Compose(Event event, const std::string& mountPoint);

/// `message` as it is sent over the socket: followed by the delimiter, four zero bytes.
std::string Frame(const std::string& message);

} // namespace orva::notify

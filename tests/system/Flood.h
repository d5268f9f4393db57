#pragma once

#include "Expectations.h"
#include "Messages.h"
#include "PeakMemory.h"

#include <memory>
#include <string>
#include <vector>

namespace orva::test {

/// Bytes of the longest message that the daemon accepts.
constexpr std::size_t LONGEST = 65536;

/// Ends a message.
inline const std::string DELIMITER(4, '\0');

/// A notification that changes nothing, and the log of its handling.
inline const std::string GOOD = Notification("Unplugged", "/shares/A");
inline const Log HANDLED = {Info("Default:: Volumeunplugged, ignoring! ")};

/// `text`, `count` times.
std::string Repeated(const std::string& text, std::size_t count);

/// `head` and `tail` with as many of `piece` between them as the longest message can hold.
std::string Filled(const std::string& head, const std::string& piece, const std::string& tail);

/// A running daemon that gets very many or very large messages. A test ends with ExpectUnharmed, or
/// with its second half, ExpectWithinBounds.
class Flood : public SystemTest {
protected:
  void SetUp() override;

  /// Sends a message and expects that the message processor rejects it with one line, or ignores
  /// it. Returns the line's text; empty when there was none.
  std::string Refused(const std::string& message);

  /// Sends a message and expects it to be handled as GOOD is.
  void Handled(const std::string& message);

  /// The next good message is handled, and ExpectWithinBounds holds.
  void ExpectUnharmed(const std::string& flood);

  /// The daemon has written nothing to its peer, and its memory has grown by at most 8 MiB since
  /// the beginning. Reports the growth under the name `flood`.
  void ExpectWithinBounds(const std::string& flood);

private:
  std::unique_ptr<PeakMemory> memory_;
};

} // namespace orva::test

#pragma once

#include "Expectations.h"
#include "Messages.h"
#include "PeakMemory.h"

#include <memory>
#include <string>
#include <vector>

namespace orva::test {

/// Bytes of the longest message that is taken.
constexpr std::size_t LONGEST = 65536;

/// Zeros that end a message.
inline const std::string DELIMITER(4, '\0');

/// A notification that changes nothing, and what shows that it was handled.
inline const std::string GOOD = Notification("Unplugged", "/shares/A");
inline const Log HANDLED = {Info("Default:: Volumeunplugged, ignoring! ")};

/// `head` and `tail` with as many of `piece` between them as make the longest message.
std::string Filled(const std::string& head, const std::string& piece, const std::string& tail);

/// A running daemon that somebody wants to drown. A test ends with ExpectUnharmed, which holds
/// what the daemon used meanwhile against what it may, or with its second half.
class Flood : public SystemTest {
protected:
  void SetUp() override;

  /// Sends a message and expects that it is refused or ignored: with one line at most, of the
  /// message processor. Returns the line's text; empty when there was none.
  std::string Refused(const std::string& message);

  /// Sends a message and expects it to be handled as GOOD is.
  void Handled(const std::string& message);

  /// The next good message is handled, and all has stayed within bounds.
  void ExpectUnharmed(const std::string& flood);

  /// The daemon has written nothing to its peer, and its memory has stayed within 8 MiB of what it
  /// used at the beginning. Reports the peak under `flood`.
  void ExpectWithinBounds(const std::string& flood);

private:
  std::unique_ptr<PeakMemory> memory_;
};

} // namespace orva::test

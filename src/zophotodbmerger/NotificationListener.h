#pragma once

#include "orvautil/MessageProcessor.h"
#include "orvautil/Thread.h"

namespace orva::dbmerger {

/// The daemon's only source of work: a thread that reads the notification socket and handles one
/// notification after the other, merges included.
class NotificationListener : public util::Thread, public util::MessageProcessor {
public:
  ~NotificationListener() override = default;

  /// Body of the thread: connects again whenever the connection ends, and returns when the
  /// service cannot be reached.
  void Run() override;

  /// Whether the message contains the name of a notification's element.
  bool IsValidMessage(const std::string& message) const override;

  /// Turns a notification into an event for the current state; any other document is logged. Throws
  /// what the state throws. What an event has left undone is completed at once when only the
  /// election is missing, otherwise before the next event.
  void HandleMessage(util::Stream& stream, const unsigned char* data, unsigned long length,
                     const xercesc::DOMNode& root) const override;

  /// Four zero bytes.
  std::pair<const unsigned char*, unsigned long> GetDelimiter() const override;

protected:
  std::string DescribeException(const std::exception_ptr& exception) const override;

private:
  /// Elects a master if an event has failed before its election, so that the locator file does not
  /// name a master that is gone. A failure is logged.
  void ElectAfterFailure() const;
};

} // namespace orva::dbmerger

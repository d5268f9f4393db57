#pragma once

#include <string>

namespace orva::test {

/// The appliance's notification service as a test plays it: listens on the notification socket
/// and talks to one client at a time. The operations that talk take the next waiting client
/// when there is none, and give up one that stops reading. Failures are thrown as
/// std::runtime_error or std::system_error.
class NotificationService {
public:
  /// Starts to listen.
  NotificationService();
  NotificationService(const NotificationService&) = delete;
  NotificationService& operator=(const NotificationService&) = delete;
  ~NotificationService();

  /// Waits for a client to be there.
  void AwaitClient();

  /// Sends the bytes as they are.
  void SendBytes(const std::string& bytes);

  /// Sends one message, followed by the delimiter.
  void Send(const std::string& message);

  /// Waits until the client has read all that was sent to it.
  void AwaitConsumed() const;

  /// Reads nothing that the client writes, and lets it not be sent either.
  void StopReading();

  /// How many bytes the client has written and nobody has read.
  int Received();

  /// Waits for a client and closes its connection; goes on listening.
  void CloseClient();

  /// Ends the service: no further client can connect, the connection is closed.
  void Stop();

private:
  int listener_;    ///< owned; -1 when stopped
  int client_ = -1; ///< owned; -1 while there is none
};

} // namespace orva::test

#pragma once

#include "orvautil/FileDescriptor.h"

#include <string>

namespace orva::test {

/// The appliance's notification service: listens on the notification socket and serves one client
/// at a time. Operations that need a client accept the next one if no client is connected, and fail
/// when it stops reading. Failures are thrown as std::runtime_error or std::system_error.
class NotificationService {
public:
  /// Starts to listen.
  NotificationService();
  NotificationService(const NotificationService&) = delete;
  NotificationService& operator=(const NotificationService&) = delete;
  ~NotificationService();

  /// Waits until a client is connected.
  void AwaitClient();

  /// Sends the bytes as they are.
  void SendBytes(const std::string& bytes);

  /// Sends one message, followed by the delimiter.
  void Send(const std::string& message);

  /// Waits until the client has read everything that was sent to it.
  void AwaitConsumed() const;

  /// Makes the receive buffer as small as possible, so that the client can hardly write.
  void StopReading();

  /// How many bytes the client has written; the service reads none of them.
  int Received();

  /// Waits for a client and closes its connection; continues to listen.
  void CloseClient();

  /// Ends the service: closes the connection and accepts no further one.
  void Stop();

private:
  util::FileDescriptor listener_; ///< none when stopped
  util::FileDescriptor client_;   ///< none while no client is connected
};

} // namespace orva::test

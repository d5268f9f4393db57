#pragma once

#include "orva-notify/Client.h"
#include "orva-notify/Control.h"
#include "orva-notify/ListeningSocket.h"
#include "orva-notify/MountInfo.h"
#include "orvautil/FileDescriptor.h"

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace orva::notify {

/// The notification service: one thread, one loop, every descriptor non-blocking. Prints a line
/// for whatever happens.
class Service {
public:
  /// Listens on `address`, for requests on the address that belongs to it, and from now on takes
  /// SIGINT and SIGTERM as requests to stop. With `watch`, mounts and unmounts directly below
  /// /shares are announced. Throws util::Exception and std::filesystem::filesystem_error.
  Service(const std::string& address, bool watch);

  /// Serves until it is asked to stop.
  void Run();

private:
  bool IsAskedToStop();
  void Wait();
  void ReadRequests();
  void FollowMounts();
  void AcceptClients();
  void ServeClients();
  void PerformRequests();

  std::size_t Perform(const Request& request);
  std::size_t SendToAll(const std::string& message);
  std::size_t DropAll();
  void Queue(Client& client, const Message& framed);
  void ForgetClosed();
  util::FileDescriptor AcceptFrom(ListeningSocket& socket);

  const std::string address_;
  util::FileDescriptor signals_;
  ListeningSocket control_; // first, so that a second service is refused before a client sees it
  ListeningSocket notification_;
  util::FileDescriptor mountInfo_; ///< only waited for; none when mounts are not watched
  Volumes volumes_;                ///< as announced
  std::vector<std::unique_ptr<Client>> clients_;
  std::vector<std::unique_ptr<ControlConnection>> requests_;
  unsigned lastNumber_ = 0;
  bool isFull_ = false; ///< no descriptor is left for another connection
};

} // namespace orva::notify

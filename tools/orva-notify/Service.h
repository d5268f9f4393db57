#pragma once

#include "orva-notify/AnnouncedDirectories.h"
#include "orva-notify/Client.h"
#include "orva-notify/Control.h"
#include "orva-notify/ListeningSocket.h"
#include "orva-notify/VolumeMemory.h"
#include "orva-notify/VolumeWatch.h"
#include "orvautil/FileDescriptor.h"

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace orva::notify {

/// The notification service: one thread, one loop, every descriptor non-blocking. Prints a line for
/// each event.
class Service {
public:
  /// Listens on `address` for clients and on ControlAddress(address) for requests. From now on,
  /// SIGINT and SIGTERM stop the service. With `watch`, mounts and unmounts directly below /shares
  /// are announced, and, in any case, the changes of `directories`; see VolumeWatch.
  /// `stateDirectory` is what AnnouncedDirectories keeps; empty for none. Throws util::Exception
  /// and std::filesystem::filesystem_error.
  Service(const std::string& address, bool watch, const std::vector<std::string>& directories,
          const std::string& stateDirectory);

  /// Serves until SIGINT or SIGTERM.
  void Run();

private:
  bool IsAskedToStop();
  void Wait();
  void ReadRequests();
  void FollowVolumes();
  void AcceptClients();
  void ServeClients();
  void PerformRequests();

  std::size_t CountClients() const;
  void Perform(ControlConnection& request);
  void Announce(const Announcement& announcement);
  void Remember(const Announcement& announcement);
  void SendEnds();
  void SendGone();
  void ForgetGone();
  std::shared_ptr<const Handling> QueueMarks();
  std::size_t SendToAll(const std::string& message);
  std::size_t DropAll();
  void Queue(Client& client, const Message& framed);
  void ForgetClosed();
  util::FileDescriptor AcceptFrom(ListeningSocket& socket);

  const std::string address_;
  util::FileDescriptor signals_;
  ListeningSocket
      control_; // opened first: a second service fails before a client can connect to it
  ListeningSocket notification_;
  VolumeWatch volumes_;
  VolumeMemory memory_;
  AnnouncedDirectories announced_;
  std::shared_ptr<const Handling> goneHandling_; ///< of SendGone
  util::FileDescriptor readers_; ///< of epoll: the clients that are waited for have read something
  std::vector<std::unique_ptr<Client>> clients_;
  std::vector<std::unique_ptr<ControlConnection>> requests_;
  unsigned lastNumber_ = 0;
  bool isFull_ = false; ///< there is no free descriptor for another connection
};

} // namespace orva::notify

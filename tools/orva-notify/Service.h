#pragma once

#include "orva-notify/AnnouncedVolumes.h"
#include "orva-notify/Client.h"
#include "orva-notify/Control.h"
#include "orva-notify/ListeningSocket.h"
#include "orva-notify/VolumeMemory.h"
#include "orva-notify/VolumeWatch.h"
#include "orvautil/FileDescriptor.h"

#include <cstddef>
#include <memory>
#include <set>
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
  /// `stateDirectory` is what AnnouncedVolumes keeps; empty for none. Throws util::Exception
  /// and std::filesystem::filesystem_error.
  Service(const std::string& address, bool watch, const std::vector<std::string>& directories,
          const std::string& stateDirectory);

  /// Serves until SIGINT or SIGTERM.
  void Run();

private:
  /// Volumes that are gone, as they were announced to the clients. If all of these disconnect
  /// before one has handled it, the next one gets it again.
  struct Removal {
    std::set<std::string> mountPoints;
    std::shared_ptr<const Handling> handling;
    /// Else the clients hold `handling`, and it is not known whether they have handled it.
    bool isMarked;
  };

  bool IsAskedToStop();
  void Wait();
  void ReadRequests();
  void FollowVolumes();
  void AcceptClients();
  void ServeClients();
  void PerformRequests();

  std::size_t CountClients() const;
  void Perform(ControlConnection& request);
  std::size_t Announce(const Announcement& announcement);
  void Remember(const Announcement& announcement);
  void SendEnds();
  void SendGone();
  bool CanRemove() const;
  void NoteUnplugged();
  void ForgetGone();
  std::set<std::string> UnsentGone() const;
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
  AnnouncedVolumes announced_;
  std::vector<Removal> removals_; ///< that no client has handled yet
  util::FileDescriptor readers_;  ///< of epoll: the clients that are waited for have read something
  std::vector<std::unique_ptr<Client>> clients_;
  std::vector<std::unique_ptr<ControlConnection>> requests_;
  unsigned lastNumber_ = 0;
  bool isFull_ = false; ///< there is no free descriptor for another connection
};

} // namespace orva::notify

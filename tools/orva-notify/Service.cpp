#include "orva-notify/Service.h"

#include "commandline/Count.h"
#include "orva-notify/Notification.h"
#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/signalfd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <fstream>
#include <iostream>
#include <utility>

namespace orva::notify {
namespace {

using util::FormatString;

const char* const MOUNT_INFO = "/proc/self/mountinfo";

void Print(const std::string& line) {
  std::cout << line << std::endl;
}

/// `text` shortened, with a dot for each byte that is not printable ASCII.
std::string Printable(const std::string& text) {
  constexpr std::size_t MAXIMUM = 300;
  std::string line = text.substr(0, MAXIMUM);
  std::ranges::replace_if(
      line, [](unsigned char c) { return c < 0x20 || c >= 0x7F; }, '.');
  return text.size() > MAXIMUM ? line + "..." : line;
}

std::string CountOfClients(std::size_t count) {
  return commandline::Count(static_cast<long long>(count), "client");
}

util::FileDescriptor CheckedDescriptor(int descriptor, const char* what) {
  if (descriptor == -1) {
    throw util::Exception(FormatString("cannot open %s: %s", what, strerror(errno)));
  }
  return util::FileDescriptor(descriptor);
}

util::FileDescriptor CatchStopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  sigprocmask(SIG_BLOCK, &signals, nullptr);
  return CheckedDescriptor(signalfd(-1, &signals, SFD_NONBLOCK | SFD_CLOEXEC), "signals");
}

util::FileDescriptor OpenMountInfo(bool watch) {
  return watch ? CheckedDescriptor(open(MOUNT_INFO, O_RDONLY | O_CLOEXEC), MOUNT_INFO)
               : util::FileDescriptor();
}

template <typename Connection>
std::size_t EraseClosed(std::vector<std::unique_ptr<Connection>>& connections) {
  return std::erase_if(connections, [](const auto& connection) { return !connection->IsOpen(); });
}

} // namespace

Service::Service(const std::string& address, bool watch)
    : address_(address), signals_(CatchStopSignals()), control_(ControlAddress(address)),
      notification_(address), mountInfo_(OpenMountInfo(watch)) {}

// Each turn tries every descriptor. Requests are read first and performed last: a client that
// connected or a volume that was mounted before a request is thus handled before it.
void Service::Run() {
  Print("listening on " + address_);
  while (!IsAskedToStop()) {
    ReadRequests();
    FollowMounts();
    AcceptClients();
    ServeClients();
    PerformRequests();
    Wait();
  }
  Print("stopped");
}

bool Service::IsAskedToStop() {
  signalfd_siginfo signal{};
  return read(signals_.Get(), &signal, sizeof signal) == sizeof signal;
}

void Service::Wait() {
  std::vector<pollfd> descriptors;
  const auto add = [&descriptors](int descriptor, int events) {
    descriptors.push_back({.fd = descriptor, .events = static_cast<short>(events), .revents = 0});
  };
  add(signals_.Get(), POLLIN);
  add(mountInfo_.Get(), POLLPRI); // poll() ignores it when it is none
  if (!isFull_) {
    add(control_.Descriptor(), POLLIN);
    add(notification_.Descriptor(), POLLIN);
  }
  for (const auto& client : clients_) {
    add(client->Descriptor(), client->QueuedBytes() > 0 ? POLLIN | POLLOUT : POLLIN);
  }
  for (const auto& request : requests_) {
    add(request->Descriptor(), POLLIN);
  }
  if (poll(descriptors.data(), descriptors.size(), -1) == -1 && errno != EINTR) {
    throw util::Exception(FormatString("cannot wait for clients: %s", strerror(errno)));
  }
}

void Service::ReadRequests() {
  while (util::FileDescriptor connection = AcceptFrom(control_)) {
    requests_.push_back(std::make_unique<ControlConnection>(std::move(connection)));
  }
  for (const auto& request : requests_) {
    request->ReadAvailable();
  }
}

void Service::FollowMounts() {
  if (!mountInfo_) {
    return;
  }
  std::ifstream table(MOUNT_INFO);
  const Volumes now = ReadVolumes(table);
  const VolumeChanges changes = Compare(volumes_, now);
  for (const auto& mountPoint : changes.unplugged) {
    Print("unplugged seen: " + Printable(mountPoint));
    SendToAll(Compose(Event::Unplugged, mountPoint));
  }
  for (const auto& mountPoint : changes.plugged) {
    Print("plugged seen: " + Printable(mountPoint));
    SendToAll(Compose(Event::Plugged, mountPoint));
  }
  volumes_ = now;
}

void Service::AcceptClients() {
  while (util::FileDescriptor connection = AcceptFrom(notification_)) {
    clients_.push_back(std::make_unique<Client>(std::move(connection), ++lastNumber_));
    Client& client = *clients_.back();
    Print(FormatString("client %u connected", client.Number()));
    for (const auto& [mountPoint, id] : volumes_) {
      const std::string message = Compose(Event::Plugged, mountPoint);
      Queue(client, std::make_shared<const std::string>(Frame(message)));
      Print(FormatString("sent to client %u: %s", client.Number(), message.c_str()));
    }
  }
}

void Service::ServeClients() {
  for (const auto& client : clients_) {
    client->SendQueued();
    client->DiscardInput();
  }
  ForgetClosed();
}

void Service::PerformRequests() {
  for (const auto& request : requests_) {
    const auto& received = request->Received();
    if (request->IsOpen() && received && clients_.size() >= received->clients) {
      request->Answer(Perform(*received));
    }
  }
  if (EraseClosed(requests_) > 0) {
    isFull_ = false;
  }
}

std::size_t Service::Perform(const Request& request) {
  return request.kind == Request::Kind::Send ? SendToAll(request.message) : DropAll();
}

std::size_t Service::SendToAll(const std::string& message) {
  const auto framed = std::make_shared<const std::string>(Frame(message));
  for (const auto& client : clients_) {
    Queue(*client, framed);
  }
  ForgetClosed();
  Print("sent to " + CountOfClients(clients_.size()) + ": " + Printable(message));
  return clients_.size();
}

std::size_t Service::DropAll() {
  const std::size_t count = clients_.size();
  for (const auto& client : clients_) {
    client->Close();
  }
  Print("dropping " + CountOfClients(count));
  ForgetClosed();
  return count;
}

void Service::Queue(Client& client, const Message& framed) {
  client.Queue(framed);
  if (client.QueuedBytes() > MAXIMUM_QUEUED_BYTES) {
    Print(FormatString("client %u does not read, %zu bytes wait for it: dropping it",
                       client.Number(), client.QueuedBytes()));
    client.Close();
  }
}

void Service::ForgetClosed() {
  for (const auto& client : clients_) {
    if (!client->IsOpen()) {
      Print(FormatString("client %u gone", client->Number()));
    }
  }
  if (EraseClosed(clients_) > 0) {
    isFull_ = false;
  }
}

util::FileDescriptor Service::AcceptFrom(ListeningSocket& socket) {
  util::FileDescriptor connection = socket.Accept();
  const bool isFull = !connection && errno != EAGAIN;
  if (isFull && !isFull_) {
    Print(FormatString("cannot take another connection until one ends: %s", strerror(errno)));
  }
  isFull_ = isFull_ || isFull;
  return connection;
}

} // namespace orva::notify

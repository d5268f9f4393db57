#include "orva-notify/Service.h"

#include "commandline/Count.h"
#include "orva-notify/Descriptors.h"
#include "orva-notify/Notification.h"
#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"

#include <poll.h>
#include <sys/epoll.h>
#include <sys/signalfd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <iostream>
#include <utility>

namespace orva::notify {
namespace {

using util::FormatString;

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

template <typename Connection>
std::size_t EraseClosed(std::vector<std::unique_ptr<Connection>>& connections) {
  return std::erase_if(connections, [](const auto& connection) { return !connection->IsOpen(); });
}

} // namespace

Service::Service(const std::string& address, bool watch,
                 const std::vector<std::string>& directories, const std::string& stateDirectory)
    : address_(address), signals_(CatchStopSignals()), control_(ControlAddress(address)),
      notification_(address), volumes_(watch, directories), announced_(stateDirectory),
      readers_(CheckedDescriptor(epoll_create1(EPOLL_CLOEXEC), "epoll")) {}

// Each turn tries every descriptor. Requests are read first and performed last: a client that
// connected or a volume that was plugged before a request is thus handled before it.
void Service::Run() {
  Print("listening on " + address_);
  while (!IsAskedToStop()) {
    ReadRequests();
    FollowVolumes();
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
  add(volumes_.MountTable(), POLLPRI); // poll() ignores -1
  add(volumes_.DirectoryEvents(), POLLIN);
  add(readers_.Get(), POLLIN);
  if (!isFull_) {
    add(control_.Descriptor(), POLLIN);
    add(notification_.Descriptor(), POLLIN);
  }
  for (const auto& client : clients_) {
    if (client->AwaitsReader()) {
      client->ReportReading(readers_.Get());
    }
    add(client->Descriptor(), client->AwaitsSpace() ? POLLIN | POLLOUT : POLLIN);
  }
  for (const auto& request : requests_) {
    add(request->Descriptor(), POLLIN);
  }
  if (poll(descriptors.data(), descriptors.size(), -1) == -1 && errno != EINTR) {
    throw util::Exception(FormatString("cannot wait for clients: %s", strerror(errno)));
  }
  // Each event is taken before ServeClients() looks at the clients, so that a later one is not
  // lost.
  std::array<epoll_event, 16> events;
  while (epoll_wait(readers_.Get(), events.data(), events.size(), 0) > 0) {
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

void Service::FollowVolumes() {
  const auto changes = volumes_.TakeChanges();
  const auto plugged = std::ranges::find(changes, Event::Plugged, &Announcement::event);
  for (auto change = changes.begin(); change != plugged; ++change) {
    Print("unplugged seen: " + Printable(change->mountPoint));
    Announce(*change);
  }
  if (plugged != changes.begin()) {
    SendEnds();
    NoteUnplugged();
  }
  for (auto change = plugged; change != changes.end(); ++change) {
    Print("plugged seen: " + Printable(change->mountPoint));
    Announce(*change);
  }
}

void Service::AcceptClients() {
  while (util::FileDescriptor connection = AcceptFrom(notification_)) {
    clients_.push_back(std::make_unique<Client>(std::move(connection), ++lastNumber_));
    Client& client = *clients_.back();
    Print(FormatString("client %u connected", client.Number()));
    for (const auto& announcement : memory_.Replay()) {
      const std::string message = Compose(announcement);
      Queue(client, std::make_shared<const std::string>(Frame(message)));
      Print(FormatString("sent to client %u: %s", client.Number(), message.c_str()));
    }
    SendGone();
  }
}

void Service::ServeClients() {
  for (const auto& client : clients_) {
    const bool wasObserver = client->IsObserver();
    client->DiscardInput();
    if (client->IsObserver() && !wasObserver) {
      Print(FormatString("client %u is an observer", client->Number()));
    }
    client->SendQueued();
  }
  ForgetClosed();
}

void Service::PerformRequests() {
  for (const auto& request : requests_) {
    const auto& received = request->Received();
    if (request->IsOpen() && received && CountClients() >= received->clients) {
      Perform(*request);
    }
    if (const auto handled = request->Handled(); handled && request->IsOpen()) {
      Print("handled by " + CountOfClients(*handled));
      request->Answer(*handled);
    }
  }
  if (EraseClosed(requests_) > 0) {
    isFull_ = false;
  }
  ForgetGone();
}

void Service::Perform(ControlConnection& request) {
  const Request& received = *request.Received();
  if (received.kind == Request::Kind::Drop) {
    request.Answer(DropAll());
    return;
  }
  const auto announcement = received.raw ? std::nullopt : Recognize(received.message);
  const std::size_t count = announcement ? Announce(*announcement) : SendToAll(received.message);
  if (announcement && announcement->event == Event::Unplugged) {
    SendEnds();
    NoteUnplugged();
  } else if (announcement && announcement->event != Event::Plugged) {
    SendGone();
  }
  if (received.handled) {
    request.AwaitHandling(count, QueueMarks());
  } else {
    request.Answer(count);
  }
}

std::size_t Service::CountClients() const {
  return static_cast<std::size_t>(
      std::ranges::count_if(clients_, [](const auto& client) { return !client->IsObserver(); }));
}

std::size_t Service::Announce(const Announcement& announcement) {
  Remember(announcement);
  return SendToAll(Compose(announcement));
}

void Service::Remember(const Announcement& announcement) {
  const bool isRemembered = memory_.Remember(announcement);
  if (!isRemembered) {
    Print(FormatString("not remembered, %zu volumes or %zu bytes of mount points are the limit: ",
                       VolumeMemory::MAXIMUM_VOLUMES, VolumeMemory::MAXIMUM_BYTES) +
          Printable(announcement.mountPoint));
  }
  if (announcement.event == Event::Unplugged) {
    announced_.Unplug(announcement.mountPoint);
  } else if (announcement.event == Event::Plugged && isRemembered) {
    announced_.Plug(announcement.mountPoint);
    for (Removal& removal : removals_) {
      std::erase_if(removal.mountPoints, [this](const std::string& mountPoint) {
        return !announced_.Gone().contains(mountPoint);
      });
    }
  }
}

// The daemon removes the rows of an unplugged volume only after another one was scanned.
void Service::SendGone() {
  auto gone = UnsentGone();
  if (gone.empty() || !CanRemove()) {
    return;
  }
  for (const std::string& mountPoint : gone) {
    SendToAll(Compose(Event::Unplugged, mountPoint));
  }
  SendEnds();
  removals_.push_back({.mountPoints = std::move(gone), .handling = QueueMarks(), .isMarked = true});
}

bool Service::CanRemove() const {
  return CountClients() > 0 && memory_.HasScanned();
}

// The clients have just been told of them. No mark follows, which would be one more message.
void Service::NoteUnplugged() {
  auto gone = UnsentGone();
  if (gone.empty() || !CanRemove()) {
    return;
  }
  auto removal = std::ranges::find(removals_, false, &Removal::isMarked);
  if (removal == removals_.end()) {
    removal = removals_.insert(
        removal, {.mountPoints = {}, .handling = std::make_shared<Handling>(), .isMarked = false});
  }
  removal->mountPoints.merge(gone);
  for (const auto& client : clients_) {
    if (!client->IsObserver()) {
      client->Hold(removal->handling);
    }
  }
}

std::set<std::string> Service::UnsentGone() const {
  std::set<std::string> gone = announced_.Gone();
  for (const Removal& removal : removals_) {
    for (const std::string& mountPoint : removal.mountPoints) {
      gone.erase(mountPoint);
    }
  }
  return gone;
}

void Service::ForgetGone() {
  for (const Removal& removal : removals_) {
    if (removal.handling->handled > 0) {
      announced_.Forget(removal.mountPoints);
    }
  }
  const auto ended = [](const Removal& removal) { return removal.handling.use_count() == 1; };
  if (std::erase_if(removals_, ended) > 0) {
    SendGone();
  }
}

// The unplugged volume may have been the master. The new one has only the rows of earlier times.
void Service::SendEnds() {
  for (const auto& announcement : memory_.Ends()) {
    SendToAll(Compose(announcement));
  }
}

std::shared_ptr<const Handling> Service::QueueMarks() {
  auto handling = std::make_shared<Handling>();
  for (const auto& client : clients_) {
    if (!client->IsObserver()) {
      client->QueueMark(handling);
    }
  }
  ForgetClosed();
  return handling;
}

std::size_t Service::SendToAll(const std::string& message) {
  const auto framed = std::make_shared<const std::string>(Frame(message));
  for (const auto& client : clients_) {
    Queue(*client, framed);
  }
  ForgetClosed();
  const std::size_t count = CountClients();
  Print("sent to " + CountOfClients(count) + ": " + Printable(message));
  return count;
}

std::size_t Service::DropAll() {
  const std::size_t count = CountClients();
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

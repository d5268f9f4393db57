// Compares handling notifications from one connection in the scanned state with parsing the same
// documents by one Xerces parser, which is reused. Both write the same lines to the log.

#include "Messages.h"
#include "SocketPair.h"
#include "Volume.h"

#include "NotificationListener.h"
#include "State.h"
#include "StateMachine.h"

#include "orvautil/FileDescriptor.h"

#include <benchmark/benchmark.h>

#include <xercesc/dom/DOMDocument.hpp>
#include <xercesc/framework/MemBufInputSource.hpp>
#include <xercesc/parsers/XercesDOMParser.hpp>

#include <sys/socket.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <memory>
#include <string>
#include <system_error>
#include <thread>

namespace orva::bench {
namespace {

/// Notifications sent at once; they fit into the socket's buffer.
constexpr int MESSAGES = 500;

/// The system log of the private root. Reads and discards every message.
class Drain {
public:
  Drain() : socket_(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::string("/dev/log").copy(address.sun_path, sizeof address.sun_path - 1);
    unlink("/dev/log");
    if (bind(socket_.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
      throw std::system_error(errno, std::generic_category(), "/dev/log");
    }
    reader_ = std::jthread([this] {
      std::array<char, 4096> line;
      while (recv(socket_.Get(), line.data(), line.size(), 0) > 0) {
      }
    });
  }
  Drain(const Drain&) = delete;
  Drain& operator=(const Drain&) = delete;
  ~Drain() {
    shutdown(socket_.Get(),
             SHUT_RDWR); // ends the reader, which is joined before the socket is closed
  }

private:
  util::FileDescriptor socket_;
  std::jthread reader_;
};

/// A connection on which `bytes` were sent before it was closed.
class Sent {
public:
  explicit Sent(const std::string& bytes) {
    const int room = static_cast<int>(bytes.size()) * 2;
    setsockopt(connection_.far.Descriptor(), SOL_SOCKET, SO_SNDBUF, &room, sizeof room);
    connection_.far.Write(bytes.data(), static_cast<unsigned>(bytes.size()));
    connection_.far.Close();
  }

  util::Stream& Stream() { return connection_.near; }

private:
  test::SocketPair connection_;
};

/// The daemon's listener and state machine in the scanned state, and a system log.
struct Scanned {
  Drain log;
  test::Volume master{"Master", "150g"};
  dbmerger::NotificationListener listener;

  Scanned() {
    Sent sent(notify::Frame(test::Plugged(master.Path())) +
              notify::Frame(test::Scanned(master.Path())));
    listener.ReadMessages(sent.Stream());
    if (dbmerger::StateMachine::Instance().getCurrentState()->getStateType() !=
        dbmerger::State::MASTER_VOLUME_SCANNED) {
      throw std::runtime_error("not in the scanned state");
    }
  }
};

Scanned& Daemon() {
  static Scanned daemon;
  return daemon;
}

const std::string UNKNOWN = test::Notification("Renamed", "/shares/Master");
const std::string SCANNED = test::Scanned("/shares/Master");

void Intake(benchmark::State& state, const std::string& message) {
  Scanned& daemon = Daemon();
  std::string bytes;
  for (int i = 0; i < MESSAGES; ++i) {
    bytes += notify::Frame(message);
  }
  while (state.KeepRunning()) {
    state.PauseTiming();
    auto sent = std::make_unique<Sent>(bytes);
    state.ResumeTiming();
    daemon.listener.ReadMessages(sent->Stream());
    state.PauseTiming();
    sent.reset();
    state.ResumeTiming();
  }
  state.SetItemsProcessed(state.iterations() * MESSAGES);
}

void BareParser(benchmark::State& state, const std::string& message, bool isLogged) {
  Daemon();
  xercesc::XercesDOMParser parser;
  const auto* const bytes = reinterpret_cast<const XMLByte*>(message.data());
  while (state.KeepRunning()) {
    for (int i = 0; i < MESSAGES; ++i) {
      parser.parse(xercesc::MemBufInputSource(bytes, message.size(), "message"));
      benchmark::DoNotOptimize(parser.getDocument()->getDocumentElement());
      if (isLogged) {
        syslog(LOG_LOCAL1 | LOG_INFO, "%s:: Scanned", "");
      }
      parser.resetDocumentPool();
    }
  }
  state.SetItemsProcessed(state.iterations() * MESSAGES);
}

BENCHMARK_CAPTURE(Intake, unknown, UNKNOWN)->Name("notification of an unknown name/ours");
BENCHMARK_CAPTURE(BareParser, unknown, UNKNOWN, false)
    ->Name("notification of an unknown name/theirs");
BENCHMARK_CAPTURE(Intake, scanned, SCANNED)->Name("notification Scanned/ours");
BENCHMARK_CAPTURE(BareParser, scanned, SCANNED, true)->Name("notification Scanned/theirs");

} // namespace
} // namespace orva::bench

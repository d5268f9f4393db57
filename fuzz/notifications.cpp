// The input is what a connection sends. It passes framing, validation, parsing and the registry, up
// to the call of the state's handler. The first byte determines the pieces in which the others
// arrive; a byte of value 31 stands for many blanks, so that short inputs make messages of the
// maximum length and longer ones.

#include "Fuzzing.h"

#include "NotificationListener.h"
#include "State.h"
#include "StateMachine.h"
#include "VolumeInfoManager.h"

#include "orvautil/Path.h"
#include "orvautil/Stream.h"

#include <xercesc/util/PlatformUtils.hpp>

#include <syslog.h>

#include <algorithm>
#include <filesystem>
#include <memory>
#include <string_view>

namespace {

using namespace orva;
using dbmerger::VolumeInfo;
using dbmerger::VolumeInfoManager;
using fuzz::Require;

const std::string DELIMITER(4, '\0');
const std::string GOOD = R"(<ORVANotification Name="End" MountPoint="/shares/Good"/>)";

/// The bytes that an input expands to.
std::string Expand(std::string_view input) {
  constexpr char blanks = 31;
  constexpr std::size_t count = 4096;
  constexpr std::size_t most = 262144;
  std::string bytes;
  for (const char byte : input) {
    if (byte == blanks && bytes.size() < most) {
      bytes.append(count, ' ');
    } else {
      bytes += byte;
    }
  }
  return bytes;
}

const fuzz::LogLine SKIPPED{LOG_LOCAL1 | LOG_ERR,
                            "MessageProcessor:: message of more than 65536 bytes skipped"};

struct Event {
  const char* kind;
  std::string mountPoint;

  bool operator==(const Event&) const = default;
};

/// A state that only records the events.
class Recorder : public dbmerger::State {
public:
  explicit Recorder(std::vector<Event>& events) : events_(events) {}

  void handleVolumePlugged(VolumeInfo volume) override { Add("Plugged", volume); }
  void handleVolumeUnplugged(VolumeInfo volume) override { Add("Unplugged", volume); }
  void handleVolumeScanned(VolumeInfo volume) override { Add("Scanned", volume); }
  void handlePictureTranscoded(VolumeInfo volume) override { Add("Transcoded", volume); }
  void handleVolumePurged(VolumeInfo volume) override { Add("Purged", volume); }
  int getStateType() override { return DEFAULT; }

private:
  void Add(const char* kind, const VolumeInfo& volume) {
    events_.push_back({kind, volume.mountPoint});
  }

  std::vector<Event>& events_;
};

/// Bytes that arrive in pieces: the first of `first` bytes, the others of sizes derived from it.
/// With 0 each read takes all it can.
class PiecewiseStream : public util::Stream {
public:
  PiecewiseStream(std::string_view bytes, std::uint8_t first) : rest_(bytes), piece_(first) {}

  bool IsOpen() const override { return true; }
  void Close() override {}
  void Flush() override {}
  bool IsDataAvailable(unsigned long long* /*count*/) override { return true; }
  unsigned Write(const void* /*data*/, unsigned size) override { return size; }

  unsigned Read(void* data, unsigned size) override {
    const unsigned most = piece_ == 0 ? size : std::min(size, piece_);
    const std::size_t count = rest_.copy(static_cast<char*>(data), most);
    rest_.remove_prefix(count);
    piece_ = piece_ * 7 % 257; // passes through every size but 0
    return static_cast<unsigned>(count);
  }

private:
  std::string_view rest_;
  unsigned piece_;
};

/// The results of a connection.
struct Outcome {
  std::vector<Event> events;
  std::vector<std::string> volumes; ///< mount points in the registry
  std::vector<fuzz::LogLine> log;

  bool operator==(const Outcome&) const = default;
};

std::vector<Event> events;

Outcome Receive(std::string_view bytes, std::uint8_t firstPiece) {
  std::unique_ptr<VolumeInfoManager>(VolumeInfoManager::instance).reset();
  VolumeInfoManager::instance = nullptr;
  events.clear();
  fuzz::TakeLog();

  PiecewiseStream stream(bytes, firstPiece);
  dbmerger::NotificationListener().ReadMessages(stream);

  Outcome outcome{.events = events, .log = fuzz::TakeLog()};
  for (const VolumeInfo& volume : VolumeInfoManager::Instance().getVolumes()) {
    outcome.volumes.push_back(volume.mountPoint);
  }
  return outcome;
}

/// The lengths of the messages in a stream.
std::vector<std::size_t> Cut(std::string_view bytes) {
  std::vector<std::size_t> lengths;
  std::size_t begin = 0;
  for (std::size_t end = 0; (end = bytes.find(DELIMITER, begin)) != std::string_view::npos;) {
    lengths.push_back(end - begin);
    begin = end + DELIMITER.size();
  }
  return lengths;
}

bool IsMountPoint(const std::string& text) {
  return text.ends_with('/') && text.find('\0') == std::string::npos;
}

void Examine(const Outcome& outcome, const std::vector<std::size_t>& lengths) {
  Require(!outcome.events.empty() && outcome.events.back() == Event{"Transcoded", "/shares/Good/"},
          "a good message after anything is handled");
  Require(outcome.events.size() <= lengths.size(), "a message is one event at most");
  Require(std::ranges::all_of(outcome.events, IsMountPoint, &Event::mountPoint),
          "an event names a mount point that ends in a separator");
  Require(std::ranges::count(outcome.log, LOG_LOCAL1 | LOG_ERR, &fuzz::LogLine::priority) <=
              std::ssize(lengths),
          "a message is one line about an error at most");
  const auto isTooLong = [](std::size_t length) {
    return length > util::MessageProcessor::MAXIMUM_MESSAGE_LENGTH;
  };
  Require(std::ranges::count(outcome.log, SKIPPED) == std::ranges::count_if(lengths, isTooLong),
          "every message that is too long is logged");
  for (auto volume = outcome.volumes.begin(); volume != outcome.volumes.end(); ++volume) {
    Require(IsMountPoint(*volume) && util::Path(*volume).Exists(), "a registered volume exists");
    Require(std::find(outcome.volumes.begin(), volume, *volume) == volume,
            "a volume is registered once");
  }
}

} // namespace

int LLVMFuzzerInitialize(int* /*count*/, char*** /*arguments*/) {
  xercesc::XMLPlatformUtils::Initialize();
  for (const char* const path : {"/shares/Photos", "/shares/My Photos", "/shares/Good"}) {
    std::filesystem::create_directories(path);
  }
  fuzz::ResetStandardOutput();
  dbmerger::StateMachine::Instance().setCurrentState(std::make_unique<Recorder>(events).release());
  return 0;
}

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) {
    return 0;
  }
  const std::string_view input(reinterpret_cast<const char*>(data), size);
  // The "x" ends a run of zeros, which could be the beginning of a delimiter.
  const std::string bytes = Expand(input.substr(1)) + "x" + DELIMITER + GOOD + DELIMITER;

  const Outcome inPieces = Receive(bytes, data[0]);
  Examine(inPieces, Cut(bytes));
  if (data[0] != 0) {
    Require(inPieces == Receive(bytes, 0), "the pieces that a message comes in do not matter");
  }
  return 0;
}

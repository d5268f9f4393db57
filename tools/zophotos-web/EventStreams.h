#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <list>
#include <mutex>
#include <string>

struct MHD_Connection;
struct MHD_Response;

namespace orva::web {

/// The clients that are told of changes by server-sent events. A stream needs no thread: its
/// connection is suspended while there is nothing to send. Any thread.
class EventStreams {
public:
  static constexpr std::size_t MOST = 256;

  /// A stream without events gets a comment after this time, so that clients and proxies know that
  /// it is alive.
  static constexpr std::chrono::seconds SILENCE{25};

  EventStreams() = default;
  EventStreams(const EventStreams&) = delete;
  EventStreams& operator=(const EventStreams&) = delete;

  /// Sends "event: change" with the snapshot's `version` to all streams; each new one gets the
  /// latest version first.
  void PublishVersion(std::int64_t version);

  /// Sends "event: volumes" with the same version to all streams: what the services do with the
  /// volumes has changed.
  void PublishVolumes();

  /// Sends the comments that are due, and ends the streams whose clients are gone.
  void KeepAlive();

  /// Ends all streams, and accepts no more.
  void Close();

  /// The body of a response on `connection`; null if there are too many streams. To be released by
  /// the caller, as libmicrohttpd does it.
  MHD_Response* Open(MHD_Connection* connection);

private:
  using Clock = std::chrono::steady_clock;

  struct Stream {
    EventStreams& all;
    MHD_Connection* connection;
    int socket;
    std::string unsent{};          ///< text that did not fit
    std::int64_t sentVersion = -1; ///< -1: none
    std::uint64_t sentVolumes = 0; ///< counts as volumes_ does
    Clock::time_point lastSent = Clock::now();
    bool isSuspended = false;
    bool isGone = false; ///< the client
  };

  static std::ptrdiff_t Read(void* stream, std::uint64_t position, char* buffer, std::size_t size);
  static void Free(void* stream);

  void Collect(Stream& stream) const;
  static void Resume(Stream& stream);
  void ResumeAll();
  void EndGone();

  std::mutex mutex_;
  std::list<Stream> streams_;
  std::int64_t version_ = 0;
  std::uint64_t volumes_ = 0; ///< how often it has changed
  bool isClosed_ = false;
};

} // namespace orva::web

#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <list>
#include <mutex>

namespace orva::web {

/// The connections of the server, and how long each may take for what it does. libmicrohttpd only
/// knows how long one may be silent; a client that sends a byte now and then could stay. A
/// connection that is late is shut down; its thread then closes it. Any thread.
class Connections {
public:
  using Clock = std::chrono::steady_clock;

  /// How long a client may take to send a request, after it connected or received a response.
  static constexpr std::chrono::seconds REQUEST_TIME{30};
  /// A response may take this long, and a second more for each so many bytes.
  static constexpr std::chrono::seconds RESPONSE_TIME{30};
  static constexpr std::uint64_t BYTES_PER_SECOND = 16'384;

  class Connection {
  public:
    explicit Connection(int socket) : socket_(socket) { ExpectRequest(); }

    void ExpectRequest();
    /// A response of `size` bytes is sent.
    void SendResponse(std::uint64_t size);
    /// Events are sent, for any time.
    void SendEvents() {
      isWaiting_ = false;
      deadline_ = Clock::time_point::max();
    }

    int Socket() const noexcept { return socket_; }

  private:
    friend Connections;

    int socket_;
    std::atomic<bool> isWaiting_{true}; ///< for a request
    std::atomic<Clock::time_point> deadline_{};
  };

  /// From `crowd` connections on, a new one displaces the one that has waited longest for a
  /// request.
  explicit Connections(std::size_t crowd) : crowd_(crowd) {}

  /// The connection at `socket`, until it is removed. Its socket stays open until then.
  Connection& Add(int socket);
  void Remove(Connection& connection);

  /// Shuts the connections down that are late.
  void ShutDownLate();

private:
  void ShutDownOldest();

  std::size_t crowd_;
  std::mutex mutex_;
  std::list<Connection> all_;
};

} // namespace orva::web

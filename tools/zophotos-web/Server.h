#pragma once

#include "AllowedHosts.h"
#include "Connections.h"
#include "DiskThreads.h"
#include "EventStreams.h"
#include "Request.h"
#include "Response.h"

#include "orvautil/FileDescriptor.h"

#include <atomic>
#include <cstddef>
#include <functional>
#include <string>
#include <thread>

struct MHD_Daemon;

namespace orva::web {

/// The HTTP server: takes connections, checks requests, and sends responses. A few threads serve
/// all connections. Connections whose responses wait for a disk are suspended.
class Server {
public:
  static constexpr unsigned THREADS = 4;
  static constexpr unsigned MOST_CONNECTIONS = 1200;

  struct Handlers {
    /// Answers a request. Called by several threads at once. What it throws becomes status 500.
    std::function<Response(const Request&)> answer;
    /// A response for people or programs that says why `path` is not served.
    std::function<Response(int status, const std::string& path, const std::string& reason)> refuse;
    /// Logs an error of the program.
    std::function<void(const std::string&)> log;
  };

  /// Serves the connections to `listener`, a listening socket. Throws std::runtime_error.
  Server(util::FileDescriptor listener, AllowedHosts hosts, Handlers handlers);
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;
  /// Ends the connections.
  ~Server();

  EventStreams& Events() noexcept { return events_; }

private:
  struct Calls; ///< what libmicrohttpd calls

  AllowedHosts hosts_;
  Handlers handlers_;
  unsigned limit_;                           ///< of connections
  std::atomic<std::size_t> unsentTexts_ = 0; ///< bytes of the texts that responses have
  EventStreams events_;
  Connections connections_;
  DiskThreads disks_;
  MHD_Daemon* daemon_ = nullptr; ///< owned
  std::jthread clock_;           ///< ends what takes too long
};

} // namespace orva::web

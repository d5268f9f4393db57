#include "Server.h"

#include <microhttpd.h>

#include <sys/resource.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string_view>
#include <utility>

namespace orva::web {
namespace {

constexpr std::size_t CONNECTION_MEMORY = 16 << 10; // bytes: bounds the headers of a request
constexpr unsigned SILENCE = 30;                    // seconds
constexpr std::size_t LINE_END = 2;                 // bytes

/// A text with more than SMALL_TEXT bytes is not sent while texts with MOST_UNSENT bytes wait for
/// clients that do not read them.
constexpr std::size_t SMALL_TEXT = 8 << 10;
constexpr std::size_t MOST_UNSENT = 16 << 20;

/// Seconds after which a client that was refused may try again.
constexpr const char* RETRY_AFTER = "5";

/// What all responses have. Nothing may be loaded from elsewhere, and no other site may show or
/// read what we send.
constexpr std::array<std::pair<const char*, const char*>, 7> SECURITY{
    {{"Content-Security-Policy", "default-src 'self'; object-src 'none'; base-uri 'none'; "
                                 "form-action 'self'; frame-ancestors 'none'; "
                                 "require-trusted-types-for 'script'; trusted-types 'none'"},
     {"X-Content-Type-Options", "nosniff"},
     {"X-Frame-Options", "DENY"},
     {"Referrer-Policy", "no-referrer"},
     {"Cross-Origin-Resource-Policy", "same-origin"},
     {"Cross-Origin-Opener-Policy", "same-origin"},
     {"Permissions-Policy", "camera=(), geolocation=(), microphone=()"}}};

struct ResponseReleaser {
  void operator()(MHD_Response* response) const noexcept { MHD_destroy_response(response); }
};
using MhdResponse = std::unique_ptr<MHD_Response, ResponseReleaser>;

/// A request, from its first line until the response is sent.
struct Exchange {
  std::string text; ///< the target as it was sent
  bool isHead = false;
  std::optional<Request> request{}; ///< nothing until it is checked
  std::optional<Response> ready{};  ///< made by another thread, while the connection is suspended
};

/// The headers that matter to us.
struct Headers {
  int hosts = 0;
  std::string host;
  std::size_t size = 0; ///< of their lines, in bytes
  bool areMalformed = false;
  bool hasBody = false;
  bool isFromOtherSite = false;
  bool isNavigation = false;
  Request request{};
};

bool IsEqual(std::string_view text, std::string_view lower) {
  return std::ranges::equal(text, lower, [](char a, char b) {
    return (a >= 'A' && a <= 'Z' ? static_cast<char>(a - 'A' + 'a') : a) == b;
  });
}

bool IsNameCharacter(char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' ||
         c == '_';
}

MHD_Result Collect(void* headers, MHD_ValueKind /*kind*/, const char* key, std::size_t keySize,
                   const char* value, std::size_t valueSize) {
  Headers& all = *static_cast<Headers*>(headers);
  const std::string_view name(key, keySize);
  const std::string_view text(value == nullptr ? "" : value, valueSize);
  // A proxy may take "Content-Length :" for the header without the space.
  all.areMalformed = all.areMalformed || !std::ranges::all_of(name, IsNameCharacter);
  all.size += name.size() + std::string_view(": ").size() + text.size() + LINE_END;
  if (IsEqual(name, "host")) {
    ++all.hosts;
    all.host = text;
  } else if (IsEqual(name, "transfer-encoding") ||
             (IsEqual(name, "content-length") && text != "0")) {
    all.hasBody = true;
  } else if (IsEqual(name, "sec-fetch-site")) {
    all.isFromOtherSite = text == "cross-site" || text == "same-site";
  } else if (IsEqual(name, "sec-fetch-mode")) {
    all.isNavigation = text == "navigate";
  } else if (IsEqual(name, "if-none-match")) {
    all.request.ifNoneMatch = text;
  } else if (IsEqual(name, "if-range")) {
    all.request.ifRange = text;
  } else if (IsEqual(name, "range")) {
    all.request.range = text;
  }
  return MHD_YES;
}

/// The body of a response, which is counted while it lives.
class TextBody {
public:
  TextBody(std::string text, std::atomic<std::size_t>& unsent)
      : text_(std::move(text)), unsent_(unsent) {
    unsent_ += text_.capacity();
  }
  TextBody(const TextBody&) = delete;
  TextBody& operator=(const TextBody&) = delete;
  ~TextBody() { unsent_ -= text_.capacity(); }

  std::string& Text() noexcept { return text_; }

private:
  std::string text_;
  std::atomic<std::size_t>& unsent_;
};

void ReleaseText(void* body) {
  std::unique_ptr<TextBody>(static_cast<TextBody*>(body)).reset();
}

MhdResponse MakeTextBody(std::string text, std::atomic<std::size_t>& unsent) {
  auto owner = std::make_unique<TextBody>(std::move(text), unsent);
  MhdResponse response(MHD_create_response_from_buffer_with_free_callback_cls(
      owner->Text().size(), owner->Text().data(), &ReleaseText, owner.get()));
  if (response) {
    static_cast<void>(owner.release()); // by ReleaseText
  }
  return response;
}

MhdResponse MakeFileBody(FilePart part) {
  MhdResponse response(
      MHD_create_response_from_fd_at_offset64(part.size, part.file.Get(), part.offset));
  if (response) {
    static_cast<void>(part.file.Release());
  }
  return response;
}

Connections::Connection* ConnectionOf(MHD_Connection* connection) {
  const MHD_ConnectionInfo* const info =
      MHD_get_connection_info(connection, MHD_CONNECTION_INFO_SOCKET_CONTEXT);
  return static_cast<Connections::Connection*>(info->socket_context);
}

int SocketOf(MHD_Connection* connection) {
  return MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD)->connect_fd;
}

/// The bytes of a request up to its body.
std::size_t SizeOf(MHD_Connection* connection) {
  return MHD_get_connection_info(connection, MHD_CONNECTION_INFO_REQUEST_HEADER_SIZE)->header_size;
}

/// As many connections as this process may have open files for: each may send a file.
unsigned ConnectionLimit(unsigned wanted) {
  constexpr rlim_t RESERVE = 64;
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) {
    return wanted;
  }
  const rlim_t needed = 2 * rlim_t{wanted} + RESERVE;
  if (limit.rlim_cur < needed) {
    limit.rlim_cur = std::min(limit.rlim_max, needed);
    setrlimit(RLIMIT_NOFILE, &limit);
  }
  const rlim_t possible = limit.rlim_cur > RESERVE ? (limit.rlim_cur - RESERVE) / 2 : 1;
  return static_cast<unsigned>(std::clamp<rlim_t>(possible, Server::THREADS, wanted));
}

/// Calls `tick` each second until the thread is to stop.
void RunClock(const std::stop_token& stop, const std::function<void()>& tick) {
  std::mutex mutex;
  std::unique_lock lock(mutex);
  std::condition_variable_any changed;
  while (!changed.wait_for(lock, stop, std::chrono::seconds(1),
                           [&] { return stop.stop_requested(); })) {
    tick();
  }
}

/// What is wrong with a request, for the client.
struct Refusal {
  int status;
  const char* reason;
};

/// Why a request is refused; nothing if it is not.
std::optional<Refusal> Check(const Headers& headers, const AllowedHosts& hosts, int socket,
                             std::string_view method) {
  if (headers.areMalformed) {
    return Refusal{MHD_HTTP_BAD_REQUEST, "The request is malformed."};
  }
  if (headers.hosts != 1) {
    return Refusal{MHD_HTTP_BAD_REQUEST, "The request must have one Host header."};
  }
  if (!hosts.Contains(headers.host) && !AllowedHosts::IsLocalAddress(headers.host, socket)) {
    return Refusal{MHD_HTTP_MISDIRECTED_REQUEST,
                   "This server is not known by the name in the Host header. The option --host "
                   "gives it another name."};
  }
  if (headers.hasBody) {
    return Refusal{MHD_HTTP_BAD_REQUEST, "A request must not have a body."};
  }
  if (method != "GET" && method != "HEAD") {
    return Refusal{MHD_HTTP_METHOD_NOT_ALLOWED, "Only GET and HEAD are allowed."};
  }
  if (headers.isFromOtherSite && !headers.isNavigation) {
    return Refusal{MHD_HTTP_FORBIDDEN, "Pages of other sites may not use this server."};
  }
  return std::nullopt;
}

} // namespace

struct Server::Calls {
  static void* Begin(void* /*server*/, const char* target,
                     MHD_Connection* /*connection*/) noexcept {
    try {
      return std::make_unique<Exchange>(Exchange{.text = target}).release(); // until End
    } catch (const std::bad_alloc&) {
      return nullptr;
    }
  }

  static void End(void* /*server*/, MHD_Connection* connection, void** exchange,
                  MHD_RequestTerminationCode /*code*/) noexcept {
    std::unique_ptr<Exchange>(static_cast<Exchange*>(*exchange)).reset();
    *exchange = nullptr;
    if (Connections::Connection* const current = ConnectionOf(connection)) {
      current->ExpectRequest();
    }
  }

  static void Notify(void* server, MHD_Connection* connection, void** context,
                     MHD_ConnectionNotificationCode code) noexcept {
    Server& self = *static_cast<Server*>(server);
    if (code == MHD_CONNECTION_NOTIFY_STARTED) {
      *context = &self.connections_.Add(SocketOf(connection));
    } else if (*context != nullptr) {
      self.connections_.Remove(*static_cast<Connections::Connection*>(*context));
      *context = nullptr;
    }
  }

  /// Called when the headers of a request are read, and again when it is complete.
  static MHD_Result Handle(void* server, MHD_Connection* connection, const char* /*url*/,
                           const char* method, const char* version, const char* /*upload*/,
                           std::size_t* /*uploadSize*/, void** exchange) noexcept {
    Server& self = *static_cast<Server*>(server);
    auto* const current = static_cast<Exchange*>(*exchange);
    if (current == nullptr) {
      return MHD_NO; // no memory: ends the connection
    }
    try {
      if (current->request) {
        const Request& request = *current->request;
        Response response = current->ready ? std::move(*current->ready)
                                           : Answer(self, request.target.path, [&self, &request] {
                                               return self.handlers_.answer(request);
                                             });
        if (auto* const work = std::get_if<DiskWork>(&response.body)) {
          Defer(self, connection, *current, std::move(*work));
          return MHD_YES; // this is called again
        }
        if (current->isHead && std::holds_alternative<EventStream>(response.body)) {
          response.body = std::string(); // libmicrohttpd would send the end of a stream
        }
        return Send(self, connection, request.target.path, std::move(response));
      }
      const auto refusal = CheckRequest(self, connection, method, version, *current);
      return refusal ? Refuse(self, connection, *refusal, current->text) : MHD_YES;
    } catch (const std::exception& error) {
      self.handlers_.log(error.what());
    }
    return MHD_NO;
  }

  /// Fills the request in.
  static std::optional<Refusal> CheckRequest(const Server& self, MHD_Connection* connection,
                                             std::string_view method, std::string_view version,
                                             Exchange& exchange) {
    Headers headers;
    MHD_get_connection_values_n(connection, MHD_HEADER_KIND, &Collect, &headers);
    exchange.isHead = method == "HEAD";
    const std::size_t lines = method.size() + 1 + exchange.text.size() + 1 + version.size() +
                              LINE_END + headers.size + LINE_END;
    // libmicrohttpd cuts texts off at NUL bytes, and a proxy may read what follows.
    headers.areMalformed = headers.areMalformed || SizeOf(connection) > lines;
    auto refusal = Check(headers, self.hosts_, SocketOf(connection), method);
    auto target = ParseTarget(exchange.text);
    if (!refusal && !target) {
      refusal = {MHD_HTTP_BAD_REQUEST, "The address is malformed."};
    }
    if (!refusal) {
      headers.request.target = std::move(*target);
      exchange.request = std::move(headers.request);
    }
    return refusal;
  }

  /// What `make` returns, or the error that it throws, for the request of `path`.
  static Response Answer(const Server& self, const std::string& path,
                         const std::function<Response()>& make) {
    try {
      return make();
    } catch (const std::exception& error) {
      self.handlers_.log(error.what());
    } catch (const std::string& error) { // the database layer's
      self.handlers_.log(error);
    }
    return self.handlers_.refuse(MHD_HTTP_INTERNAL_SERVER_ERROR, path,
                                 "This failed. The log of zophotos-web says why.");
  }

  /// Suspends the connection until another thread has made the response.
  static void Defer(Server& self, MHD_Connection* connection, Exchange& exchange, DiskWork work) {
    const auto run = [&self, connection, &exchange, make = std::move(work.make)](bool mayRun) {
      const std::string& path = exchange.request->target.path;
      exchange.ready = mayRun ? Answer(self, path, make)
                              : Busy(self, path, "The disk of this photo is too slow.");
      MHD_resume_connection(connection);
    };
    ConnectionOf(connection)->SendResponse(0);
    MHD_suspend_connection(connection);
    if (!self.disks_.Add(work.volume, run)) {
      run(false);
    }
  }

  /// Ends the connection: what follows the headers is not read.
  static MHD_Result Refuse(Server& self, MHD_Connection* connection, const Refusal& refusal,
                           const std::string& target) {
    Response response = self.handlers_.refuse(refusal.status, target, refusal.reason);
    response.headers.emplace_back("Connection", "close");
    if (refusal.status == MHD_HTTP_METHOD_NOT_ALLOWED) {
      response.headers.emplace_back("Allow", "GET, HEAD");
    }
    return Send(self, connection, target, std::move(response));
  }

  static MhdResponse MakeBody(Server& self, MHD_Connection* connection, Response& response) {
    Connections::Connection& current = *ConnectionOf(connection);
    if (auto* const part = std::get_if<FilePart>(&response.body)) {
      current.SendResponse(part->size);
      return MakeFileBody(std::move(*part));
    }
    if (auto* const text = std::get_if<std::string>(&response.body)) {
      if (text->size() > SMALL_TEXT && self.unsentTexts_ > MOST_UNSENT) {
        return {};
      }
      current.SendResponse(text->size());
      return MakeTextBody(std::move(*text), self.unsentTexts_);
    }
    MhdResponse events(self.events_.Open(connection));
    if (events) {
      current.SendEvents();
    }
    return events;
  }

  static Response Busy(const Server& self, const std::string& path, const char* reason) {
    Response response = self.handlers_.refuse(MHD_HTTP_SERVICE_UNAVAILABLE, path, reason);
    response.headers.emplace_back("Retry-After", RETRY_AFTER);
    return response;
  }

  /// Sends the response to a request for `path`.
  static MHD_Result Send(Server& self, MHD_Connection* connection, const std::string& path,
                         Response response) {
    MhdResponse body = MakeBody(self, connection, response);
    if (!body && !std::holds_alternative<FilePart>(response.body)) {
      response = Busy(self, path,
                      std::holds_alternative<EventStream>(response.body)
                          ? "Too many clients wait for events."
                          : "Too many responses wait for clients.");
      body = MakeBody(self, connection, response);
    }
    if (!body) {
      return MHD_NO;
    }
    for (const auto& [name, value] : SECURITY) {
      MHD_add_response_header(body.get(), name, value);
    }
    if (!response.type.empty()) {
      MHD_add_response_header(body.get(), "Content-Type", response.type.c_str());
    }
    for (const auto& [name, value] : response.headers) {
      MHD_add_response_header(body.get(), name.c_str(), value.c_str());
    }
    return MHD_queue_response(connection, static_cast<unsigned>(response.status), body.get());
  }
};

Server::Server(util::FileDescriptor listener, AllowedHosts hosts, Handlers handlers)
    : hosts_(std::move(hosts)), handlers_(std::move(handlers)),
      limit_(ConnectionLimit(MOST_CONNECTIONS)), connections_(limit_ - limit_ / 8) {
  std::vector<MHD_OptionItem> options{
      {MHD_OPTION_LISTEN_SOCKET, listener.Get(), nullptr},
      {MHD_OPTION_THREAD_POOL_SIZE, THREADS, nullptr},
      {MHD_OPTION_CONNECTION_LIMIT, static_cast<std::intptr_t>(limit_), nullptr},
      {MHD_OPTION_CONNECTION_MEMORY_LIMIT, CONNECTION_MEMORY, nullptr},
      {MHD_OPTION_CONNECTION_TIMEOUT, SILENCE, nullptr},
      {MHD_OPTION_SIGPIPE_HANDLED_BY_APP, 1, nullptr},
      {MHD_OPTION_END, 0, nullptr}};
  daemon_ = MHD_start_daemon(MHD_USE_EPOLL_INTERNAL_THREAD | MHD_USE_SUSPEND_RESUME, 0, nullptr,
                             nullptr, &Calls::Handle, this, MHD_OPTION_ARRAY, options.data(),
                             MHD_OPTION_URI_LOG_CALLBACK, &Calls::Begin, this,
                             MHD_OPTION_NOTIFY_COMPLETED, &Calls::End, this,
                             MHD_OPTION_NOTIFY_CONNECTION, &Calls::Notify, this, MHD_OPTION_END);
  if (daemon_ == nullptr) {
    throw std::runtime_error("cannot start the HTTP server");
  }
  static_cast<void>(listener.Release()); // the daemon owns it
  clock_ = std::jthread([this](const std::stop_token& stop) {
    RunClock(stop, [this] {
      connections_.ShutDownLate();
      events_.KeepAlive();
      disks_.EndLate();
    });
  });
}

Server::~Server() {
  clock_.request_stop();
  clock_.join();
  disks_.Stop();
  events_.Close();
  // libmicrohttpd would shut the socket down, and systemd could not go on listening.
  const util::FileDescriptor listener(MHD_quiesce_daemon(daemon_));
  MHD_stop_daemon(daemon_);
}

} // namespace orva::web

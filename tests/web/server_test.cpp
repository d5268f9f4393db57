// The HTTP server with clients that are correct, slow, many or malicious.

#include "HttpClient.h"

#include "system/Deadline.h"

#include "zophotos-web/Server.h"
#include "zophotos-web/SocketAddress.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fcntl.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <filesystem>
#include <list>
#include <memory>
#include <mutex>
#include <shared_mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace orva::web {
namespace {

using test::HttpConnection;
using test::HttpGet;
using test::HttpResponse;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::StartsWith;

constexpr std::uint64_t LARGE = 64 << 20;

/// A server with a few resources of its own.
class WebServer : public ::testing::Test {
protected:
  WebServer() {
    file_.Reset(memfd_create("file", MFD_CLOEXEC));
    EXPECT_EQ(0, ftruncate(file_.Get(), LARGE));
    util::FileDescriptor listener = SocketAddress::Parse("127.0.0.1:0")->Listen();
    sockaddr_in address{};
    socklen_t size = sizeof address;
    EXPECT_EQ(0, getsockname(listener.Get(), reinterpret_cast<sockaddr*>(&address), &size));
    port = ntohs(address.sin_port);
    server = std::make_unique<Server>(
        std::move(listener), AllowedHosts({"photos.example.org"}),
        Server::Handlers{.answer = [this](const Request& request) { return Answer(request); },
                         .refuse =
                             [](int status, std::string_view path, const std::string& reason) {
                               return Response{.status = status,
                                               .type = "text/plain",
                                               .body = std::string(path) + ": " + reason};
                             },
                         .log =
                             [this](const std::string& text) {
                               const std::lock_guard lock(mutex_);
                               log_.push_back(text);
                             }});
  }

  HttpResponse Get(const std::string& target, const std::string& headers = "") const {
    return test::Get(port, target, headers);
  }

  /// The status of the response to some bytes.
  int StatusOf(const std::string& bytes) const {
    HttpConnection connection(port);
    connection.Send(bytes);
    return connection.ReadHeaders().status;
  }

  /// All that the server sends for some bytes, after which nothing is sent.
  std::string AnswerTo(const std::string& bytes) const {
    HttpConnection connection(port);
    connection.Send(bytes);
    connection.EndRequests();
    return connection.ReadToEnd();
  }

  std::vector<std::string> Requests() {
    const std::lock_guard lock(mutex_);
    return requests_;
  }

  std::vector<std::string> Log() {
    const std::lock_guard lock(mutex_);
    return log_;
  }

  int File() const { return file_.Get(); }

  /// How often this process has the file open.
  static long OpenFiles() {
    const std::filesystem::directory_iterator all("/proc/self/fd");
    return std::count_if(begin(all), end(all), [](const auto& entry) {
      std::error_code closed;
      return std::filesystem::read_symlink(entry, closed).string().starts_with("/memfd:file");
    });
  }

  std::shared_mutex disk; ///< locked while it is slow
  std::uint16_t port = 0;
  std::unique_ptr<Server> server;

private:
  Response Answer(const Request& request) {
    const std::string& path = request.target.path;
    {
      const std::lock_guard lock(mutex_);
      requests_.push_back(path);
    }
    if (path == "/throws") {
      throw std::runtime_error("out of order");
    }
    if (path == "/throws-text") {
      throw std::string("database out of order");
    }
    if (path == "/file" || path == "/part") {
      const std::uint64_t offset = path == "/part" ? 1000 : 0;
      return {.type = "image/jpeg",
              .body = FilePart{.file = util::FileDescriptor(dup(file_.Get())),
                               .offset = offset,
                               .size = path == "/part" ? 10 : LARGE}};
    }
    if (path == "/slow" || path == "/quick") {
      return {.body = DiskWork{.volume = path, .make = [this, path] {
                                 if (path == "/slow") {
                                   const std::shared_lock wait(disk);
                                 }
                                 return Response{.type = "text/plain", .body = "file of " + path};
                               }}};
    }
    if (path == "/disk-throws") {
      return {.body = DiskWork{.volume = path, .make = []() -> Response {
                                 throw std::runtime_error("disk out of order");
                               }}};
    }
    if (path == "/large") {
      return {.type = "text/plain", .body = std::string(16 << 20, 'x')};
    }
    if (path == "/events") {
      return {.type = "text/event-stream", .body = EventStream()};
    }
    return {.type = "text/plain", .body = "content of " + path};
  }

  util::FileDescriptor file_;
  std::mutex mutex_; ///< of the following
  std::vector<std::string> requests_;
  std::vector<std::string> log_;
};

TEST_F(WebServer, AnswersRequests) {
  const HttpResponse response = Get("/a?b=c");
  EXPECT_EQ(200, response.status);
  EXPECT_EQ("content of /a", response.body);
  EXPECT_EQ("text/plain", response.Header("content-type"));
}

TEST_F(WebServer, SendsTheSecurityHeadersWithEachResponse) {
  for (const char* const target : {"/a", "/file", "/throws", "/%zz"}) {
    HttpConnection connection(port);
    connection.Send(HttpGet(target));
    const HttpResponse response = connection.ReadHeaders();
    EXPECT_THAT(response.Header("content-security-policy"), StartsWith("default-src 'self'"));
    EXPECT_THAT(response.Header("content-security-policy"), HasSubstr("frame-ancestors 'none'"));
    EXPECT_THAT(response.Header("content-security-policy"),
                HasSubstr("require-trusted-types-for 'script'; trusted-types 'none'"));
    EXPECT_EQ("nosniff", response.Header("x-content-type-options"));
    EXPECT_EQ("no-referrer", response.Header("referrer-policy"));
    EXPECT_EQ("same-origin", response.Header("cross-origin-resource-policy"));
  }
}

TEST_F(WebServer, KeepsTheConnection) {
  HttpConnection connection(port);
  for (const char* const path : {"/a", "/b", "/c"}) {
    connection.Send(HttpGet(path));
    EXPECT_EQ(std::string("content of ") + path, connection.Read().body);
  }
  connection.Send(HttpGet("/d") + HttpGet("/e"));
  EXPECT_EQ("content of /d", connection.Read().body);
  EXPECT_EQ("content of /e", connection.Read().body);
}

TEST_F(WebServer, SendsOnlyHeadersForHead) {
  HttpConnection connection(port);
  connection.Send("HEAD /a HTTP/1.1\r\nHost: localhost\r\n\r\n" + HttpGet("/b"));
  EXPECT_EQ("13", connection.Read(true).Header("content-length"));
  EXPECT_EQ("content of /b", connection.Read().body);
}

TEST_F(WebServer, SendsFilesAndParts) {
  ASSERT_EQ(10, pwrite(File(), "0123456789", 10, 1000));
  EXPECT_EQ("0123456789", Get("/part").body);
  EXPECT_EQ(LARGE, Get("/file").body.size());
}

TEST_F(WebServer, AllowsOnlyGetAndHead) {
  for (const char* const method :
       {"POST", "PUT", "DELETE", "OPTIONS", "TRACE", "PATCH", "CONNECT", "get", "PROPFIND", "G"}) {
    HttpConnection connection(port);
    connection.Send(std::string(method) + " /a HTTP/1.1\r\nHost: localhost\r\n\r\n");
    const HttpResponse response = connection.Read();
    EXPECT_EQ(405, response.status) << method;
    EXPECT_EQ("GET, HEAD", response.Header("allow"));
    EXPECT_EQ("", connection.ReadToEnd());
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(WebServer, ServesOnlyItsOwnHosts) {
  const auto status = [this](const std::string& headers) {
    return StatusOf("GET /a HTTP/1.1\r\n" + headers + "\r\n");
  };
  for (const char* const host : {"localhost", "127.0.0.1:8480", "[::1]", "photos.example.org"}) {
    EXPECT_EQ(200, status(std::string("Host: ") + host + "\r\n")) << host;
  }
  const std::size_t served = Requests().size();
  for (const char* const host : {"example.org", "localhost.example.org", "127.0.0.1.example.org",
                                 "169.254.169.254", "\0", ""}) {
    EXPECT_EQ(421, status(std::string("Host: ") + host + "\r\n")) << host;
  }
  EXPECT_EQ(400, status(""));
  EXPECT_EQ(400, status("Host: localhost\r\nHost: localhost\r\n"));
  EXPECT_EQ(400, status("Host: localhost\r\nHost: example.org\r\n"));
  EXPECT_EQ(served, Requests().size());
}

TEST_F(WebServer, IsNotUsedByPagesOfOtherSites) {
  EXPECT_EQ(403, Get("/a", "Sec-Fetch-Site: cross-site\r\nSec-Fetch-Mode: no-cors\r\n").status);
  EXPECT_EQ(403, Get("/a", "Sec-Fetch-Site: same-site\r\nSec-Fetch-Mode: cors\r\n").status);
  EXPECT_EQ(200, Get("/a", "Sec-Fetch-Site: cross-site\r\nSec-Fetch-Mode: navigate\r\n").status);
  EXPECT_EQ(200, Get("/a", "Sec-Fetch-Site: same-origin\r\nSec-Fetch-Mode: cors\r\n").status);
  EXPECT_EQ(200, Get("/a", "Sec-Fetch-Site: none\r\nSec-Fetch-Mode: navigate\r\n").status);
}

TEST_F(WebServer, NeverTakesABodyForARequest) {
  const std::string smuggled = HttpGet("/smuggled");
  const std::string size = std::to_string(smuggled.size());
  for (const std::string& headers :
       {"Content-Length: " + size, "Content-Length : " + size,
        "Content-Length:" + size + "\r\nX: y", "Content-Length: 0\r\nContent-Length: " + size,
        "content-length: +" + size, std::string("Transfer-Encoding: chunked"),
        std::string("Transfer-Encoding: xchunked"), std::string("Transfer-Encoding:\tchunked"),
        std::string("Transfer-Encoding : chunked"),
        std::string("Transfer-Encoding: identity\r\nContent-Length: 1"),
        std::string("X: y\r\n Content-Length: 5"),
        std::string("Expect: 100-continue\r\n"
                    "Content-Length: 5")}) {
    std::string bytes = HttpGet("/a", headers + "\r\n");
    bytes += smuggled;
    const std::string output = AnswerTo(bytes);
    EXPECT_EQ(std::string::npos, output.find("content of")) << headers << '\n' << output;
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(WebServer, RefusesMalformedRequests) {
  for (const std::string& bytes :
       {std::string("GET /a b HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        std::string("GET  /a  HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        std::string("GET http://localhost/a HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        std::string("GET a HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        std::string("GET * HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        std::string("GET /\xff HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        std::string("GET /a?%0 HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        std::string("GET /a HTTP/2.0\r\nHost: localhost\r\n\r\n"),
        std::string("GET /a\r\nHost: localhost\r\n\r\n"), std::string("x\r\n\r\n")}) {
    EXPECT_EQ(std::string::npos, AnswerTo(bytes).find("HTTP/1.1 200")) << bytes;
  }
  // These are not even the beginning of a request.
  std::list<HttpConnection> others;
  for (const std::string& bytes :
       {std::string("\x16\x03\x01\x02\x00\x01\xfc\x03\x03", 9), std::string(100, '\0'),
        std::string("GET /a HTTP/1.1\rHost: localhost\r\r")}) {
    others.emplace_back(port).Send(bytes);
  }
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(200, Get("/a").status);
}

TEST_F(WebServer, LimitsTheHeaders) {
  const std::string many(20'000, 'a');
  std::string flood;
  for (int i = 0; i < 5'000; ++i) {
    flood += "X" + std::to_string(i) + ": y\r\n";
  }
  EXPECT_EQ(std::string::npos, AnswerTo(HttpGet("/" + many)).find("HTTP/1.1 200"));
  EXPECT_EQ(std::string::npos, AnswerTo(HttpGet("/a", "X: " + many + "\r\n")).find("HTTP/1.1 200"));
  EXPECT_EQ(std::string::npos, AnswerTo(HttpGet("/a", flood)).find("HTTP/1.1 200"));
  EXPECT_THAT(Requests(), IsEmpty());
  EXPECT_EQ(200, Get("/a", "X: " + std::string(8'000, 'a') + "\r\n").status);
}

TEST_F(WebServer, TakesFifteenKibibytesOfHeadersAndTwoHundredOfThem) {
  EXPECT_EQ(200, Get("/a", "X: " + std::string((15 << 10) - 100, 'a') + "\r\n").status);
  std::string many;
  for (int i = 0; i < 195; ++i) {
    many += "X" + std::to_string(i) + ": y\r\n";
  }
  EXPECT_EQ(200, Get("/a", many).status);
}

TEST_F(WebServer, RefusesRequestsWithNulBytes) {
  using namespace std::string_literals;
  for (const std::string& bytes :
       {"GET /a HTTP/1.1\r\nHost: localhost\0.evil.example\r\n\r\n"s,
        "GET /a HTTP/1.1\r\nHost: localhost\0\r\n\r\n"s,
        "GET /a\0/../b HTTP/1.1\r\nHost: localhost\r\n\r\n"s,
        "GET /a?b=1\0&c=2 HTTP/1.1\r\nHost: localhost\r\n\r\n"s,
        "GET /a\0 HTTP/1.1\r\nHost: localhost\r\n\r\n"s,
        "GET /a HTTP/1.1\r\nHost: localhost\r\nX\0: y\r\n\r\n"s,
        "GET /a HTTP/1.1\r\nHost: localhost\r\nX: y\0Transfer-Encoding: chunked\r\n\r\n"s}) {
    EXPECT_EQ(400, StatusOf(bytes)) << bytes;
  }
  EXPECT_THAT(Requests(), IsEmpty());
}

TEST_F(WebServer, AnswersAndLogsWhatTheHandlerThrows) {
  for (const char* const path : {"/throws", "/throws-text"}) {
    const HttpResponse response = Get(path);
    EXPECT_EQ(500, response.status);
    EXPECT_EQ(std::string::npos, response.body.find("out of order"));
  }
  EXPECT_THAT(Log(), ElementsAre("out of order", "database out of order"));
}

TEST_F(WebServer, SendsEventsWhenThereAreSome) {
  server->Events().PublishVersion(7);
  HttpConnection first(port);
  first.Send(HttpGet("/events"));
  EXPECT_EQ("text/event-stream", first.ReadHeaders().Header("content-type"));
  EXPECT_THAT(first.ReadUntil("data: 7\n\n"), HasSubstr("event: change\n"));
  HttpConnection second(port);
  second.Send(HttpGet("/events"));
  second.ReadUntil("data: 7\n\n");
  server->Events().PublishVersion(8);
  first.ReadUntil("event: change\ndata: 8\n\n");
  second.ReadUntil("event: change\ndata: 8\n\n");
  server->Events().PublishVolumes();
  first.ReadUntil("event: volumes\ndata: 8\n\n");
  server->Events().PublishVersion(9);
  first.ReadUntil("event: change\ndata: 9\n\n");
}

TEST_F(WebServer, LimitsTheEventStreamsAndServesOthersMeanwhile) {
  std::list<HttpConnection> streams;
  for (std::size_t i = 0; i < EventStreams::MOST; ++i) {
    streams.emplace_back(port).Send(HttpGet("/events"));
    streams.back().ReadUntil("event: change");
  }
  EXPECT_EQ(503, Get("/events").status);
  EXPECT_EQ(200, Get("/a").status);
  server->Events().PublishVersion(5);
  for (HttpConnection& stream : streams) {
    stream.ReadUntil("data: 5\n");
  }
}

TEST_F(WebServer, GivesThePlacesOfClosedStreamsToOthersAtOnce) {
  for (int round = 0; round < 3; ++round) {
    std::list<HttpConnection> streams;
    for (std::size_t i = 0; i < EventStreams::MOST; ++i) {
      streams.emplace_back(port).Send(HttpGet("/events"));
      EXPECT_EQ(200, streams.back().ReadHeaders().status) << round << ' ' << i;
      streams.back().ReadUntil("event: change");
    }
  }
}

TEST_F(WebServer, SendsNoEventsForHead) {
  HttpConnection connection(port);
  connection.Send("HEAD /events HTTP/1.1\r\nHost: localhost\r\n\r\n" + HttpGet("/b"));
  const HttpResponse response = connection.Read(true);
  EXPECT_EQ(200, response.status);
  EXPECT_EQ("text/event-stream", response.Header("content-type"));
  EXPECT_EQ("content of /b", connection.Read().body);
}

TEST_F(WebServer, EndsWhileStreamsAndDownloadsRun) {
  HttpConnection stream(port);
  stream.Send(HttpGet("/events"));
  stream.ReadUntil("event: change");
  HttpConnection download(port);
  download.Send(HttpGet("/file"));
  download.ReadHeaders();
  HttpConnection idle(port);
  server.reset();
  stream.ReadToEnd();
  EXPECT_GT(LARGE, download.ReadToEnd().size());
  EXPECT_EQ("", idle.ReadToEnd());
}

TEST_F(WebServer, ServesOthersDuringManyConnections) {
  std::list<HttpConnection> idle;
  for (int i = 0; i < 1'000; ++i) {
    idle.emplace_back(port).Send("GET /a HT");
  }
  EXPECT_EQ(200, Get("/a").status);
  // Each of them is still served.
  idle.front().Send("TP/1.1\r\nHost: localhost\r\n\r\n");
  EXPECT_EQ(200, idle.front().Read().status);
  // More of them displace the ones that wait longest.
  for (int i = 0; i < 1'000; ++i) {
    idle.emplace_back(port).Send("GET /a HT");
    if (i % 50 == 0) {
      EXPECT_EQ(200, Get("/a").status);
    }
  }
  EXPECT_EQ(200, Get("/a").status);
}

TEST_F(WebServer, HasABoundForTheResponsesThatAreNotRead) {
  std::list<HttpConnection> clients;
  int status = 200;
  while (status == 200 && clients.size() < 10) {
    clients.emplace_back(port).Send(HttpGet("/large"));
    const HttpResponse response = clients.back().ReadHeaders();
    status = response.status;
    EXPECT_EQ(status == 503 ? "5" : "", response.Header("retry-after"));
  }
  EXPECT_EQ(503, status);
  EXPECT_EQ("content of /a", Get("/a").body);
  clients.clear();
  const auto end = std::chrono::steady_clock::now() + test::DEADLINE;
  while (Get("/large").status != 200 && std::chrono::steady_clock::now() < end) {
    poll(nullptr, 0, 20);
  }
  EXPECT_EQ(200, Get("/large").status);
}

TEST_F(WebServer, ServesEverythingElseWhileADiskIsSlow) {
  std::list<HttpConnection> kept;
  for (unsigned i = 0; i < 4 * Server::THREADS; ++i) {
    kept.emplace_back(port).Send(HttpGet("/a"));
    EXPECT_EQ(200, kept.back().Read().status);
  }
  std::unique_lock slow(disk);
  std::list<HttpConnection> waiting;
  for (int i = 0; i < 60; ++i) {
    waiting.emplace_back(port).Send(HttpGet("/slow"));
  }
  for (HttpConnection& connection : kept) {
    connection.Send(HttpGet("/a") + HttpGet("/quick"));
    EXPECT_EQ("content of /a", connection.Read().body);
    EXPECT_EQ("file of /quick", connection.Read().body);
  }
  // Those that have to wait too long are refused.
  std::vector<pollfd> sockets;
  for (const HttpConnection& connection : waiting) {
    sockets.push_back({.fd = connection.Socket(), .events = POLLIN, .revents = 0});
  }
  const auto isAnswered = [](const pollfd& socket) { return socket.revents != 0; };
  const std::size_t refused = waiting.size() - DiskThreads::MOST_PER_VOLUME;
  const auto end = std::chrono::steady_clock::now() + test::DEADLINE;
  while (static_cast<std::size_t>(std::ranges::count_if(sockets, isAnswered)) < refused &&
         std::chrono::steady_clock::now() < end) {
    poll(nullptr, 0, 50);
    poll(sockets.data(), sockets.size(), 0);
  }
  EXPECT_EQ(refused, std::ranges::count_if(sockets, isAnswered));
  slow.unlock();
  auto socket = sockets.begin();
  for (HttpConnection& connection : waiting) {
    const HttpResponse response = connection.Read();
    const bool isRefused = isAnswered(*socket++);
    EXPECT_EQ(isRefused ? 503 : 200, response.status);
    EXPECT_EQ(isRefused ? "5" : "", response.Header("retry-after"));
  }
}

TEST_F(WebServer, AnswersAndLogsWhatADiskThrows) {
  EXPECT_EQ(500, Get("/disk-throws").status);
  EXPECT_THAT(Log(), ElementsAre("disk out of order"));
}

TEST_F(WebServer, EndsWhileRequestsWaitForADisk) {
  std::unique_lock slow(disk);
  std::list<HttpConnection> waiting;
  for (int i = 0; i < 20; ++i) {
    waiting.emplace_back(port).Send(HttpGet("/slow"));
  }
  EXPECT_EQ("file of /quick", Get("/quick").body);
  std::jthread end([this] { server.reset(); });
  slow.unlock();
  end.join();
  for (HttpConnection& connection : waiting) {
    connection.ReadToEnd();
  }
}

TEST_F(WebServer, EndsConnectionsThatSendTooSlowly) {
  HttpConnection silent(port);
  HttpConnection slow(port);
  slow.Send("GET /a HTTP/1.1\r\n");
  const std::string header = "X: y\r\n";
  pollfd ended{.fd = slow.Socket(), .events = POLLIN, .revents = 0};
  const auto end = std::chrono::steady_clock::now() + test::DEADLINE;
  while (poll(&ended, 1, 1000) == 0 && std::chrono::steady_clock::now() < end) {
    slow.Send(header); // each second
  }
  EXPECT_NE(0, ended.revents);
  EXPECT_EQ(std::string::npos, slow.ReadToEnd().find("HTTP/1.1 200"));
  EXPECT_EQ("", silent.ReadToEnd());
}

TEST_F(WebServer, EndsDownloadsThatAreNotRead) {
  HttpConnection download(port);
  download.Send(HttpGet("/file"));
  download.ReadHeaders();
  // What the system has buffered can still be read: see whether the server has closed the file.
  const auto end = std::chrono::steady_clock::now() + test::DEADLINE;
  while (OpenFiles() > 1 && std::chrono::steady_clock::now() < end) {
    poll(nullptr, 0, 100);
  }
  EXPECT_EQ(1, OpenFiles());
  EXPECT_GT(LARGE, download.ReadToEnd().size());
}

TEST_F(WebServer, EndsTheConnectionWhenAFileBecomesShorter) {
  HttpConnection download(port);
  download.Send(HttpGet("/file"));
  download.ReadHeaders();
  ASSERT_EQ(0, ftruncate(File(), 1000));
  const std::clock_t before = std::clock();
  EXPECT_GT(LARGE, download.ReadToEnd().size());
  EXPECT_LT((std::clock() - before) / CLOCKS_PER_SEC, 5) << "the server tries again and again";
  EXPECT_EQ(200, Get("/a").status);
}

} // namespace
} // namespace orva::web
